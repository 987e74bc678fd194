#pragma once

#include <string>

#include "platform/value.h"

namespace zt::calendars {

// A record as a log argument: its text is built only when the line is written, so records
// are not copied and described for lines that debug logging leaves out.
struct RecordDescription {
  const platform::Dictionary& record;
  std::string description() const { return platform::Value(record).description(); }
};

}  // namespace zt::calendars
