#include "tools/tessel/setting_value.h"

#include <gtest/gtest.h>

namespace tessel::cli {
namespace {

using zt::platform::CalendarDate;
using zt::platform::TimeZone;
using zt::platform::Value;

// What the tool reads it shows back the same way; anything else is refused.
TEST(SettingValue, ReadsBooleansIntegersAndZonedIsoDatesAndRefusesTheRest) {
  for (const char* text : {"true", "-1", "2026-11-21T05:30:00-04:30", "2026-11-21T10:00:00.5Z"}) {
    const auto value = parseSettingValue(text);
    ASSERT_TRUE(value) << text;
    EXPECT_EQ(formatSettingValue(*value), text);
  }
  EXPECT_EQ(parseSettingValue("+7"), Value::integer(7));
  // The same instant written with an offset keeps that offset as its zone.
  const auto utc = parseSettingValue("2026-11-21T10:00:00Z");
  const auto paris = parseSettingValue("2026-11-21T11:00:00+01:00");
  ASSERT_TRUE(utc && paris && paris->asDate());
  EXPECT_EQ(*utc->asDate(), CalendarDate::fromFields({2026, 11, 21, 10, 0, 0}, TimeZone::gmt()));
  EXPECT_TRUE(paris->asDate()->isSameInstant(*utc->asDate()));
  EXPECT_EQ(paris->asDate()->timeZone().standardOffset(), 3600);
  for (const char* text :
       {"True", "1.5", "9223372036854775808", "2026-11-21T10:00:00", "2026-02-30T10:00:00Z",
        "2026-11-21T10:00:00+25:00", "2026-11-21T10:00:00Zjunk"}) {
    EXPECT_FALSE(parseSettingValue(text)) << text;
  }
}

}  // namespace
}  // namespace tessel::cli
