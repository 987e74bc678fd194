// The iCalendar importer: files shaped like the exports of Outlook, Google Calendar,
// Thunderbird and vdirsyncer read into records, written into a store, and malformed files
// refused with their file and line.

#include "importers/ical_import.h"

#include <gtest/gtest.h>

#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "importers/ical_windows_zone.h"
#include "tessel/record_json.h"
#include "tessel/schema.h"
#include "tessel/test_store.h"

namespace tessel::importers {
namespace {

namespace fs = std::filesystem;

const fs::path kData = fs::path(ZT_TEST_DATA_DIR) / "data" / "ical";

std::string readFile(const fs::path& path) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream text;
  text << in.rdbuf();
  return text.str();
}

ICalCalendar readText(const std::string& text, std::optional<std::string> title = std::nullopt) {
  ICalCalendarSource source;
  source.identifier = "cal";
  source.files.push_back({"test.ics", text});
  source.title = std::move(title);
  source.fallbackTitle = "fallback";
  return readICalCalendar(source);
}

ICalCalendar readDataFile(const std::string& name) {
  return readText(readFile(kData / name));
}

// The record of that identifier as a typed JSON line, without its identifier.
std::string json(const ICalCalendar& calendar, const std::string& id) {
  for (const Record& record : calendar.records) {
    if (record.id == id) return recordToJson(record.record);
  }
  return "(absent: " + id + ")";
}

std::string calendarText(const std::string& body) {
  return "BEGIN:VCALENDAR\r\nVERSION:2.0\r\nPRODID:-//Test//EN\r\n" + body + "END:VCALENDAR\r\n";
}

#define EXPECT_CONTAINS(text, part) \
  EXPECT_NE(std::string(text).find(part), std::string::npos) << "in: " << (text)

TEST(ICalImportReading, OutlookExportWithAWindowsZoneNameAndAnOverride) {
  const ICalCalendar calendar = readDataFile("outlook.ics");
  EXPECT_EQ(calendar.title, "Büro");
  const std::string master =
      "cal/event/040000008200E00074C5B7101A82E00800000000A0B1C2D3E4F5A6B7C8D9E0F1A2B3C4D5";
  const std::string moved = master + "/20260209T090000Z";
  EXPECT_EQ(json(calendar, "cal"),
            R"({"tessel.record.entity":"tessel.calendars.Calendar","title":"Büro","events":[")" +
                master + R"(",")" + moved + R"(","cal/event/easter-2026"],"tasks":[]})");
  // "W. Europe Standard Time" is Berlin's; the folded description and attendee lines are
  // whole again, escapes undone.
  EXPECT_EQ(
      json(calendar, master),
      R"({"tessel.record.entity":"tessel.calendars.Event","summary":"Monatliche Besprechung",)"
      R"("description":"Tagesordnung:\n1. Zahlen\n2. Planung für das nächste Quartal, bitte vorbereiten",)"
      R"("location":"Besprechungsraum 3","status":"confirmed","classification":"public",)"
      R"("start date":{"$date":"2026-01-12T10:00:00","tz":"Europe/Berlin"},)"
      R"("end date":{"$date":"2026-01-12T11:00:00","tz":"Europe/Berlin"},)"
      R"("exception dates":[{"$date":"2026-03-09T10:00:00","tz":"Europe/Berlin"}],)"
      R"("all day":false,"priority":5,"recurrences":[")" +
          master + R"(#recurrence1"],"display alarms":[")" + master +
          R"(#alarm1"],"organizer":[")" + master + R"(#organizer"],"attendees":[")" + master +
          R"(#attendee1",")" + master + R"(#attendee2"],"detached events":[")" + moved +
          R"("],"calendar":["cal"]})");
  EXPECT_EQ(
      json(calendar, moved),
      R"j({"tessel.record.entity":"tessel.calendars.Event","summary":"Monatliche Besprechung (verschoben)",)j"
      R"("start date":{"$date":"2026-02-09T16:00:00","tz":"Europe/Berlin"},)"
      R"("end date":{"$date":"2026-02-09T17:00:00","tz":"Europe/Berlin"},)"
      R"("original date":{"$date":"2026-02-09T10:00:00","tz":"Europe/Berlin"},)"
      R"("all day":false,"calendar":["cal"]})");
  EXPECT_EQ(json(calendar, master + "#recurrence1"),
            R"({"tessel.record.entity":"tessel.calendars.Recurrence","frequency":"monthly",)"
            R"("count":10,"bydayfreq":[2],"bydaydays":["monday"]})");
  EXPECT_EQ(json(calendar, master + "#alarm1"),
            R"({"tessel.record.entity":"tessel.calendars.DisplayAlarm","trigger duration":-900,)"
            R"("description":"Reminder"})");
  EXPECT_EQ(json(calendar, master + "#organizer"),
            R"({"tessel.record.entity":"tessel.calendars.Organizer",)"
            R"("directory entry":"ldap://example.com/cn=anna","common name":"Anna Schmidt",)"
            R"("email":"mailto:anna@example.com"})");
  EXPECT_EQ(json(calendar, master + "#attendee1"),
            R"({"tessel.record.entity":"tessel.calendars.Attendee","common name":"Bob Müller",)"
            R"("email":"mailto:bob@example.com","role":"req-participant","status":"accepted",)"
            R"("rsvp":true})");
  // Whole days are noon GMT; DTEND stays the day after the last one, as RFC 5545 has it.
  EXPECT_EQ(json(calendar, "cal/event/easter-2026"),
            R"({"tessel.record.entity":"tessel.calendars.Event","summary":"Ostern 🐣",)"
            R"("classification":"private","start date":{"$date":"2026-04-03T12:00:00","tz":"GMT"},)"
            R"("end date":{"$date":"2026-04-06T12:00:00","tz":"GMT"},"all day":true,)"
            R"("calendar":["cal"]})");
  EXPECT_EQ(calendar.records.size(), 9u);
}

TEST(ICalImportReading, GoogleExportWithAlarmsOfEveryKind) {
  const ICalCalendar calendar = readDataFile("google.ics");
  EXPECT_EQ(calendar.title, "fallback");  // no X-WR-CALNAME
  const std::string standup = "cal/event/7kukuqrfedlm2f9t5ioepeb1ne@google.com";
  // "LOCATION:" says nothing and is left out; one EXDATE line of two dates gives two.
  EXPECT_EQ(json(calendar, standup),
            R"({"tessel.record.entity":"tessel.calendars.Event","summary":"Standup",)"
            R"("description":"Join: https://meet.example.com/abc-defg-hij","status":"tentative",)"
            R"("start date":{"$date":"2026-03-02T09:00:00","tz":"America/New_York"},)"
            R"("end date":{"$date":"2026-03-02T09:30:00","tz":"America/New_York"},)"
            R"("exception dates":[{"$date":"2026-03-04T09:00:00","tz":"America/New_York"},)"
            R"({"$date":"2026-03-06T09:00:00","tz":"America/New_York"}],"all day":false,)"
            R"("recurrences":[")" +
                standup + R"(#recurrence1"],"audio alarms":[")" + standup +
                R"(#alarm2"],"mail alarms":[")" + standup + R"(#alarm1"],"display alarms":[")" +
                standup + R"(#alarm3"],"calendar":["cal"]})");
  EXPECT_EQ(json(calendar, standup + "#recurrence1"),
            R"({"tessel.record.entity":"tessel.calendars.Recurrence","frequency":"weekly",)"
            R"("until":{"$date":"2026-06-30T03:59:59","tz":"UTC"},"interval":2,)"
            R"("bydayfreq":[0,0,0],"bydaydays":["monday","wednesday","friday"],)"
            R"("weekstartday":"sunday"})");
  EXPECT_EQ(json(calendar, standup + "#alarm1"),
            R"({"tessel.record.entity":"tessel.calendars.MailAlarm","trigger duration":-1800,)"
            R"("description":"This is an event reminder","summary":"Alarm notification",)"
            R"("recipients":["mailto:me@example.com"]})");
  // RELATED=END: five minutes after a thirty-minute event ends is 35 minutes after it starts.
  EXPECT_EQ(json(calendar, standup + "#alarm2"),
            R"({"tessel.record.entity":"tessel.calendars.AudioAlarm","trigger duration":2100,)"
            R"("repeat count":2,"repeat interval":60})");
  EXPECT_EQ(
      json(calendar, standup + "#alarm3"),
      R"({"tessel.record.entity":"tessel.calendars.DisplayAlarm",)"
      R"("trigger date":{"$date":"2026-03-01T12:00:00","tz":"UTC"},"description":"Absolute"})");
  EXPECT_EQ(json(calendar, "cal/event/memorial-day@google.com#recurrence1"),
            R"({"tessel.record.entity":"tessel.calendars.Recurrence","frequency":"yearly",)"
            R"("bymonth":[5],"bydayfreq":[-1],"bydaydays":["monday"]})");
  // DURATION instead of DTEND; a UTC time keeps the UTC zone.
  EXPECT_EQ(json(calendar, "cal/event/dinner@google.com"),
            R"({"tessel.record.entity":"tessel.calendars.Event","summary":"Dinner",)"
            R"("start date":{"$date":"2026-01-15T18:00:00","tz":"UTC"},)"
            R"("end date":{"$date":"2026-01-15T19:30:00","tz":"UTC"},"all day":false,)"
            R"("url":{"$url":"https://example.com/dinner"},"calendar":["cal"]})");
}

TEST(ICalImportReading, ZonesWithoutAnIanaNameAndFloatingTimes) {
  const ICalCalendar calendar = readDataFile("custom_zone.ics");
  // A vendor prefix before an IANA name.
  EXPECT_CONTAINS(json(calendar, "cal/event/paris"),
                  R"("start date":{"$date":"2026-07-01T09:00:00","tz":"Europe/Paris"})");
  // Only its VTIMEZONE knows "Station Time": a southern-hemisphere zone whose daylight time
  // runs from October to April. One day of DURATION is a calendar day on its wall clock.
  const std::string station = R"("tz":{"std":36000,"dst":39600,"rule":"M10.1.0,M4.1.0/3"})";
  EXPECT_CONTAINS(json(calendar, "cal/event/station"),
                  R"("start date":{"$date":"2026-01-10T08:00:00",)" + station + "}");
  EXPECT_CONTAINS(json(calendar, "cal/event/station"),
                  R"("end date":{"$date":"2026-01-11T08:00:00",)" + station + "}");
  // A daylight rule that ended (UNTIL) leaves standard time alone.
  EXPECT_CONTAINS(json(calendar, "cal/event/old-summer"),
                  R"("start date":{"$date":"2026-07-10T08:00:00","tz":{"std":10800}})");
  EXPECT_CONTAINS(json(calendar, "cal/event/floating"),
                  R"("start date":{"$date":"2026-01-10T07:00:00","tz":"local"})");
  // Tasks: due and completion dates; "/" and "#" of the UID cannot reach into other
  // identifiers.
  EXPECT_EQ(json(calendar, "cal/task/todo%2F1%23a"),
            R"({"tessel.record.entity":"tessel.calendars.Task","summary":"Renew passport",)"
            R"("status":"completed","classification":"confidential",)"
            R"("start date":{"$date":"2026-02-01T12:00:00","tz":"GMT"},)"
            R"("due date":{"$date":"2026-03-01T12:00:00","tz":"GMT"},)"
            R"("completion date":{"$date":"2026-02-15T10:15:00","tz":"UTC"},"priority":2,)"
            R"("calendar":["cal"]})");
  EXPECT_EQ(calendar.taskCount, 1u);
  EXPECT_EQ(calendar.eventCount, 4u);
}

TEST(ICalImportReading, WindowsZoneNamesNeedNoVTimezone) {
  EXPECT_EQ(ianaZoneForWindowsZone("W. Europe Standard Time"), "Europe/Berlin");
  EXPECT_EQ(ianaZoneForWindowsZone("Middle Earth Time"), std::nullopt);

  const ICalCalendar calendar =
      readText(calendarText("BEGIN:VEVENT\r\nUID:x\r\n"
                            "DTSTART;TZID=\"Tokyo Standard Time\":20260110T090000\r\n"
                            "END:VEVENT\r\n"));
  EXPECT_CONTAINS(json(calendar, "cal/event/x"),
                  R"("start date":{"$date":"2026-01-10T09:00:00","tz":"Asia/Tokyo"})");
}

TEST(ICalImportReading, TitlesAndIdentifiers) {
  const std::string named = calendarText(
      "X-WR-CALNAME:Named\r\nBEGIN:VEVENT\r\nSUMMARY:No uid\r\n"
      "DTSTART:20260101T100000Z\r\nEND:VEVENT\r\n");
  EXPECT_EQ(readText(named).title, "Named");
  EXPECT_EQ(readText(named, "Fixed").title, "Fixed");
  EXPECT_EQ(readText(calendarText("")).title, "fallback");

  // Without a UID, what the event says makes its identifier: the same while it stays so.
  const ICalCalendar first = readText(named);
  const ICalCalendar again = readText(named);
  ASSERT_EQ(first.records.size(), 2u);
  EXPECT_EQ(first.records[1].id, again.records[1].id);
  EXPECT_EQ(first.records[1].id.rfind("cal/event/no-uid-", 0), 0u);

  // The same UID twice (say, in two files of a folder) is one event: the later one.
  const ICalCalendar twice =
      readText(calendarText("BEGIN:VEVENT\r\nUID:a\r\nSUMMARY:old\r\nEND:VEVENT\r\n"
                            "BEGIN:VEVENT\r\nUID:a\r\nSUMMARY:new\r\nEND:VEVENT\r\n"));
  EXPECT_EQ(twice.eventCount, 1u);
  EXPECT_CONTAINS(json(twice, "cal/event/a"), R"("summary":"new")");
}

TEST(ICalImportReading, MalformedInputNamesFileAndLine) {
  struct Case {
    std::string text;
    std::size_t line;
    std::string reason;
  };
  const std::string head = "BEGIN:VCALENDAR\r\nVERSION:2.0\r\nBEGIN:VEVENT\r\nUID:x\r\n";
  const std::string tail = "END:VEVENT\r\nEND:VCALENDAR\r\n";
  const std::vector<Case> cases = {
      {head + "DTSTART:20260230T100000\r\n" + tail, 5, "DTSTART: month 2 of 2026 has no day 30"},
      {head + "SUMMARY:folded\r\n  on\r\nDTSTART:2026011\r\n" + tail, 7,
       "DTSTART: Can't parse as DATE-TIME value in DTSTART property: 2026011"},
      {head + "DTSTART;TZID=Mars/Olympus:20260101T100000\r\n" + tail, 5,
       "no VTIMEZONE defines the time zone \"Mars/Olympus\""},
      {head + "RRULE:FREQ=SOMETIMES\r\n" + tail, 5, "RRULE: Can't parse as RECUR value"},
      {head + "BEGIN:VALARM\r\nACTION:DISPLAY\r\nTRIGGER:-PT15Q\r\nEND:VALARM\r\n" + tail, 7,
       "TRIGGER: Can't parse as DURATION value"},
      // Of two values libical refuses, the first in the file is named, however deep it is.
      {head +
           "BEGIN:VALARM\r\nACTION:DISPLAY\r\nTRIGGER:-PT15Q\r\nEND:VALARM\r\n"
           "DTSTART:2026011\r\n" +
           tail,
       7, "TRIGGER: Can't parse as DURATION value"},
      {head + "just some words\r\n" + tail, 5, "not an iCalendar content line"},
      {head + "END:VCALENDAR\r\n", 5, "END:VCALENDAR where BEGIN:VEVENT of line 3 is still open"},
      {head + "END:VEVENT\r\n", 1, "BEGIN:VCALENDAR is never closed"},
      {head + "SUMMARY:caf\xE9\r\n" + tail, 5, "not UTF-8"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.text);
    try {
      readText(c.text);
      ADD_FAILURE() << "accepted";
    } catch (const ImportError& e) {
      EXPECT_EQ(e.source(), "test.ics");
      EXPECT_EQ(e.line(), c.line) << e.what();
      EXPECT_CONTAINS(e.reason(), c.reason);
    }
  }
}

TEST(ICalImportReading, TolerableHabitsOfExporters) {
  // LF or CR line ends, a byte order mark, a fold inside a UTF-8 character, blank lines,
  // empty values and libical's own X-LIC-ERROR remarks are all read.
  const std::string text =
      "\xEF\xBB\xBF"
      "BEGIN:VCALENDAR\nVERSION:2.0\r"
      "BEGIN:VEVENT\nUID:x\n\nSUMMARY:Gr\xC3\r\n \xBC\xC3\x9F"
      "e\nDESCRIPTION:\nX-LIC-ERROR:old complaint\nEND:VEVENT\nEND:VCALENDAR\n";
  const ICalCalendar calendar = readText(text);
  EXPECT_EQ(json(calendar, "cal/event/x"),
            R"({"tessel.record.entity":"tessel.calendars.Event","summary":"Grüße",)"
            R"("calendar":["cal"]})");
}

class ICalImportStore : public testing::StoreTest {
 protected:
  fs::path write(const std::string& name, const std::string& text) {
    const fs::path path = folder_ / name;
    std::ofstream(path, std::ios::binary) << text;
    return path;
  }

  ICalImportCounts import(const std::vector<fs::path>& paths,
                          SyncDeletes syncDeletes = SyncDeletes::Off) {
    return writeICalCalendars(*store_, readICalendarPaths(paths, std::nullopt), syncDeletes);
  }

  std::vector<std::string> ids() const {
    std::vector<std::string> all;
    store_->forEachRecord([&](const Record& record) { all.push_back(record.id); });
    return all;
  }

  std::string stored(const std::string& id) const {
    auto record = store_->record(id);
    return record ? recordToJson(*record) : "(absent)";
  }

  std::vector<std::string> order() const {
    std::vector<std::string> calendars;
    store_->forEachRecord(
        [&](const Record& record) {
          for (const auto& value :
               *record.record.find(TesselRelationship_Calendars_CalendarOrder_Calendars)
                    ->asArray()) {
            calendars.push_back(*value.asString());
          }
        },
        TesselEntity_Calendars_CalendarOrder);
    return calendars;
  }
};

const std::string kTwoEvents = calendarText(
    "BEGIN:VEVENT\r\nUID:stays\r\nSUMMARY:Stays\r\nDTSTART:20260101T100000Z\r\n"
    "BEGIN:VALARM\r\nACTION:DISPLAY\r\nTRIGGER:-PT5M\r\nEND:VALARM\r\nEND:VEVENT\r\n"
    "BEGIN:VEVENT\r\nUID:goes\r\nSUMMARY:Goes\r\nDTSTART:20260102T100000Z\r\n"
    "ATTENDEE:mailto:a@example.org\r\nEND:VEVENT\r\n");
const std::string kOneEvent = calendarText(
    "BEGIN:VEVENT\r\nUID:stays\r\nSUMMARY:Stays, renamed\r\nDTSTART:20260101T100000Z\r\n"
    "END:VEVENT\r\n");

TEST_F(ICalImportStore, ImportingAgainModifiesInsteadOfDuplicating) {
  const fs::path file = write("work.ics", kTwoEvents);
  const ICalImportCounts first = import({file});
  EXPECT_EQ(first.written, 5u);  // the calendar, two events, an alarm, an attendee
  const std::vector<std::string> before = ids();

  const ICalImportCounts same = import({file});
  EXPECT_EQ(same.written, 0u);
  EXPECT_EQ(ids(), before);

  // A changed summary rewrites that event, under the same identifier.
  write("work.ics", kTwoEvents.substr(0, kTwoEvents.find("Stays")) + "Stays late" +
                        kTwoEvents.substr(kTwoEvents.find("Stays") + 5));
  EXPECT_EQ(import({file}).written, 1u);
  EXPECT_EQ(ids(), before);
  const std::string calendar = calendarIdentifierForPath(file);
  EXPECT_CONTAINS(stored(calendar + "/event/stays"), R"("summary":"Stays late")");
}

TEST_F(ICalImportStore, WhatLeftTheSourceStaysUnlessSyncDeletes) {
  const fs::path file = write("work.ics", kTwoEvents);
  const std::string calendar = calendarIdentifierForPath(file);
  import({file});
  write("work.ics", kOneEvent);

  // Without --sync-deletes the event that left stays in its calendar, with its attendee;
  // the alarm that the remaining event no longer has goes.
  EXPECT_EQ(import({file}).deleted, 1u);
  EXPECT_EQ(stored(calendar + "/event/stays#alarm1"), "(absent)");
  EXPECT_CONTAINS(stored(calendar), R"("events":[")" + calendar + R"(/event/stays",")" + calendar +
                                        R"(/event/goes"])");
  EXPECT_NE(stored(calendar + "/event/goes#attendee1"), "(absent)");

  // With it, everything the source no longer produces goes.
  EXPECT_EQ(import({file}, SyncDeletes::On).deleted, 2u);
  EXPECT_EQ(ids(), (std::vector<std::string>{calendar, calendar + "/event/stays",
                                             "tessel.calendars.order"}));
  EXPECT_CONTAINS(stored(calendar), R"("events":[")" + calendar + R"(/event/stays"])");
}

TEST_F(ICalImportStore, CalendarOrderAppendsNewCalendarsAndDropsDeletedOnes) {
  const fs::path a = write("a.ics", calendarText(""));
  const fs::path b = write("b.ics", calendarText(""));
  const fs::path c = write("c.ics", calendarText(""));
  const std::string idA = calendarIdentifierForPath(a), idB = calendarIdentifierForPath(b),
                    idC = calendarIdentifierForPath(c);
  import({b, a});
  EXPECT_EQ(order(), (std::vector<std::string>{idB, idA}));
  import({a});
  EXPECT_EQ(order(), (std::vector<std::string>{idB, idA}));
  store_->deleteRecords({idB});
  import({c});
  EXPECT_EQ(order(), (std::vector<std::string>{idA, idC}));
}

TEST_F(ICalImportStore, AVdirFolderIsOneCalendar) {
  const std::vector<ICalCalendar> calendars = readICalendarPaths({kData / "vdir"}, "Unused");
  ASSERT_EQ(calendars.size(), 1u);
  const ICalCalendar& family = calendars.front();
  EXPECT_EQ(family.title, "Family");  // its "displayname" file
  EXPECT_EQ(family.eventCount, 3u);   // notes.txt is no calendar
  const std::string school = family.identifier + "/event/school";
  EXPECT_CONTAINS(json(family, school),
                  R"("detached events":[")" + school + R"(/20260106T063000Z"])");
  EXPECT_CONTAINS(json(family, family.identifier + "/event/birthday"),
                  R"("start date":{"$date":"1940-06-12T12:00:00","tz":"GMT"})");

  // A folder without a name of its own is named after the folder, else --title.
  fs::create_directory(folder_ / "Holidays");
  write("Holidays/x.ics", calendarText(""));
  EXPECT_EQ(readICalendarPaths({folder_ / "Holidays"}, std::nullopt).front().title, "Holidays");
  EXPECT_EQ(readICalendarPaths({write("plain.ics", calendarText(""))}, std::nullopt).front().title,
            "plain");
}

TEST_F(ICalImportStore, AFaultInAnyFileReadsNothing) {
  const fs::path good = write("good.ics", kTwoEvents);
  const fs::path bad =
      write("bad.ics", calendarText("BEGIN:VEVENT\r\nDTSTART:2026\r\nEND:VEVENT\r\n"));
  try {
    readICalendarPaths({good, bad}, std::nullopt);
    ADD_FAILURE() << "accepted";
  } catch (const ImportError& e) {
    EXPECT_EQ(e.source(), bad.string());
    EXPECT_EQ(e.line(), 5u);
  }
  try {
    readICalendarPaths({good, folder_ / "missing"}, std::nullopt);
    ADD_FAILURE() << "accepted";
  } catch (const ImportError& e) {
    EXPECT_EQ(e.what(), (folder_ / "missing").string() + ": no such file or folder");
  }
}

}  // namespace
}  // namespace tessel::importers
