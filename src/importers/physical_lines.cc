#include "importers/physical_lines.h"

namespace tessel::importers {

std::vector<PhysicalLine> physicalLines(std::string_view text) {
  std::vector<PhysicalLine> lines;
  forEachPhysicalLine(text, [&](const PhysicalLine& line) { lines.push_back(line); });
  return lines;
}

}  // namespace tessel::importers
