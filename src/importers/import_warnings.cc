#include "importers/import_warnings.h"

#include <utility>

namespace tessel::importers {

std::string warningText(const ImportWarning& warning) {
  return locatedText(warning.source, warning.line, warning.message);
}

void ImportWarnings::fault(const ImportError& fault, std::string_view consequence) {
  if (onFault_ == OnFault::Refuse) throw fault;
  warnings_.push_back(
      {fault.source(), fault.line(), fault.reason() + "; " + std::string(consequence)});
}

void ImportWarnings::note(std::string source, std::optional<std::size_t> line,
                          std::string message) {
  warnings_.push_back({std::move(source), line, std::move(message)});
}

}  // namespace tessel::importers
