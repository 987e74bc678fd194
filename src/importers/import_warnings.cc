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
  held_.push_back({fault, std::string(consequence)});
}

void ImportWarnings::note(std::string source, std::optional<std::size_t> line,
                          std::string message) {
  warnings_.push_back({std::move(source), line, std::move(message)});
  held_.push_back({std::nullopt, {}});
}

void ImportWarnings::passOn(ImportWarnings& other) const {
  for (std::size_t i = 0; i < held_.size(); ++i) {
    if (held_[i].fault) {
      other.fault(*held_[i].fault, held_[i].consequence);
    } else {
      other.note(warnings_[i].source, warnings_[i].line, warnings_[i].message);
    }
  }
}

}  // namespace tessel::importers
