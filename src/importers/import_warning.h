#pragma once

#include <cstddef>
#include <optional>
#include <string_view>

namespace tessel::importers {

// Says on standard error what an import read but keeps otherwise than written (an alarm
// read with a default, a second copy of an event kept under another identifier), so that
// nothing changes without a word: "tessel: warning: FILE:LINE: TEXT", or without a line
// "tessel: warning: FILE: TEXT". The import goes on.
void importWarning(std::string_view file, std::optional<std::size_t> line, std::string_view text);

}  // namespace tessel::importers
