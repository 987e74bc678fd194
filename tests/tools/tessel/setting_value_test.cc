#include "tools/tessel/setting_value.h"

#include <gtest/gtest.h>

namespace tessel::cli {
namespace {

using zt::platform::CalendarDate;
using zt::platform::TimeZone;
using zt::platform::Value;

TEST(SettingValue, ReadsBooleansIntegersAndZonedIsoDates) {
  EXPECT_EQ(parseSettingValue("true"), Value::boolean(true));
  EXPECT_EQ(parseSettingValue("38"), Value::integer(38));
  EXPECT_EQ(parseSettingValue("+7"), Value::integer(7));

  const auto utc = parseSettingValue("2026-11-21T10:00:00Z");
  ASSERT_TRUE(utc && utc->asDate());
  EXPECT_EQ(*utc->asDate(), CalendarDate::fromFields({2026, 11, 21, 10, 0, 0}, TimeZone::gmt()));

  // The same instant written with an offset keeps that offset as its zone.
  const auto paris = parseSettingValue("2026-11-21T11:00:00+01:00");
  ASSERT_TRUE(paris && paris->asDate());
  EXPECT_TRUE(paris->asDate()->isSameInstant(*utc->asDate()));
  EXPECT_EQ(paris->asDate()->timeZone().standardOffset(), 3600);

  const auto precise = parseSettingValue("2026-11-21T10:00:00.123456789Z");
  ASSERT_TRUE(precise && precise->asDate());
  EXPECT_EQ(precise->asDate()->nanoseconds(), 123456789u);
}

TEST(SettingValue, RefusesEverythingElse) {
  for (const char* text :
       {"True", "1.5", "9223372036854775808", "2026-11-21T10:00:00", "2026-02-30T10:00:00Z",
        "2026-11-21T10:00:00+25:00", "2026-11-21T10:00:00Zjunk"}) {
    EXPECT_FALSE(parseSettingValue(text)) << text;
  }
}

TEST(SettingValue, ShowsWhatItReads) {
  for (const char* text : {"true", "-1", "2026-11-21T05:30:00-04:30", "2026-11-21T10:00:00.5Z"}) {
    const auto value = parseSettingValue(text);
    ASSERT_TRUE(value) << text;
    EXPECT_EQ(formatSettingValue(*value), text);
  }
  EXPECT_EQ(formatSettingValue(Value("text")), "\"text\"");
}

}  // namespace
}  // namespace tessel::cli
