// The iCalendar importer: files shaped like the exports of Outlook, Google Calendar,
// Thunderbird and vdirsyncer read into records, written into a store, and malformed files
// refused with their file and line.

#include "importers/ical_import.h"

#include <gtest/gtest.h>

#include <fstream>
#include <string>
#include <vector>

#include "importers/import_warnings.h"
#include "support/files.h"
#include "tessel/record_json.h"
#include "tessel/schema.h"
#include "tessel/test_store.h"

namespace tessel::importers {
namespace {

namespace fs = std::filesystem;

const fs::path kData = fs::path(ZT_TEST_DATA_DIR) / "data" / "ical";

using zt::test_support::readFile;

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

TEST(ICalImportReading, TitlesAndIdentifiers) {
  const std::string named = calendarText(
      "X-WR-CALNAME:Named\r\nBEGIN:VEVENT\r\nSUMMARY:No uid\r\n"
      "DTSTART:20260101T100000Z\r\nEND:VEVENT\r\n");
  EXPECT_EQ(readText(named).title, "Named");
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

// Every file of malformed/, after a good file: with OnFault::Refuse, refused with its line and
// reason; with OnFault::Skip, what is kept and each warning. Compared with
// golden/ical/malformed.txt.
TEST(ICalImportReading, MalformedInputCostsWhatCannotBeReadOrWithRefuseEverything) {
  std::string faults;
  const auto line = [](std::optional<std::size_t> number) {
    return "line " + std::to_string(number.value_or(0)) + ": ";
  };
  for (const std::string& name : zt::test_support::namesIn(kData / "malformed")) {
    const std::vector<fs::path> paths = {kData / "outlook.ics", kData / "malformed" / name};
    try {
      readICalendarPaths(paths, std::nullopt);
      faults += name + ": accepted\n";
    } catch (const ImportError& e) {
      EXPECT_EQ(e.source(), (kData / "malformed" / name).string());
      faults += name + ": " + line(e.line()) + e.reason() + "\n";
    }
    ImportWarnings warnings(OnFault::Skip);
    try {
      const std::vector<ICalCalendar> read = readICalendarPaths(paths, std::nullopt, warnings);
      faults += "  kept " + std::to_string(read.back().eventCount) + " events, " +
                std::to_string(read.back().taskCount) + " tasks\n";
    } catch (const ImportError& e) {
      faults += "  refused: " + line(e.line()) + e.reason() + "\n";
    }
    for (const ImportWarning& warning : warnings.all()) {
      EXPECT_EQ(warning.source, (kData / "malformed" / name).string());
      faults += "  warning: " + line(warning.line) + warning.message + "\n";
    }
  }
  EXPECT_TRUE(zt::test_support::matchesGoldenFile(
      fs::path(ZT_TEST_DATA_DIR) / "golden" / "ical" / "malformed.txt", faults));
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

}  // namespace
}  // namespace tessel::importers
