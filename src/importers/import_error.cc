#include "importers/import_error.h"

#include <utility>

namespace tessel::importers {

namespace {

std::string describe(const std::string& source, std::optional<std::size_t> line,
                     const std::string& reason) {
  std::string text = source + ": ";
  if (line) text += "line " + std::to_string(*line) + ": ";
  return text + reason;
}

}  // namespace

ImportError::ImportError(std::string source, std::optional<std::size_t> line, std::string reason)
    : std::runtime_error(describe(source, line, reason)),
      source_(std::move(source)),
      line_(line),
      reason_(std::move(reason)) {}

}  // namespace tessel::importers
