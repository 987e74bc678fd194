#pragma once

#include <cstddef>
#include <string_view>
#include <vector>

namespace tessel::importers {

// One line of an imported text file as it stands, before unfolding, with its 1-based number
// for error messages.
struct PhysicalLine {
  std::size_t number;
  std::string_view text;
};

// vCard (RFC 2425 5.8.1) and iCalendar (RFC 5545 3.1) end lines with CR LF; files that went
// through Unix tools end them with LF alone, and old Mac programs with CR alone. All three
// end a line here, so that no CR is left inside a line.
std::vector<PhysicalLine> physicalLines(std::string_view text);

}  // namespace tessel::importers
