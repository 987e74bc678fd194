// `tessel import vcard` and `tessel import ical` through the built binary, on the exports of
// tests/importers/data/ and on files each test writes into a fresh folder. What the imports
// read is pinned by the importers' own tests; these pin the commands around them.

#include <string>
#include <vector>

#include "tools/tessel/tessel_command_fixture.h"

namespace {

using namespace tessel::testing;

const fs::path kData = fs::path(ZT_TEST_DATA_DIR) / ".." / ".." / "importers" / "data";

class ImportCommand : public TesselCommandTest {
 protected:
  void SetUp() override {
    TesselCommandTest::SetUp();
    ASSERT_EQ(tessel({"init"}).status, 0);
  }
};

TEST_F(ImportCommand, ImportsFilesAndFoldersAndImportingAgainChangesNothing) {
  const std::string cards = (kData / "vcard" / "vdir").string();
  const std::string outlook = (kData / "ical" / "outlook.ics").string();
  const std::string family = (kData / "ical" / "vdir").string();
  Outcome run = tessel({"import", "vcard", cards});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_CONTAINS(run.out, "2 contacts, 1 group from 3 files; ");
  run = tessel({"import", "ical", outlook, family});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_CONTAINS(run.out, "\"Büro\": 3 events, 0 tasks\n");
  EXPECT_CONTAINS(run.out, "\"Family\": 3 events, 0 tasks\n");
  const std::string stored = listJson();
  // The calendars, in the order they were named, lead the calendar order.
  EXPECT_CONTAINS(stored, R"("tessel.calendars.CalendarOrder","calendars":["ical-)");

  run = tessel({"import", "vcard", cards});
  EXPECT_EQ(run.out, "2 contacts, 1 group from 3 files; 0 written, 0 deleted\n");
  run = tessel({"import", "ical", family, outlook});
  EXPECT_CONTAINS(run.out, "\n0 written, 0 deleted\n");
  EXPECT_EQ(listJson(), stored);
}

TEST_F(ImportCommand, SyncDeletesAndTitles) {
  fs::create_directory(dir_ / "cards");
  fs::copy_file(kData / "vcard" / "vdir" / "a1.vcf", dir_ / "cards" / "a1.vcf");
  fs::copy_file(kData / "vcard" / "vdir" / "b2.vcf", dir_ / "cards" / "b2.vcf");
  ASSERT_EQ(tessel({"import", "vcard", (dir_ / "cards").string()}).status, 0);
  fs::remove(dir_ / "cards" / "a1.vcf");
  Outcome run = tessel({"import", "vcard", "--sync-deletes", (dir_ / "cards").string()});
  EXPECT_EQ(run.out, "1 contact, 0 groups from 1 file; 0 written, 2 deleted\n") << run.err;

  // A calendar downloaded again is found again, by its title; --sync-deletes deletes what
  // left it. --title names a calendar, --calendar names one of the store.
  const fs::path file = dir_ / "Team Plans.ics";
  writeFile(file,
            "BEGIN:VCALENDAR\r\nBEGIN:VEVENT\r\nUID:a\r\nEND:VEVENT\r\n"
            "BEGIN:VEVENT\r\nUID:b\r\nEND:VEVENT\r\nEND:VCALENDAR\r\n");
  run = tessel({"import", "ical", file.string()});
  EXPECT_CONTAINS(run.out, "\"Team Plans\": 2 events, 0 tasks\n");
  const fs::path again = dir_ / "Team Plans (1).ics";
  writeFile(again, "BEGIN:VCALENDAR\r\nBEGIN:VEVENT\r\nUID:a\r\nEND:VEVENT\r\nEND:VCALENDAR\r\n");
  run = tessel({"import", "ical", "--sync-deletes", again.string()});
  EXPECT_CONTAINS(run.out, "\"Team Plans\": 1 event, 0 tasks\n1 written, 1 deleted\n");
  EXPECT_EQ(listJson().find("/event/b\""), std::string::npos);
  run = tessel({"import", "ical", again.string(), "--title", "Plans"});
  EXPECT_CONTAINS(run.out, "\"Plans\": 1 event, 0 tasks\n");
  writeFile(dir_ / "w.ics",
            "BEGIN:VCALENDAR\r\nX-WR-CALNAME:Work\r\nBEGIN:VEVENT\r\nUID:w\r\n"
            "BEGIN:VALARM\r\nTRIGGER:-PT5M\r\nEND:VALARM\r\nEND:VEVENT\r\nEND:VCALENDAR\r\n");
  run = tessel({"import", "ical", (dir_ / "w.ics").string(), "--calendar", "Team"});
  EXPECT_CONTAINS(run.out, "\"Team Plans\": 1 event, 0 tasks\n");
  EXPECT_CONTAINS(run.err, "\ntessel: warning: " + (dir_ / "w.ics").string() +
                               ": line 5: VALARM without ACTION: read as a display alarm\n");
  EXPECT_EQ(tessel({"calendars", "list"}).out.find("Work"), std::string::npos);
}

// A fault costs what cannot be read, with a warning and the count in the summary; with
// --strict it costs the whole import, as does a file of the wrong kind either way.
TEST_F(ImportCommand, FaultsCostWhatCannotBeReadOrWithStrictEverything) {
  ASSERT_EQ(tessel({"import", "vcard", (kData / "vcard" / "vdir").string()}).status, 0);
  const std::string before = listJson();
  const std::string good = (kData / "vcard" / "server_40.vcf").string();
  const std::string bad = (kData / "vcard" / "malformed" / "bad_qp.vcf").string();
  const std::string fault = bad + ": line 4: bad quoted-printable in NOTE";
  writeFile(dir_ / "bad.ics",
            "BEGIN:VCALENDAR\r\nBEGIN:VEVENT\r\nUID:b\r\n"
            "DTSTART;TZID=Nowhere/Unknown:20260101T100000\r\nEND:VEVENT\r\nEND:VCALENDAR\r\n");
  const std::string ics = (dir_ / "bad.ics").string();
  const std::string outlook = (kData / "ical" / "outlook.ics").string();
  Outcome run = tessel({"import", "vcard", "--strict", "--sync-deletes", good, bad});
  EXPECT_EQ(run.status, 1);
  EXPECT_EQ(run.err, "tessel: " + fault + "\n");
  EXPECT_EQ(run.out, "");
  run = tessel({"import", "ical", "--strict", outlook, ics});
  EXPECT_EQ(run.status, 1);
  EXPECT_CONTAINS(run.err, "bad.ics: line 4: DTSTART: no VTIMEZONE defines the time zone");
  // A file of the other kind, or that is no file, imports nothing either way.
  run = tessel({"import", "ical", outlook, good});
  EXPECT_EQ(run.err, "tessel: " + good + ": this is a vCard file: use tessel import vcard\n");
  run = tessel({"import", "vcard", good, outlook});
  EXPECT_EQ(run.err,
            "tessel: " + outlook + ": this is an iCalendar file: use tessel import ical\n");
  run = tessel({"import", "ical", (dir_ / "none.ics").string()});
  EXPECT_EQ(run.err, "tessel: " + (dir_ / "none.ics").string() + ": no such file or folder\n");
  EXPECT_EQ(tessel({"import", "vcard", (dir_ / "nowhere.vcf").string()}).status, 1);
  // A folder with nothing to read is a mistake, not an empty calendar or address book.
  const fs::path empty = dir_ / "empty";
  fs::create_directory(empty);
  run = tessel({"import", "ical", empty.string()});
  EXPECT_EQ(run.status, 1);
  EXPECT_EQ(run.err, "tessel: " + empty.string() + ": no .ics file in this folder\n");
  run = tessel({"import", "vcard", empty.string()});
  EXPECT_EQ(run.err, "tessel: " + empty.string() + ": no .vcf file in this folder\n");
  run = tessel({"import", "ical", (dir_ / "bad.ics").string(), "--calendar", "Nope"});
  EXPECT_EQ(run.status, 2);
  EXPECT_CONTAINS(run.err, "\"Nope\" is not a calendar of the store");
  EXPECT_EQ(listJson(), before);

  run = tessel({"import", "vcard", good, bad});
  EXPECT_EQ(run.status, 0);
  EXPECT_CONTAINS(run.err,
                  "tessel: warning: " + fault + "; dropped the NOTE of the card \"B A\"\n");
  EXPECT_CONTAINS(run.out, " deleted; 1 warning\n");
  run = tessel({"import", "ical", ics});
  EXPECT_EQ(run.status, 0);
  EXPECT_CONTAINS(run.err, "as a floating time\n");
  EXPECT_CONTAINS(run.out, "\"bad\": 1 event, 0 tasks\n");

  EXPECT_EQ(tessel({"import", "vcard"}).status, 2);
  EXPECT_EQ(tessel({"import", "vcard", "--no-such-flag", "x.vcf"}).status, 2);
  EXPECT_EQ(tessel({"import", "ical", "x.ics", "--title"}).status, 2);
}

}  // namespace
