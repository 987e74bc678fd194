#include "platform/calendar_day.h"

#include <gtest/gtest.h>

#include <tuple>

namespace zt::platform {
namespace {

TEST(CalendarDay, MonthLengthsAndLeapYearsOfAnyYear) {
  const std::tuple<std::int64_t, std::int64_t, std::int64_t, bool> cases[] = {
      {2024, 1, 31, true},   {2023, 4, 31, false},   {2024, 2, 29, true},
      {2023, 2, 29, false},  {1900, 2, 29, false},   {2000, 2, 29, true},
      {2024, 13, 1, false},  {2024, 1, 0, false},    {-4, 2, 29, true},
      {400000, 2, 29, true}, {100100, 2, 29, false}, {-999999999, 12, 31, true},
  };
  for (const auto& [year, month, day, exists] : cases)
    EXPECT_EQ(isCalendarDay(year, month, day), exists) << year << "-" << month << "-" << day;
}

}  // namespace
}  // namespace zt::platform
