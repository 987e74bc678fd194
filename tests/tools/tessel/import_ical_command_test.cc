// `tessel import ical` through the built binary, as users run it, on the calendar exports of
// tests/importers/data/ical/ and on files each test writes into a fresh folder.

#include <string>
#include <vector>

#include "tools/tessel/tessel_command_fixture.h"

namespace {

using namespace tessel::testing;

const fs::path kData = fs::path(ZT_TEST_DATA_DIR) / ".." / ".." / "importers" / "data" / "ical";

std::size_t lineCount(const std::string& text) {
  std::size_t lines = 0;
  for (char c : text) lines += c == '\n' ? 1 : 0;
  return lines;
}

class ImportICalCommand : public TesselCommandTest {
 protected:
  void SetUp() override {
    TesselCommandTest::SetUp();
    ASSERT_EQ(tessel({"init"}).status, 0);
  }
};

TEST_F(ImportICalCommand, ImportsFilesAndFoldersAndImportingAgainChangesNothing) {
  const std::string outlook = (kData / "outlook.ics").string();
  const std::string vdir = (kData / "vdir").string();
  const Outcome first = tessel({"import", "ical", outlook, vdir, "--title", "Spare"});
  ASSERT_EQ(first.status, 0) << first.err;
  EXPECT_CONTAINS(first.out, "\"Büro\": 3 events, 0 tasks\n");
  EXPECT_CONTAINS(first.out, "\"Family\": 3 events, 0 tasks\n");
  EXPECT_CONTAINS(first.out, "\n15 written, 0 deleted\n");
  const std::string stored = listJson();
  // The calendars, in the order they were named, lead the calendar order.
  EXPECT_CONTAINS(stored, R"("tessel.calendars.CalendarOrder","calendars":["ical-)");
  EXPECT_EQ(lineCount(stored), 16u);  // the 15 records and the calendar order

  const Outcome again = tessel({"import", "ical", vdir, outlook});
  ASSERT_EQ(again.status, 0) << again.err;
  EXPECT_CONTAINS(again.out, "\n0 written, 0 deleted\n");
  EXPECT_EQ(listJson(), stored);
}

TEST_F(ImportICalCommand, AMalformedFileImportsNothingFromAnyFile) {
  writeFile(dir_ / "good.ics",
            "BEGIN:VCALENDAR\r\nBEGIN:VEVENT\r\nUID:a\r\nSUMMARY:Fine\r\nEND:VEVENT\r\n"
            "END:VCALENDAR\r\n");
  writeFile(dir_ / "bad.ics",
            "BEGIN:VCALENDAR\r\nBEGIN:VEVENT\r\nUID:b\r\nSUMMARY:Fine too\r\n"
            "DTSTART;TZID=Nowhere/Special:20260101T100000\r\nEND:VEVENT\r\nEND:VCALENDAR\r\n");
  const std::string before = listJson();
  const Outcome run =
      tessel({"import", "ical", (dir_ / "good.ics").string(), (dir_ / "bad.ics").string()});
  EXPECT_EQ(run.status, 1);
  EXPECT_EQ(run.out, "");
  EXPECT_EQ(run.err, "tessel: " + (dir_ / "bad.ics").string() +
                         ": line 5: DTSTART: no VTIMEZONE defines the time zone "
                         "\"Nowhere/Special\", and it is no IANA or Windows zone name\n");
  EXPECT_EQ(listJson(), before);
}

TEST_F(ImportICalCommand, SyncDeletesAndTitles) {
  const fs::path file = dir_ / "Team Plans.ics";
  writeFile(file,
            "BEGIN:VCALENDAR\r\nBEGIN:VEVENT\r\nUID:a\r\nEND:VEVENT\r\n"
            "BEGIN:VEVENT\r\nUID:b\r\nEND:VEVENT\r\nEND:VCALENDAR\r\n");
  Outcome run = tessel({"import", "ical", file.string()});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_CONTAINS(run.out, "\"Team Plans\": 2 events, 0 tasks\n");

  writeFile(file, "BEGIN:VCALENDAR\r\nBEGIN:VEVENT\r\nUID:a\r\nEND:VEVENT\r\nEND:VCALENDAR\r\n");
  run = tessel({"import", "ical", file.string(), "--title", "Plans"});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_CONTAINS(run.out, "\"Plans\": 1 event, 0 tasks\n1 written, 0 deleted\n");
  EXPECT_CONTAINS(listJson(), "/event/b\"");

  run = tessel({"import", "ical", "--sync-deletes", file.string()});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_CONTAINS(run.out, "\"Team Plans\": 1 event, 0 tasks\n1 written, 1 deleted\n");
  EXPECT_EQ(listJson().find("/event/b\""), std::string::npos);
}

TEST_F(ImportICalCommand, UsageErrorsAndMissingPaths) {
  EXPECT_EQ(tessel({"import", "ical"}).status, 2);
  EXPECT_EQ(tessel({"import", "ical", "x.ics", "--title"}).status, 2);
  const Outcome missing = tessel({"import", "ical", (dir_ / "none.ics").string()});
  EXPECT_EQ(missing.status, 1);
  EXPECT_EQ(missing.err, "tessel: " + (dir_ / "none.ics").string() + ": no such file or folder\n");
}

}  // namespace
