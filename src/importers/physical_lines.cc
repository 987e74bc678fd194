#include "importers/physical_lines.h"

namespace tessel::importers {

std::vector<PhysicalLine> physicalLines(std::string_view text) {
  std::vector<PhysicalLine> lines;
  std::size_t number = 1;
  std::size_t start = 0;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] != '\r' && text[i] != '\n') continue;
    lines.push_back({number++, text.substr(start, i - start)});
    if (text[i] == '\r' && i + 1 < text.size() && text[i + 1] == '\n') ++i;
    start = i + 1;
  }
  if (start < text.size()) lines.push_back({number, text.substr(start)});
  return lines;
}

}  // namespace tessel::importers
