#include "tools/tessel/import_report.h"

#include <ostream>

#include "tools/tessel/counted.h"

namespace tessel::cli {

void writeImportWarnings(std::ostream& err, const importers::ImportWarnings& warnings) {
  for (const importers::ImportWarning& warning : warnings.all()) {
    err << "tessel: warning: " << importers::warningText(warning) << '\n';
  }
}

std::string warningCount(const importers::ImportWarnings& warnings) {
  if (warnings.count() == 0) return {};
  return "; " + counted(warnings.count(), "warning", "warnings");
}

}  // namespace tessel::cli
