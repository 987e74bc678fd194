#include "importers/import_warning.h"

#include <cstdio>
#include <string>

namespace tessel::importers {

void importWarning(std::string_view file, std::optional<std::size_t> line, std::string_view text) {
  std::string message = "tessel: warning: ";
  message += file;
  if (line) message += ":" + std::to_string(*line);
  message += ": ";
  message += text;
  message += '\n';
  // One write per warning, so that lines of several writers do not interleave.
  std::fwrite(message.data(), 1, message.size(), stderr);
}

}  // namespace tessel::importers
