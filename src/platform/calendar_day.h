#pragma once

#include <cstdint>

namespace zt::platform {

// Whether `day` of `month` (1 to 12) exists in `year` of the proleptic Gregorian calendar,
// for any year: text read from files names days that must be checked before they are turned
// into instants.
bool isCalendarDay(std::int64_t year, std::int64_t month, std::int64_t day);

}  // namespace zt::platform
