#include "icalendar/calendar_sync_extension.h"

#include <gtest/gtest.h>

#include <string>
#include <tuple>

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

// Standard time is the offset of February and daylight time that of May, the other way round
// in the south; a zone without daylight time has only its standard block; unnamed zones are
// named by their offsets.
TEST(TimeZoneBlockTest, EachZoneGetsTheBlocksOfItsOffsets) {
  const std::tuple<TimeZone, std::string, const char*, const char*> cases[] = {
      {TimeZone::named("Australia/Sydney").value(), "Australia/Sydney", "1000", "1100"},
      {TimeZone::named("Asia/Kolkata").value(), "Asia/Kolkata", "0530", nullptr},
      {TimeZone::unnamed(3600, 7200, "M3.5.0,M10.5.0/3").value(), "UNKNOWN-3600-7200", "0100",
       "0200"},
      {TimeZone::unnamed(-12600).value(), "UNKNOWN--12600-0", "-0330", nullptr},
  };
  for (const auto& [zone, id, standard, daylight] : cases) {
    SCOPED_TRACE(id);
    EXPECT_EQ(timezoneBlockID(zone), id);
    EXPECT_EQ(block(zone), expected(id, standard, daylight));
  }
}

}  // namespace
}  // namespace zt::icalendar
