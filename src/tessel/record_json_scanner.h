#pragma once

// The quick way through a line of typed JSON Lines: one pass over the text straight into the
// record, with no JSON tree in between. It takes only the common form (plain strings, short
// numbers, named zones...) and answers nothing for anything else, fault or rarity alike; the
// thorough reader then reads that line and names its fault. So what it accepts must read as
// exactly the record the thorough reader makes of it, and the faults keep one wording.

#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/value.h"
#include "tessel/record.h"

namespace tessel::typed_json {

class RecordLineScanner {
 public:
  // The line's record, or nothing when the line is not in the common form.
  std::optional<Record> scan(std::string_view line);

 private:
  class Pass;
  friend class Pass;

  // Members and elements of the objects and arrays being read, innermost last, so that each
  // dictionary and array is built once at its final size.
  // Keys are views of the line: a key with an escape is left to the thorough reader.
  std::vector<std::pair<std::string_view, zt::platform::Value>> members_;
  std::vector<zt::platform::Value> elements_;
};

}  // namespace tessel::typed_json
