#include "platform/calendar_date.h"

#include <gtest/gtest.h>

#include <cstdlib>

#include "platform/time_zone.h"

namespace zt::platform {
namespace {

using std::chrono::sys_days;
using std::chrono::sys_seconds;

sys_seconds utcInstant(int y, unsigned m, unsigned d, int h = 0, int min = 0, int s = 0) {
  using namespace std::chrono;
  return sys_days{year{y} / month{m} / day{d}} + hours{h} + minutes{min} + seconds{s};
}

TEST(TimeZone, GmtAndUtcAreDistinctAndNamedZonesComeFromTheDatabase) {
  EXPECT_EQ(TimeZone::withAbbreviation("UTC"), TimeZone::utc());
  EXPECT_FALSE(TimeZone::gmt() == TimeZone::utc());
  auto paris = TimeZone::named("Europe/Paris");
  ASSERT_TRUE(paris);
  EXPECT_EQ(paris->secondsFromGMT(utcInstant(2002, 7, 1)), 7200);
  EXPECT_FALSE(TimeZone::named("Mars/Olympus_Mons").has_value());
  EXPECT_FALSE(*TimeZone::named("Europe/Berlin") == *paris);
}

TEST(TimeZone, LocalZoneIsRecognisedByKindAndTracksTz) {
  setenv("TZ", "America/New_York", 1);
  TimeZone local = TimeZone::local();
  EXPECT_TRUE(local.isLocal());
  EXPECT_EQ(local.name(), "America/New_York");
  EXPECT_EQ(local.secondsFromGMT(utcInstant(2002, 2, 1)), -5 * 3600);
  setenv("TZ", "Asia/Tokyo", 1);
  EXPECT_EQ(local.name(), "Asia/Tokyo");
  EXPECT_EQ(local.secondsFromGMT(utcInstant(2002, 2, 1)), 9 * 3600);
  // Not equal to the named zone it happens to track: it is of another kind.
  EXPECT_FALSE(local == *TimeZone::named("Asia/Tokyo"));
  EXPECT_FALSE(TimeZone::named("Asia/Tokyo")->isLocal());
  unsetenv("TZ");
}

TEST(TimeZone, UnnamedZonesFollowTheirDaylightRule) {
  auto north = TimeZone::unnamed(3600, 7200, "M3.5.0,M10.5.0/3");
  ASSERT_TRUE(north);
  // The last Sunday of March 2002 was the 31st: daylight time from 01:00 UTC.
  EXPECT_FALSE(north->isDaylightSavingTime(utcInstant(2002, 3, 31, 0, 59, 59)));
  EXPECT_TRUE(north->isDaylightSavingTime(utcInstant(2002, 3, 31, 1)));

  auto south = TimeZone::unnamed(36000, 39600, "M10.1.0,M4.1.0/3");
  ASSERT_TRUE(south);
  EXPECT_TRUE(south->isDaylightSavingTime(utcInstant(2002, 2, 1)));
  EXPECT_FALSE(south->isDaylightSavingTime(utcInstant(2002, 7, 1)));

  EXPECT_FALSE(TimeZone::unnamed(3600, 7200, "M13.1.0,M4.1.0").has_value());
  EXPECT_FALSE(TimeZone::unnamed(3600, std::nullopt, "M3.5.0,M10.5.0").has_value());
  EXPECT_EQ(*north, *TimeZone::unnamed(3600, 7200, "M3.5.0,M10.5.0/3"));
  EXPECT_FALSE(*north == *TimeZone::unnamed(3600, 7200));
}

TEST(CalendarDate, FromFieldsRoundTripsAndHandlesGapsAndFolds) {
  TimeZone paris = *TimeZone::named("Europe/Paris");
  CalendarDate lunch = CalendarDate::fromFields({2007, 3, 15, 12, 30, 0}, paris);
  EXPECT_EQ(lunch.instant(), utcInstant(2007, 3, 15, 11, 30));
  EXPECT_EQ(lunch.description(), "2007-03-15 12:30:00 +0100");

  // 02:30 on 25 March 2007 never happened in Paris; it is read with the winter offset.
  EXPECT_EQ(CalendarDate::fromFields({2007, 3, 25, 2, 30, 0}, paris).instant(),
            utcInstant(2007, 3, 25, 1, 30));
  // 02:30 on 28 October 2007 happened twice; the earlier one is meant.
  EXPECT_EQ(CalendarDate::fromFields({2007, 10, 28, 2, 30, 0}, paris).instant(),
            utcInstant(2007, 10, 28, 0, 30));
}

TEST(CalendarDate, ParsesTheProbeForm) {
  auto east = CalendarDate::fromString("2002-11-01 10:15:30 +0530");
  ASSERT_TRUE(east);
  EXPECT_EQ(east->instant(), utcInstant(2002, 11, 1, 4, 45, 30));
  EXPECT_EQ(east->hourOfDay(), 10);

  for (const char* bad : {"2002-2-1 00:00:00", "2002-2-30 00:00:00 +0000",
                          "2002-2-1 00:00:00 +0000x", "2002-2-1 00:00:00 +0075"}) {
    EXPECT_FALSE(CalendarDate::fromString(bad).has_value()) << bad;
  }
}

}  // namespace
}  // namespace zt::platform
