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
// end a line here, so that no CR is left inside a line. CR CR LF is one line end too: it is
// what CR LF becomes when a program converts line ends twice (iPhone exports fold their photos
// so), and reading it as two would cut every folded line from its continuation.
std::vector<PhysicalLine> physicalLines(std::string_view text);

// The same lines, handed to `visit` one by one instead of held together.
template <typename Visit>
void forEachPhysicalLine(std::string_view text, Visit&& visit) {
  std::size_t number = 1;
  std::size_t start = 0;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] != '\r' && text[i] != '\n') continue;
    visit(PhysicalLine{number++, text.substr(start, i - start)});
    if (text[i] == '\r' && i + 2 < text.size() && text[i + 1] == '\r' && text[i + 2] == '\n') ++i;
    if (text[i] == '\r' && i + 1 < text.size() && text[i + 1] == '\n') ++i;
    start = i + 1;
  }
  if (start < text.size()) visit(PhysicalLine{number, text.substr(start)});
}

}  // namespace tessel::importers
