#include "icalendar/zeto_calendar_exporter.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <stdexcept>
#include <string>
#include <vector>

#include "platform/calendar_date.h"
#include "platform/time_zone.h"
#include "platform/value.h"
#include "support/files.h"
#include "tessel/schema.h"

namespace zt::icalendar {
namespace {

using platform::Array;
using platform::CalendarDate;
using platform::Dictionary;
using platform::TimeZone;
using platform::Value;
using namespace tessel;

Value at(int year, int month, int day, int hour, int minute, TimeZone zone) {
  return CalendarDate::fromFields({year, month, day, hour, minute, 0}, std::move(zone));
}

// Schema names are string views; record keys are strings.
std::string k(std::string_view name) {
  return std::string(name);
}

TimeZone paris() {
  return TimeZone::named("Europe/Paris").value();
}

Dictionary calendar(Array events, Array tasks = {}) {
  return {{k(TesselAttribute_Calendars_Calendar_Title), "Work"},
          {k(TesselEntity_Calendars_CalendarOrder), "1l"},
          {k(TesselEntity_Calendars_Event), std::move(events)},
          {k(TesselEntity_Calendars_Task), std::move(tasks)}};
}

std::string readGolden(const std::string& name) {
  return zt::test_support::readFile(std::string(ZT_TEST_DATA_DIR) + "/data/" + name);
}

class ExporterTest : public testing::Test {
 protected:
  std::string property(std::string_view key, const Value& value) const {
    return exporter.propertyForKey(key, "VEVENT", &value).value_or("(absent)");
  }

  ZetoCalendarExporter exporter;
};

TEST_F(ExporterTest, WorkCalendarMatchesGoldenFile) {
  const Dictionary alarm{
      {k(TesselAttribute_Calendars_DisplayAlarm_Description), "Lunch"},
      {k(TesselAttribute_Calendars_DisplayAlarm_Triggerduration), Value::integer(-900)}};
  const Dictionary event{
      {"uid", "abc-1"},
      {k(TesselAttribute_Calendars_Event_Summary), "Lunch"},
      {k(TesselAttribute_Calendars_Event_StartDate), at(2007, 3, 15, 12, 30, paris())},
      {k(TesselAttribute_Calendars_Event_EndDate), at(2007, 3, 15, 13, 30, paris())},
      {k(TesselEntity_Calendars_DisplayAlarm), Array{alarm}}};
  const Dictionary record = calendar({event});
  const Dictionary before = record;

  std::vector<std::uint8_t> buffer{'o', 'l', 'd'};
  ZetoCalendarExporter::setupData(buffer, record);
  EXPECT_TRUE(zt::test_support::sameLines(readGolden("work.ics"),
                                          std::string(buffer.begin(), buffer.end())));
  EXPECT_EQ(record, before);  // dates were written from copies
}

// The golden sample sync pins the usual lines (zones, organizers, attendees, rules, exception
// dates, alarms); these are the edges the samples do not reach.
TEST_F(ExporterTest, EscapedFoldedAndUnmappedValues) {
  const std::string longSummary(70, 's');  // 78 units with the property name
  EXPECT_EQ(property("summary", Value("Lunch, then; talk")), "SUMMARY:Lunch\\, then\\; talk\r\n");
  EXPECT_EQ(property("summary", Value(longSummary)),
            "SUMMARY:" + longSummary.substr(0, 64) + "\r\n " + longSummary.substr(64) + "\r\n");
  EXPECT_EQ(property("url", Value(platform::Url{"http://x.org/a,b"})),
            "URL:http://x.org/a\\,b\r\n");
  EXPECT_EQ(exporter.propertyForKey("summary", "VEVENT", nullptr), std::nullopt);
  EXPECT_EQ(property("classification", Value("private")), "(absent)");
  EXPECT_EQ(property(TesselAttribute_Calendars_Event_Status, Value("nOnE")), "(absent)");
}

TEST_F(ExporterTest, OrganizersAttendeesAndRulesThatCannotBeWritten) {
  const Dictionary ann{{k(TesselAttribute_Calendars_Attendee_CommonName), "Ann"},
                       {k(TesselAttribute_Calendars_Attendee_Email), "mailto:ann@x.org"}};
  EXPECT_EQ(property(TesselEntity_Calendars_Organizer, Array{ann, Dictionary{}}),
            "ORGANIZER;CN=\"Ann\":mailto:ann@x.org\r\n");
  // Attendees without e-mail are left out.
  EXPECT_EQ(
      property(
          TesselEntity_Calendars_Attendee,
          Array{Dictionary{{k(TesselAttribute_Calendars_Attendee_CommonName), "No Mail"}}, ann}),
      "ATTENDEE;CN=\"Ann\":mailto:ann@x.org\r\n");
  testing::internal::CaptureStderr();
  EXPECT_EQ(property(TesselEntity_Calendars_Organizer,
                     Dictionary{{k(TesselAttribute_Calendars_Attendee_CommonName), "Ann"}}),
            "(absent)");
  EXPECT_EQ(property(TesselEntity_Calendars_Recurrence, Array{Value("daily")}), "(absent)");
  EXPECT_EQ(testing::internal::GetCapturedStderr(),
            "Organizer translation error\nRecurrence translation error\n");
  // Only the first rule is written; an unknown frequency is written as ERROR.
  const Dictionary monthly{{"frequency", "Monthly"},
                           {"until", at(2008, 1, 1, 12, 0, TimeZone::gmt())},
                           {"bymonthday", Array{Value::integer(1), Value::integer(15)}}};
  EXPECT_EQ(property(TesselEntity_Calendars_Recurrence, Array{monthly, Dictionary{}}),
            "RRULE:FREQ=MONTHLY;UNTIL=20080101;BYMONTHDAY=1,15\r\n");
  EXPECT_EQ(exporter.recurrenceRuleForRecord({{"frequency", "fortnightly"}}), "FREQ=ERROR");
}

TEST_F(ExporterTest, AnEmptyOrganizerArrayAbandonsTheCalendar) {
  const Dictionary event{{k(TesselAttribute_Calendars_Event_Summary), "x"},
                         {k(TesselEntity_Calendars_Organizer), Array{}}};
  std::vector<std::uint8_t> buffer{'x'};
  EXPECT_THROW(ZetoCalendarExporter::setupData(buffer, calendar({event})), std::out_of_range);
  EXPECT_EQ(buffer, std::vector<std::uint8_t>{'x'});
}

TEST_F(ExporterTest, EveryAlarmBecomesADisplayAlarmFoldedWithItsLineEndCounted) {
  const Dictionary mail{
      {k(TesselAttribute_Calendars_MailAlarm_Recipients), Array{"a@x.org"}},
      {k(TesselAttribute_Calendars_MailAlarm_Triggerduration), Value::integer(-900)}};
  EXPECT_EQ(property(TesselEntity_Calendars_MailAlarm, Array{mail}),
            "BEGIN:VALARM\r\nACTION:DISPLAY\r\nTRIGGER:-PT15M\r\nEND:VALARM\r\n");
  const auto alarm = [&](std::size_t descriptionLength) {
    return exporter.alarmForRecord(
        {{k(TesselAttribute_Calendars_AudioAlarm_Description), std::string(descriptionLength, 'd')},
         {k(TesselAttribute_Calendars_AudioAlarm_Triggerduration), Value::integer(60)}});
  };
  const std::string head = "BEGIN:VALARM\r\nACTION:DISPLAY\r\nDESCRIPTION:";
  // Line of 70 units: the fold lands after CR LF, the next line follows the space.
  EXPECT_EQ(alarm(58), head + std::string(58, 'd') + "\r\n\r\n TRIGGER:PT1M\r\nEND:VALARM\r\n");
  // Line of 71 units: the fold lands between CR and LF.
  EXPECT_EQ(alarm(59), head + std::string(59, 'd') + "\r\r\n \nTRIGGER:PT1M\r\nEND:VALARM\r\n");
}

}  // namespace
}  // namespace zt::icalendar
