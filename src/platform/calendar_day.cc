#include "platform/calendar_day.h"

#include <chrono>

namespace zt::platform {

bool isCalendarDay(std::int64_t year, std::int64_t month, std::int64_t day) {
  if (month < 1 || month > 12 || day < 1 || day > 31) return false;
  // The Gregorian leap rule repeats every 400 years; this brings any year into the range
  // std::chrono counts without changing which days exist in it.
  const auto sameLeapYear = static_cast<int>(2000 + (year % 400 + 400) % 400);
  const std::chrono::year_month_day date{std::chrono::year{sameLeapYear},
                                         std::chrono::month{static_cast<unsigned>(month)},
                                         std::chrono::day{static_cast<unsigned>(day)}};
  return date.ok();
}

}  // namespace zt::platform
