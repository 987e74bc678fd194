// The iCalendar importer: files shaped like the exports of Outlook, Google Calendar,
// Thunderbird and vdirsyncer read into records, written into a store, and malformed files
// refused with their file and line.

#include "importers/ical_import.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <string>
#include <vector>

#include "importers/import_warnings.h"
#include "importers/malformed_report.h"
#include "importers/stable_hash.h"
#include "support/files.h"
#include "support/scoped_environment.h"
#include "tessel/record_json.h"
#include "tessel/schema.h"
#include "tessel/test_store.h"

namespace tessel::importers {
namespace {

namespace fs = std::filesystem;

using zt::platform::Array;
using zt::platform::Dictionary;
using zt::platform::Value;

const fs::path kData = fs::path(ZT_TEST_DATA_DIR) / "data" / "ical";

using zt::test_support::readFile;

// Read with OnFault::Refuse, or with `warnings`.
ICalCalendar readText(const std::string& text, ImportWarnings* warnings = nullptr) {
  ICalCalendarSource source;
  source.identifier = "cal";
  source.files.push_back({"test.ics", text});
  source.fallbackTitle = "fallback";
  return warnings != nullptr ? readICalCalendar(source, *warnings) : readICalCalendar(source);
}

ICalCalendar readDataFile(const std::string& name) {
  return readText(readFile(kData / name));
}

// The record of that identifier as a typed JSON line, without its identifier.
std::string json(const ICalCalendar& calendar, const std::string& id) {
  for (const Record& record : calendar.records)
    if (record.id == id) return recordToJson(record.record);
  return "(absent: " + id + ")";
}

std::string calendarText(const std::string& body) {
  return "BEGIN:VCALENDAR\r\nVERSION:2.0\r\nPRODID:-//Test//EN\r\n" + body + "END:VCALENDAR\r\n";
}

// Each export read whole: title, counts and every record as a typed JSON line, compared with
// golden/ical/. What they pin: Outlook's Windows zone names and a moved occurrence of a
// series, folded and escaped lines made whole; Google's alarms of every kind; zones known
// only by their VTIMEZONE (a southern-hemisphere daylight rule, one that ended), vendor
// prefixes before IANA names, floating times, and tasks with "/" and "#" in their UID; and
// habits.ics: LF or CR line ends, a byte order mark, a fold inside a UTF-8 character, blank
// lines, empty values and libical's own X-LIC-ERROR remarks; phone_1_0.vcs: vCalendar 1.0's
// quoted-printable Latin-1, recurrence grammar, alarms, lists and status words.
TEST(ICalImportReading, EachExportBecomesTheRecordsOfItsReferenceFile) {
  for (const char* source :
       {"outlook.ics", "google.ics", "custom_zone.ics", "habits.ics", "phone_1_0.vcs"}) {
    SCOPED_TRACE(source);
    const ICalCalendar calendar = readDataFile(source);
    std::string lines = "title " + calendar.title + ", " + std::to_string(calendar.eventCount) +
                        " events, " + std::to_string(calendar.taskCount) + " tasks\n";
    for (const Record& record : calendar.records)
      lines += recordToJsonLine(record.id, record.record) + "\n";
    EXPECT_TRUE(zt::test_support::matchesGoldenFile(
        fs::path(ZT_TEST_DATA_DIR) / "golden" / "ical" / (std::string(source) + ".jsonl"), lines));
  }
}

// What a component says and what becomes of it, with the warnings said on the way: each
// case's calendar body, a record that must hold a text (or be absent), and the warnings.
TEST(ICalImportReading, NothingIsLostInSilence) {
  zt::test_support::ScopedEnvironment environment;
  environment.set("TZ", "Europe/Paris");
  const std::string noUid = "BEGIN:VEVENT\r\nSUMMARY:Tea\r\nDTSTART:20260101T100000Z\r\n";
  const std::string alarm = "BEGIN:VEVENT\r\nUID:e\r\n";
  const struct {
    std::string body, id, holds, warnings;
    std::size_t events = 1;
  } cases[] = {
      // A fixed-time alarm becomes its offset from the start: of a UTC time, of a time in a
      // zone, and of a whole day, which starts at local midnight (here 23:00 UTC the day
      // before). One without zone is read on the start's wall clock.
      {alarm + "DTSTART:20260301T100000Z\r\nBEGIN:VALARM\r\nACTION:DISPLAY\r\n"
               "TRIGGER;VALUE=DATE-TIME:20260301T091500Z\r\nEND:VALARM\r\nEND:VEVENT\r\n",
       "cal/event/e#alarm1", R"("trigger duration":-2700})", ""},
      {alarm + "DTSTART;TZID=America/New_York:20260301T100000\r\nBEGIN:VALARM\r\n"
               "ACTION:AUDIO\r\nTRIGGER;VALUE=DATE-TIME:20260301T140000Z\r\nEND:VALARM\r\n"
               "END:VEVENT\r\n",
       "cal/event/e#alarm1", R"("trigger duration":-3600})", ""},
      {alarm + "DTSTART;TZID=America/New_York:20260301T100000\r\nBEGIN:VALARM\r\n"
               "ACTION:AUDIO\r\nTRIGGER;VALUE=DATE-TIME:20260301T093000\r\nEND:VALARM\r\n"
               "END:VEVENT\r\n",
       "cal/event/e#alarm1", R"("trigger duration":-1800})", ""},
      {alarm + "DTSTART;VALUE=DATE:20260301\r\nBEGIN:VALARM\r\nACTION:DISPLAY\r\n"
               "TRIGGER;VALUE=DATE-TIME:20260228T170000Z\r\nEND:VALARM\r\nEND:VEVENT\r\n",
       "cal/event/e#alarm1", R"("trigger duration":-21600})", ""},
      // An alarm without ACTION reminds on screen; ACTION:NONE never alerts.
      {alarm + "DTSTART:20260301T100000Z\r\nBEGIN:VALARM\r\nTRIGGER:-PT5M\r\nEND:VALARM\r\n"
               "BEGIN:VALARM\r\nACTION:NONE\r\nTRIGGER:-PT1M\r\nEND:VALARM\r\nEND:VEVENT\r\n",
       "cal/event/e", R"("display alarms":["cal/event/e#alarm1"],)",
       "test.ics: line 7: VALARM without ACTION: read as a display alarm\n"},
      {alarm + "BEGIN:VALARM\r\nACTION:PROCEDURE\r\nTRIGGER:-PT5M\r\nEND:VALARM\r\n"
               "BEGIN:VALARM\r\nACTION:DISPLAY\r\nEND:VALARM\r\nEND:VEVENT\r\n",
       "cal/event/e#alarm1", "(absent",
       "test.ics: line 7: VALARM: ACTION:PROCEDURE is not an alarm: dropped\n"
       "test.ics: line 10: VALARM without TRIGGER: dropped\n"},
      // Of two DTSTART lines the first counts.
      {alarm + "DTSTART:20260301T100000Z\r\nDTSTART:20260302T100000Z\r\nEND:VEVENT\r\n",
       "cal/event/e", R"("start date":{"$date":"2026-03-01T10:00:00")",
       "test.ics: line 7: a second DTSTART: ignored\n"},
      // Without UID, what the event says is its identity: two that differ stay two.
      {noUid + "END:VEVENT\r\n" + noUid + "DESCRIPTION:Green\r\nEND:VEVENT\r\n", "cal",
       R"("events":["cal/event/no-uid-)", "", 2},
      // A UID given twice: both kept, the later as a copy; the same event twice is one.
      {"BEGIN:VEVENT\r\nUID:a\r\nSUMMARY:old\r\nEND:VEVENT\r\n"
       "BEGIN:VEVENT\r\nUID:a\r\nSUMMARY:new\r\nEND:VEVENT\r\n"
       "BEGIN:VEVENT\r\nUID:a\r\nSUMMARY:new\r\nDTSTAMP:20260101T000000Z\r\nEND:VEVENT\r\n",
       "cal", R"("events":["cal/event/a","cal/event/a/copy-)",
       "test.ics: line 9: UID a is given twice: kept as a second event\n", 2},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.body);
    // Nothing here is a fault: with OnFault::Refuse too, the warnings are only said.
    ImportWarnings warnings(OnFault::Refuse);
    const ICalCalendar calendar = readText(calendarText(c.body), &warnings);
    std::string said;
    for (const ImportWarning& warning : warnings.all()) said += warningText(warning) + "\n";
    EXPECT_CONTAINS(json(calendar, c.id), c.holds);
    EXPECT_EQ(said, c.warnings);
    EXPECT_EQ(calendar.eventCount, c.events);
  }
  // Read again, also with lines added before them, events without UID keep their
  // identifiers.
  const std::string teas = noUid + "END:VEVENT\r\n" + noUid + "DESCRIPTION:Green\r\nEND:VEVENT\r\n";
  const ICalCalendar first = readText(calendarText(teas));
  const ICalCalendar again = readText(calendarText("X-WR-CALNAME:Named\r\n\r\n" + teas));
  EXPECT_EQ(first.records[1].id, again.records[1].id);
  EXPECT_EQ(first.records[2].id, again.records[2].id);
  EXPECT_EQ(first.title, "fallback");
  EXPECT_EQ(again.title, "Named");
}

// Every file of malformed/, after a good file: with OnFault::Refuse, refused with its line and
// reason; with OnFault::Skip, what is kept and each warning. Compared with
// golden/ical/malformed.txt.
TEST(ICalImportReading, MalformedInputCostsWhatCannotBeReadOrWithRefuseEverything) {
  const std::string faults = malformedReport(
      kData / "malformed", kData / "outlook.ics",
      [](const ImportPaths& paths) { readICalendarPaths(paths); },
      [](const ImportPaths& paths, ImportWarnings& warnings) {
        const std::vector<ICalCalendar> read =
            readICalendarPaths(parseICalendarPaths(paths, warnings), {}, {}, warnings);
        return std::to_string(read.back().eventCount) + " events, " +
               std::to_string(read.back().taskCount) + " tasks";
      });
  EXPECT_TRUE(zt::test_support::matchesGoldenFile(
      fs::path(ZT_TEST_DATA_DIR) / "golden" / "ical" / "malformed.txt", faults));
}

class ICalImportStore : public testing::StoreTest {
 protected:
  fs::path write(const std::string& name, const std::string& text) {
    const fs::path path = folder_ / name;
    fs::create_directories(path.parent_path());
    std::ofstream(path, std::ios::binary) << text;
    return path;
  }

  ICalImportCounts import(const std::vector<fs::path>& paths,
                          SyncDeletes syncDeletes = SyncDeletes::Off,
                          const ICalImportTarget& target = {}) {
    return writeICalCalendars(*store_, readICalendarPaths(paths, target, knownCalendars(*store_)),
                              syncDeletes);
  }

  // The identifier of the first calendar of that title.
  std::string calendarTitled(const std::string& title) const {
    for (const KnownCalendar& calendar : knownCalendars(*store_))
      if (calendar.title == title) return calendar.identifier;
    return "(no calendar " + title + ")";
  }

  // "Title: N events; " of each calendar, by title.
  std::string calendars() const {
    std::vector<std::string> lines;
    for (const KnownCalendar& calendar : knownCalendars(*store_)) {
      const auto events = zt::platform::stringsIn(
          store_->record(calendar.identifier)->find(TesselRelationship_Calendars_Calendar_Events));
      lines.push_back(calendar.title + ": " + std::to_string(events.size()) + " events; ");
    }
    std::sort(lines.begin(), lines.end());
    std::string text;
    for (const std::string& line : lines) text += line;
    return text;
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
    return zt::platform::stringsIn(
        store_->record("tessel.calendars.order")
            ->find(TesselRelationship_Calendars_CalendarOrder_Calendars));
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

std::string namedCalendar(const std::string& labels, const std::string& uid) {
  return calendarText(labels + "BEGIN:VEVENT\r\nUID:" + uid + "\r\nEND:VEVENT\r\n");
}

// Imports one after the other, and the calendars they leave: a calendar is found again by
// its writer's X-WR-RELCALID, else by its title, wherever its file is now.
TEST_F(ICalImportStore, CalendarsAreFoundAgainByRelationIdElseByTitle) {
  struct Step {
    std::string file, labels, title = "", calendar = "";
  };
  const std::string work = "X-WR-CALNAME:Work\r\n";
  const struct {
    std::vector<Step> steps;
    std::string calendars;
  } cases[] = {
      // Downloaded again, or moved: the same calendar.
      {{{"work.ics", work}, {"work (1).ics", work}, {"moved/work.ics", work}}, "Work: 3 events; "},
      // The writer's identifier holds through a new title; another writer's calendar of the
      // same title is another calendar.
      {{{"a.ics", "X-WR-RELCALID:r1\r\n" + work},
        {"b.ics", "X-WR-RELCALID:r1\r\nX-WR-CALNAME:Job\r\n"},
        {"c.ics", "X-WR-RELCALID:r2\r\n" + work},
        {"d.ics", work}},
       "Job: 2 events; Work: 2 events; "},
      // --title wins over X-WR-CALNAME and finds the calendar it names; --calendar names the
      // calendar outright, and keeps its title.
      {{{"a.ics", work, "Mine"},
        {"b.ics", "", "Mine"},
        {"c.ics", work, "", "Mine"},
        {"d.ics", work}},
       "Mine: 3 events; Work: 1 events; "},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.calendars);
    store_->deleteRecords(ids());
    int uid = 0;
    for (const Step& step : c.steps) {
      ICalImportTarget target;
      if (!step.title.empty()) target.title = step.title;
      if (!step.calendar.empty()) target.calendar = calendarTitled(step.calendar);
      import({write(step.file, namedCalendar(step.labels, std::to_string(++uid)))},
             SyncDeletes::Off, target);
    }
    EXPECT_EQ(calendars(), c.calendars);
  }

  // Calendars of earlier versions were known by the path of their file ("ical-" and its
  // hash): one is found by its title, else by that path; of two of a title, none is chosen.
  store_->deleteRecords(ids());
  Record earlier{"ical-earlier",
                 {{TesselRecordEntityNameKey, TesselEntity_Calendars_Calendar},
                  {TesselAttribute_Calendars_Calendar_Title, "Work"}}};
  const fs::path copy = write("plans (1).ics", namedCalendar("", "p"));
  Record byPath{"ical-" + stableHash(fs::canonical(copy).string()), earlier.record};
  byPath.record.set(TesselAttribute_Calendars_Calendar_Title, "plans (1)");
  store_->putRecords({earlier, byPath});
  import({write("work.ics", namedCalendar(work, "x")), copy});
  EXPECT_EQ(calendarTitled("Work"), "ical-earlier");
  EXPECT_EQ(calendarTitled("plans"), byPath.id);
  EXPECT_EQ(calendars(), "Work: 1 events; plans: 1 events; ");
  earlier.id = "ical-other";
  store_->putRecords({earlier});
  EXPECT_THROW(
      {
        try {
          import({folder_ / "work.ics"});
        } catch (const ImportError& e) {
          EXPECT_EQ(e.reason(),
                    "2 calendars of the store are titled \"Work\" (ical-earlier, ical-other): "
                    "name one with --calendar");
          throw;
        }
      },
      ImportError);
}

TEST_F(ICalImportStore, WhatLeftTheSourceStaysUnlessSyncDeletes) {
  import({write("other.ics", namedCalendar("", "elsewhere"))});
  const fs::path file = write("work.ics", kTwoEvents);
  import({file});
  const std::string calendar = calendarTitled("work");
  const std::string other = calendarTitled("other");
  // An event that came otherwise into the calendar is not the import's to delete.
  Record byHand{"by-hand", {{TesselRecordEntityNameKey, TesselEntity_Calendars_Event}}};
  Dictionary listing = *store_->record(calendar);
  Array events = *listing.arrayAt(TesselRelationship_Calendars_Calendar_Events);
  events.emplace_back("by-hand");
  listing.set(TesselRelationship_Calendars_Calendar_Events, Value(events));
  store_->putRecords({byHand, {calendar, listing}});
  write("work.ics", kOneEvent);

  // Without --sync-deletes the event that left stays in its calendar, with its attendee;
  // the alarm that the remaining event no longer has goes.
  EXPECT_EQ(import({file}).deleted, 1u);
  EXPECT_EQ(stored(calendar + "/event/stays#alarm1"), "(absent)");
  EXPECT_CONTAINS(stored(calendar), R"("events":[")" + calendar + R"(/event/stays","by-hand",")" +
                                        calendar + R"(/event/goes"])");
  EXPECT_NE(stored(calendar + "/event/goes#attendee1"), "(absent)");

  // With it, everything the source no longer produces goes, from this calendar only.
  EXPECT_EQ(import({file}, SyncDeletes::On).deleted, 2u);
  EXPECT_EQ(ids(), (std::vector<std::string>{"by-hand", other, other + "/event/elsewhere", calendar,
                                             calendar + "/event/stays", "tessel.calendars.order"}));
  EXPECT_CONTAINS(stored(calendar), R"("events":[")" + calendar + R"(/event/stays","by-hand"])");
}

TEST_F(ICalImportStore, CalendarOrderAppendsNewCalendarsAndDropsDeletedOnes) {
  const fs::path a = write("a.ics", calendarText(""));
  const fs::path b = write("b.ics", calendarText(""));
  const fs::path c = write("c.ics", calendarText(""));
  import({b, a});
  const std::string idA = calendarTitled("a"), idB = calendarTitled("b");
  EXPECT_EQ(order(), (std::vector<std::string>{idB, idA}));
  import({a});
  EXPECT_EQ(order(), (std::vector<std::string>{idB, idA}));
  store_->deleteRecords({idB});
  import({c});
  EXPECT_EQ(order(), (std::vector<std::string>{idA, calendarTitled("c")}));
}

}  // namespace
}  // namespace tessel::importers
