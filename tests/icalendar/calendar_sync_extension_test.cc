#include "icalendar/calendar_sync_extension.h"

#include <gtest/gtest.h>

#include <string>

#include "platform/time_zone.h"

namespace zt::icalendar {
namespace {

using platform::TimeZone;

std::string block(const TimeZone& zone) {
  std::string buffer;
  appendCalendarRepresentationTo(zone, buffer);
  return buffer;
}

std::string expected(const std::string& id, const char* standard, const char* daylight) {
  std::string text = "BEGIN:VTIMEZONE\r\nTZID:" + id + "\r\n";
  if (standard)
    text += std::string("BEGIN:STANDARD\r\nTZOFFSETTO:") + standard + "\r\nEND:STANDARD\r\n";
  if (daylight)
    text += std::string("BEGIN:DAYLIGHT\r\nTZOFFSETTO:") + daylight + "\r\nEND:DAYLIGHT\r\n";
  return text + "END:VTIMEZONE\r\n";
}

TEST(TimeZoneBlockTest, NorthernZoneTakesStandardFromFebruaryAndDaylightFromMay) {
  EXPECT_EQ(block(TimeZone::named("Europe/Paris").value()),
            expected("Europe/Paris", "0100", "0200"));
}

TEST(TimeZoneBlockTest, SouthernZoneTakesDaylightFromFebruaryAndStandardFromMay) {
  EXPECT_EQ(block(TimeZone::named("Australia/Sydney").value()),
            expected("Australia/Sydney", "1000", "1100"));
}

TEST(TimeZoneBlockTest, ZoneWithoutDaylightTimeHasOnlyStandard) {
  EXPECT_EQ(block(TimeZone::named("Asia/Kolkata").value()),
            expected("Asia/Kolkata", "0530", nullptr));
}

TEST(TimeZoneBlockTest, UnnamedZonesAreNamedByTheirOffsets) {
  const TimeZone central = TimeZone::unnamed(3600, 7200, "M3.5.0,M10.5.0/3").value();
  EXPECT_EQ(timezoneBlockID(central), "UNKNOWN-3600-7200");
  EXPECT_EQ(block(central), expected("UNKNOWN-3600-7200", "0100", "0200"));

  const TimeZone newfoundland = TimeZone::unnamed(-12600).value();
  EXPECT_EQ(timezoneBlockID(newfoundland), "UNKNOWN--12600-0");
  EXPECT_EQ(block(newfoundland), expected("UNKNOWN--12600-0", "-0330", nullptr));
}

}  // namespace
}  // namespace zt::icalendar
