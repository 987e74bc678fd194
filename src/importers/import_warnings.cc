#include "importers/import_warnings.h"

namespace tessel::importers {

std::string warningText(const ImportWarning& warning) {
  return locatedText(warning.source, warning.line, warning.message);
}

void ImportWarnings::fault(const ImportError& fault, std::string_view consequence) {
  if (onFault_ == OnFault::Refuse) throw fault;
  warnings_.push_back(
      {fault.source(), fault.line(), fault.reason() + "; " + std::string(consequence)});
}

}  // namespace tessel::importers
