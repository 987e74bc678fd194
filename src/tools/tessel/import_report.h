#pragma once

#include <iosfwd>
#include <string>

#include "importers/import_warnings.h"

namespace tessel::cli {

// Each warning of an import as one line, "tessel: warning: <file>: line N: ...".
void writeImportWarnings(std::ostream& err, const importers::ImportWarnings& warnings);

// What the summary line of an import ends with: "; 3 warnings", or nothing without any.
std::string warningCount(const importers::ImportWarnings& warnings);

}  // namespace tessel::cli
