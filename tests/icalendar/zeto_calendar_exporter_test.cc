#include "icalendar/zeto_calendar_exporter.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <fstream>
#include <sstream>
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
  std::string component(const Dictionary& record) const {
    std::string out;
    exporter.appendCalendarRepresentationTo(out, record, "VEVENT");
    return out;
  }
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

TEST_F(ExporterTest, DocumentFrameWithoutTitleOrderOrComponents) {
  EXPECT_EQ(exporter.calendarFromRecords({}),
            "BEGIN:VCALENDAR\r\nVERSION:2.0\r\nCALSCALE:GREGORIAN\r\n"
            "PRODID:-//Kestro Computer\\, Inc//Tessel 2.0//EN\r\nX-WR-CALNAME:Calendar\r\n"
            "END:VCALENDAR\r\n");
}

TEST_F(ExporterTest, OneTimeZoneBlockPerZoneOfStartEndDueCompletionOrOriginalDates) {
  const Dictionary first{
      {k(TesselAttribute_Calendars_Event_StartDate), at(2007, 3, 1, 9, 0, paris())}};
  const Dictionary second{
      {k(TesselAttribute_Calendars_Event_EndDate), at(2007, 3, 2, 9, 0, paris())},
      {k(TesselAttribute_Calendars_Event_ExceptionDates),
       Array{at(2007, 3, 3, 9, 0, TimeZone::named("Asia/Tokyo").value())}}};
  const Dictionary task{
      {k(TesselAttribute_Calendars_Task_DueDate),
       at(2007, 3, 4, 9, 0, TimeZone::named("Asia/Kolkata").value())},
      {k(TesselAttribute_Calendars_Task_StartDate), at(2007, 3, 4, 9, 0, TimeZone::gmt())}};
  const Dictionary record = calendar({first, second}, {task});

  EXPECT_EQ(exporter.timeZoneIdentifiersInCalendar(record),
            (std::vector<std::string>{"Europe/Paris", "Asia/Kolkata"}));
  const std::string text = exporter.calendarFromRecords(record);
  EXPECT_NE(text.find("EXDATE;TZID=Asia/Tokyo:20070303T090000\r\n"), std::string::npos);
  EXPECT_EQ(text.find("TZID:Asia/Tokyo"), std::string::npos);
  EXPECT_NE(text.find("BEGIN:VTODO\r\nDUE;TZID=Asia/Kolkata:20070304T090000\r\n"
                      "DTSTART:20070304T090000Z\r\nEND:VTODO\r\n"),
            std::string::npos);
}

TEST_F(ExporterTest, DirectlyMappedValues) {
  EXPECT_EQ(property("summary", Value("Lunch, then; talk")), "SUMMARY:Lunch\\, then\\; talk\r\n");
  const std::string longSummary(70, 's');  // 78 units with the property name
  EXPECT_EQ(property("summary", Value(longSummary)),
            "SUMMARY:" + longSummary.substr(0, 64) + "\r\n " + longSummary.substr(64) + "\r\n");
  EXPECT_EQ(property("url", Value(platform::Url{"http://x.org/a,b"})),
            "URL:http://x.org/a\\,b\r\n");
  EXPECT_EQ(property("start date", at(2007, 3, 15, 12, 0, TimeZone::gmt())),
            "DTSTART:20070315\r\n");
  EXPECT_EQ(property("original date", at(2007, 3, 15, 8, 0, paris())),
            "RECURRENCE-ID;TZID=Europe/Paris:20070315T080000\r\n");
  EXPECT_EQ(exporter.propertyForKey("summary", "VEVENT", nullptr), std::nullopt);
  EXPECT_EQ(property("classification", Value("private")), "(absent)");
  EXPECT_EQ(property("all day", Value::boolean(true)), "(absent)");
}

TEST_F(ExporterTest, OrganizerFromRecordOrFirstOfArray) {
  const Dictionary ann{{k(TesselAttribute_Calendars_Attendee_CommonName), "Ann"},
                       {k(TesselAttribute_Calendars_Attendee_Email), "mailto:ann@x.org"}};
  EXPECT_EQ(property(TesselEntity_Calendars_Organizer, ann),
            "ORGANIZER;CN=\"Ann\":mailto:ann@x.org\r\n");
  EXPECT_EQ(property(TesselEntity_Calendars_Organizer, Array{ann, Dictionary{}}),
            "ORGANIZER;CN=\"Ann\":mailto:ann@x.org\r\n");

  testing::internal::CaptureStderr();
  EXPECT_EQ(property(TesselEntity_Calendars_Organizer,
                     Dictionary{{k(TesselAttribute_Calendars_Attendee_CommonName), "Ann"}}),
            "(absent)");
  EXPECT_EQ(property(TesselEntity_Calendars_Organizer, Value("ann@x.org")), "(absent)");
  EXPECT_EQ(testing::internal::GetCapturedStderr(),
            "Organizer translation error\nOrganizer translation error\n");
}

TEST_F(ExporterTest, EmptyOrganizerArrayAbandonsTheCalendar) {
  const Dictionary event{{k(TesselAttribute_Calendars_Event_Summary), "x"},
                         {k(TesselEntity_Calendars_Organizer), Array{}}};
  std::vector<std::uint8_t> buffer{'x'};
  EXPECT_THROW(ZetoCalendarExporter::setupData(buffer, calendar({event})), std::out_of_range);
  EXPECT_EQ(buffer, std::vector<std::uint8_t>{'x'});
}

TEST_F(ExporterTest, AttendeesWithoutEmailAreLeftOut) {
  const Array attendees{
      Dictionary{{k(TesselAttribute_Calendars_Attendee_Status), "needsaction"},
                 {k(TesselAttribute_Calendars_Attendee_CommonName), "Bob, Jr."},
                 {k(TesselAttribute_Calendars_Attendee_Role), "chair"},
                 {k(TesselAttribute_Calendars_Attendee_Email), "mailto:bob@x.org"}},
      Dictionary{{k(TesselAttribute_Calendars_Attendee_CommonName), "No Mail"}},
      Dictionary{{k(TesselAttribute_Calendars_Attendee_CommonName), "Cy"},
                 {k(TesselAttribute_Calendars_Attendee_Email), "mailto:cy@x.org"}}};
  EXPECT_EQ(property(TesselEntity_Calendars_Attendee, attendees),
            "ATTENDEE;PARTSTAT=NEEDS-ACTION;CN=\"Bob, Jr.\":mailto:bob@x.org\r\n"
            "ATTENDEE;CN=\"Cy\":mailto:cy@x.org\r\n");
  EXPECT_EQ(property(TesselEntity_Calendars_Attendee, Array{Dictionary{}}), "");
  EXPECT_EQ(property(TesselEntity_Calendars_Attendee, Array{}), "(absent)");
}

TEST_F(ExporterTest, OneRecurrenceRuleFromTheFirstRecord) {
  const Dictionary weekly{{"frequency", "weekly"},
                          {"interval", Value::integer(2)},
                          {"bydaydays", Array{"monday", "wednesday"}},
                          {"count", Value::integer(10)},
                          {"bydayfreq", Array{Value::integer(0), Value::integer(0)}},
                          {"weekstartday", "sunday"}};
  const Dictionary monthly{{"frequency", "Monthly"},
                           {"until", at(2008, 1, 1, 12, 0, TimeZone::gmt())},
                           {"bymonthday", Array{Value::integer(1), Value::integer(15)}},
                           {"bydayfreq", Array{Value::integer(1)}},
                           {"bydaydays", Array{"monday", "friday"}}};
  EXPECT_EQ(property(TesselEntity_Calendars_Recurrence, Array{weekly, monthly}),
            "RRULE:FREQ=WEEKLY;INTERVAL=2;COUNT=10;WKST=SU;BYDAY=MO,WE\r\n");
  EXPECT_EQ(property(TesselEntity_Calendars_Recurrence, Array{monthly}),
            "RRULE:FREQ=MONTHLY;UNTIL=20080101;BYMONTHDAY=1,15\r\n");
  const Dictionary zonedUntil{{"frequency", "fortnightly"},
                              {"until", at(2008, 1, 1, 9, 0, paris())}};
  EXPECT_EQ(exporter.recurrenceRuleForRecord(zonedUntil), "FREQ=ERROR;UNTIL=20080101T080000Z");

  testing::internal::CaptureStderr();
  EXPECT_EQ(property(TesselEntity_Calendars_Recurrence, Array{Value("daily")}), "(absent)");
  EXPECT_EQ(testing::internal::GetCapturedStderr(), "Recurrence translation error\n");
}

TEST_F(ExporterTest, StatusWords) {
  EXPECT_EQ(property(TesselAttribute_Calendars_Event_Status, Value("tentative")),
            "STATUS:TENTATIVE\r\n");
  EXPECT_EQ(property(TesselAttribute_Calendars_Task_Status, Value("needs-action")),
            "STATUS:NEEDS-ACTION\r\n");
  for (const char* none : {"nOnE", ""}) {
    EXPECT_EQ(property(TesselAttribute_Calendars_Event_Status, Value(none)), "(absent)") << none;
  }
  EXPECT_EQ(exporter.lineForStatus(nullptr), std::nullopt);
  const Value number = Value::integer(1);
  EXPECT_EQ(exporter.lineForStatus(&number), std::nullopt);
}

TEST_F(ExporterTest, OneExceptionDateLinePerDate) {
  const Array dates{at(2007, 3, 1, 12, 0, TimeZone::gmt()), at(2007, 3, 8, 9, 30, paris()),
                    at(2007, 3, 15, 9, 30, TimeZone::utc())};
  EXPECT_EQ(property(TesselAttribute_Calendars_Event_ExceptionDates, dates),
            "EXDATE:20070301\r\nEXDATE;TZID=Europe/Paris:20070308T093000\r\n"
            "EXDATE:20070315T093000Z\r\n");
  EXPECT_EQ(property(TesselAttribute_Calendars_Task_ExceptionDates, Array{}), "");
  EXPECT_EQ(
      property(TesselAttribute_Calendars_Event_ExceptionDates, at(2007, 3, 1, 12, 0, paris())),
      "(absent)");
}

TEST_F(ExporterTest, EveryAlarmBecomesADisplayAlarm) {
  const Dictionary mail{
      {k(TesselAttribute_Calendars_MailAlarm_Recipients), Array{"a@x.org"}},
      {k(TesselAttribute_Calendars_MailAlarm_Triggerduration), Value::integer(-900)}};
  const Dictionary audio{
      {k(TesselAttribute_Calendars_AudioAlarm_Triggerdate), at(2007, 3, 1, 9, 0, paris())}};
  EXPECT_EQ(property(TesselEntity_Calendars_MailAlarm, Array{mail, audio}),
            "BEGIN:VALARM\r\nACTION:DISPLAY\r\nTRIGGER:-PT15M\r\nEND:VALARM\r\n"
            "BEGIN:VALARM\r\nACTION:DISPLAY\r\nEND:VALARM\r\n");
}

TEST_F(ExporterTest, AlarmLinesAreFoldedWithTheirLineEndCounted) {
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
  // Line of 143 units: the same, one line further.
  EXPECT_EQ(alarm(131), head + std::string(60, 'd') + "\r\n " + std::string(71, 'd') +
                            "\r\r\n \nTRIGGER:PT1M\r\nEND:VALARM\r\n");
}

TEST_F(ExporterTest, ComponentsFollowTheRecordsKeyOrder) {
  const Dictionary event{{k(TesselAttribute_Calendars_Event_Location), "Room 1"},
                         {"uid", "u"},
                         {k(TesselAttribute_Calendars_Event_Description), "line\nbreak"}};
  EXPECT_EQ(
      component(event),
      "BEGIN:VEVENT\r\nLOCATION:Room 1\r\nUID:u\r\nDESCRIPTION:line\\nbreak\r\nEND:VEVENT\r\n");
}

}  // namespace
}  // namespace zt::icalendar
