#include "icalendar/zeto_calendar_export.h"

#include <gtest/gtest.h>

#include <utility>

#include "icalendar/icalendar_export.h"
#include "platform/calendar_date.h"
#include "platform/time_zone.h"
#include "platform/value.h"
#include "support/scoped_environment.h"

namespace zt::icalendar {
namespace {

using platform::Array;
using platform::CalendarDate;
using platform::TimeZone;
using platform::Value;

TimeZone zone(const char* name) {
  return TimeZone::named(name).value();
}

CalendarDate at(int year, int month, int day, int hour, int minute, int second, TimeZone z) {
  return CalendarDate::fromFields({year, month, day, hour, minute, second}, std::move(z));
}

TEST(DateFormsTest, NoonInGmtOrUtcIsAWholeDayAndMidnightAUtcDateTime) {
  CalendarDate utcNoon = at(2007, 3, 15, 12, 0, 0, TimeZone::utc());
  EXPECT_EQ(iCalendarPropertyValueRepresentation(utcNoon), ":20070315");
  EXPECT_FALSE(isDateOnly(at(2007, 3, 15, 12, 0, 1, TimeZone::gmt())));
  EXPECT_FALSE(isDateOnly(at(2007, 3, 15, 12, 0, 0, zone("Europe/Paris"))));
  EXPECT_FALSE(isDateOnly(at(2007, 3, 15, 12, 0, 0, TimeZone::local())));
  EXPECT_EQ(iCalendarRepresentation(at(2007, 3, 15, 0, 0, 0, TimeZone::gmt())), "20070315T000000Z");
  // Fields are padded but never cut.
  EXPECT_EQ(dateOnly(at(812, 1, 2, 12, 0, 0, TimeZone::gmt())), "08120102");
  EXPECT_EQ(dateOnlyPropertyValue(at(12345, 1, 2, 12, 0, 0, TimeZone::gmt())), ":123450102");
}

TEST(DateFormsTest, LocalZoneDatesAreFloatingAndUnnamedZonesNamedByTheirOffsets) {
  zt::test_support::ScopedEnvironment environment;
  environment.set("TZ", "America/New_York");
  CalendarDate date = at(2007, 3, 15, 9, 30, 0, TimeZone::local());
  EXPECT_EQ(iCalendarPropertyValueRepresentation(date), ":20070315T093000");
  CalendarDate unnamed =
      at(2007, 7, 1, 8, 0, 0, TimeZone::unnamed(3600, 7200, "M3.5.0,M10.5.0/3").value());
  EXPECT_EQ(dateTimePropertyValue(unnamed), ";TZID=UNKNOWN-3600-7200:20070701T080000");
}

// The bare form of a date writes UTC and leaves the date itself in GMT; a value is written from
// a copy.
TEST(DateFormsTest, TheBareFormSwitchesTheDateToGmtButNotAValue) {
  CalendarDate date = at(2007, 3, 15, 12, 30, 0, zone("Europe/Paris"));
  EXPECT_EQ(iCalendarRepresentation(date), "20070315T113000Z");
  EXPECT_EQ(date.timeZone(), TimeZone::gmt());
  EXPECT_EQ(date.hourOfDay(), 11);
  const Value value = at(2007, 3, 15, 8, 0, 0, zone("Asia/Tokyo"));
  EXPECT_EQ(iCalendarRepresentation(value), "20070314T230000Z");
  EXPECT_EQ(value.asDate()->timeZone(), zone("Asia/Tokyo"));
}

TEST(RecurrenceWordsTest, UnknownWordsAreErrorsAndByDayNeedsOneOrdinalPerDay) {
  EXPECT_EQ(iCalendarRepresentationForFrequency("Weekly"), "WEEKLY");
  EXPECT_EQ(iCalendarRepresentationForFrequency("fortnightly"), "ERROR");
  EXPECT_EQ(iCalendarRepresentationForDay("sun"), "ERROR");
  const Value zero = Value::integer(0);
  EXPECT_EQ(iCalendarRepresentationForByDayFreq({Value::integer(-1), zero}, {"friday", "caturday"}),
            "-1FR,ERROR");
  EXPECT_EQ(iCalendarRepresentationForByDayFreq({}, {}), std::nullopt);
  EXPECT_EQ(iCalendarRepresentationForByDayFreq({zero, zero}, {"monday", "tuesday", "friday"}),
            std::nullopt);
}

}  // namespace
}  // namespace zt::icalendar
