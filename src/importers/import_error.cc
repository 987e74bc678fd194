#include "importers/import_error.h"

#include <utility>

namespace tessel::importers {

std::string locatedText(const std::string& source, std::optional<std::size_t> line,
                        const std::string& text) {
  std::string located = source + ": ";
  if (line) located += "line " + std::to_string(*line) + ": ";
  return located + text;
}

ImportError::ImportError(std::string source, std::optional<std::size_t> line, std::string reason)
    : std::runtime_error(locatedText(source, line, reason)),
      source_(std::move(source)),
      line_(line),
      reason_(std::move(reason)) {}

}  // namespace tessel::importers
