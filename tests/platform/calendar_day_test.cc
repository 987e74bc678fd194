#include "platform/calendar_day.h"

#include <gtest/gtest.h>

namespace zt::platform {
namespace {

TEST(CalendarDay, MonthLengthsAndLeapYearsOfAnyYear) {
  struct Case {
    std::int64_t year, month, day;
    bool exists;
  };
  const Case cases[] = {
      {2024, 1, 31, true},   {2023, 4, 31, false},   {2024, 2, 29, true},
      {2023, 2, 29, false},  {1900, 2, 29, false},   {2000, 2, 29, true},
      {2024, 13, 1, false},  {2024, 1, 0, false},    {-4, 2, 29, true},
      {400000, 2, 29, true}, {100100, 2, 29, false}, {-999999999, 12, 31, true},
  };
  for (const Case& c : cases)
    EXPECT_EQ(isCalendarDay(c.year, c.month, c.day), c.exists)
        << c.year << "-" << c.month << "-" << c.day;
}

}  // namespace
}  // namespace zt::platform
