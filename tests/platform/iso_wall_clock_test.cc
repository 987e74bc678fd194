#include "platform/iso_wall_clock.h"

#include <gtest/gtest.h>

#include <string>
#include <tuple>

namespace zt::platform::iso {
namespace {

// What was read, as "year-month-day hour:minute:second+nanoseconds @end", or the fault.
std::string reading(std::string_view text, YearForm year, SecondsForm seconds) {
  std::size_t pos = 0;
  ReadFault fault{};
  const auto clock = readWallClock(text, pos, year, seconds, &fault);
  if (!clock) return fault == ReadFault::Form ? "form" : "long fraction";
  return std::to_string(clock->year) + "-" + std::to_string(clock->month) + "-" +
         std::to_string(clock->day) + " " + std::to_string(clock->hour) + ":" +
         std::to_string(clock->minute) + ":" + std::to_string(clock->second) + "+" +
         std::to_string(clock->nanoseconds) + " @" + std::to_string(pos);
}

TEST(IsoWallClock, ReadsTheFieldsAndStopsWhereTheFormEnds) {
  constexpr auto Four = YearForm::FourDigits;
  constexpr auto Extended = YearForm::Extended;
  constexpr auto Required = SecondsForm::Required;
  constexpr auto Optional = SecondsForm::Optional;
  const std::tuple<std::string_view, YearForm, SecondsForm, std::string> cases[] = {
      {"2026-11-21T10:05:09Z", Four, Required, "2026-11-21 10:5:9+0 @19"},
      {"2026-11-21T10:05", Four, Required, "form"},
      {"2026-11-21T10:05", Extended, Optional, "2026-11-21 10:5:0+0 @16"},
      {"2026-11-21T10:05:09.123456789", Four, Required, "2026-11-21 10:5:9+123456789 @29"},
      {"2026-11-21T10:05:09.1234567891", Four, Required, "long fraction"},
      {"2026-11-21T10:05:09.", Four, Required, "form"},
      {"-0044-03-15T12:00", Extended, Optional, "-44-3-15 12:0:0+0 @17"},
      {"-0044-03-15T12:00:00", Four, Required, "form"},
      {"123456789-01-01T00:00", Extended, Optional, "123456789-1-1 0:0:0+0 @21"},
      {"2026-1-21T10:05:09", Four, Required, "form"},
      {"2026-13-32T25:61:61", Four, Required, "2026-13-32 25:61:61+0 @19"},  // checked later
  };
  for (const auto& [text, year, seconds, read] : cases)
    EXPECT_EQ(reading(text, year, seconds), read) << text;
}

}  // namespace
}  // namespace zt::platform::iso
