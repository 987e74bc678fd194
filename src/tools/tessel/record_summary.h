#pragma once

#include <cstddef>
#include <string>

#include "platform/value.h"

namespace tessel::cli {

// A one-line human summary of a record for `tessel records list`: the attributes that name
// it (a contact's names, an event's summary, a calendar's title...), else its first text.
// Never holds tabs or line ends, so the listing stays one record per line.
std::string recordSummary(const zt::platform::Dictionary& record, std::size_t maxLength = 80);

}  // namespace tessel::cli
