// The calendars half of a sync, end to end: the real zetosynctool on a store filled by the
// real `tessel` command and a virtual player, judged by the files on the player, the
// progress notifications and the log.
#include <gtest/gtest.h>

#include <fstream>
#include <functional>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include "platform/identity.h"
#include "support/files.h"
#include "sync/synctool_fixture.h"

namespace zt::sync::test_support {
namespace {

using zt::test_support::contains;
using zt::test_support::readFile;

Json date(const std::string& wallClock, const std::string& zone = "UTC") {
  return Json{{"$date", wallClock}, {"tz", zone}};
}

Json record(const std::string& id, Json fields) {
  return Json{{"id", id}, {"record", fields}};
}

Json calendar(const std::string& id, const std::string& title, std::vector<std::string> events) {
  return record(id, Json{{"tessel.record.entity", "tessel.calendars.Calendar"},
                         {"title", title},
                         {"events", events}});
}

Json event(const std::string& id, const std::string& summary, const std::string& start) {
  return record(id, Json{{"tessel.record.entity", "tessel.calendars.Event"},
                         {"summary", summary},
                         {"start date", date(start)}});
}

class CalendarsSync : public SynctoolTest {
 protected:
  void SetUp() override {
    SynctoolTest::SetUp();
    tessel({"client", "register", std::string(kClientID), "--calendars"});
  }

  fs::path calendarsFolder() const { return volume() / "Calendars"; }
  std::string calendarFile(const std::string& name) const {
    return readFile(calendarsFolder() / name);
  }
  std::vector<std::string> calendarFiles() const {
    return zt::test_support::namesIn(calendarsFolder());
  }

  static std::vector<double> uploadingProgress(const SynctoolRun& run) {
    std::vector<double> progress;
    for (const Json& note : run.notifications) {
      if (note["userInfo"]["TesselClientCurrentPhase"] == "TesselClientUploadingPhase")
        progress.push_back(note["userInfo"]["TesselClientPercentProgressionPhase"].get<double>());
    }
    return progress;
  }
};

TEST_F(CalendarsSync, WritesOneFilePerCalendarInTheUsersOrderAndEmptiesTheFolderFirst) {
  putRecords({calendar("cal-home", "Home", {"ev-1"}), calendar("cal-work", "Work/Office", {"ev-2"}),
              event("ev-1", "Lunch", "2007-03-15T12:30:00"),
              event("ev-2", "Meeting", "2007-03-16T09:00:00")});
  tessel({"calendars", "order", "cal-work", "cal-home"});
  // What the tool never wrote goes too, folders included.
  fs::create_directories(calendarsFolder() / "old" / "inner");
  std::ofstream(calendarsFolder() / "stray.ics") << "BEGIN:VCALENDAR\r\n";
  std::ofstream(calendarsFolder() / "old" / "inner" / "notes.txt") << "x";
  std::ofstream(calendarsFolder() / ".Tessel-Home.ics.tmpAbc123") << "BEGIN:VCALENDAR\r\n";
  // Links go as links: what they lead to is not on the player.
  const fs::path outside = folder() / "outside";
  fs::create_directories(outside);
  std::ofstream(outside / "mine.ics") << "x";
  fs::create_directory_symlink(outside, calendarsFolder() / "linked");
  fs::create_directory_symlink(outside, calendarsFolder() / "old" / "inner" / "away");

  const SynctoolRun run = syncClient(kClientID);

  EXPECT_EQ(run.finalStatus(), 0) << run.log;
  // Two steps per calendar, the syncer's closing 100, then the manager's 100 for the run.
  EXPECT_EQ(uploadingProgress(run), (std::vector<double>{0, 34, 50.5, 67, 83.5, 100, 100, 100}));
  EXPECT_EQ(calendarFiles(),
            (std::vector<std::string>{"Tessel-Home.ics", "Tessel-Work_Office.ics"}));
  const std::string work = calendarFile("Tessel-Work_Office.ics");
  EXPECT_TRUE(contains(work, "X-WR-CALNAME:Work/Office\r\nX-WR-CALORDER:1l\r\n")) << work;
  const std::string home = calendarFile("Tessel-Home.ics");
  EXPECT_TRUE(contains(home, "X-WR-CALNAME:Home\r\nX-WR-CALORDER:2l\r\n")) << home;
  EXPECT_TRUE(contains(home, "SUMMARY:Lunch\r\nDTSTART:20070315T123000Z\r\n")) << home;
  EXPECT_TRUE(run.logged("Removing linked")) << run.log;
  EXPECT_TRUE(fs::exists(outside / "mine.ics"));
  EXPECT_TRUE(run.logged("Uploading changes for calendar 'Work/Office' to Zeto (" +
                         std::to_string(work.size()) + "l bytes)"))
      << run.log;
  // The accepted changes were committed: the client now holds the calendar records.
  EXPECT_GT(client(kClientID)->mirrorSize(), 0u);
}

// A calendar without title is skipped without advancing the progress, but counted in the order;
// of two calendars with one title the later one is left in the file.
TEST_F(CalendarsSync, UntitledCalendarsAreSkippedAndOneTitleMakesOneFile) {
  putRecords({record("cal-untitled", Json{{"tessel.record.entity", "tessel.calendars.Calendar"},
                                          {"events", Json::array()}}),
              calendar("cal-a", "Family", {"ev-a"}), calendar("cal-b", "Family", {"ev-b"}),
              event("ev-a", "Earlier", "2007-03-15T12:30:00"),
              event("ev-b", "Later", "2007-03-16T09:00:00")});
  tessel({"calendars", "order", "cal-untitled", "cal-a", "cal-b"});

  const SynctoolRun run = syncClient(kClientID);

  EXPECT_EQ(run.finalStatus(), 0) << run.log;
  EXPECT_TRUE(run.logged("Calendar has no name - ignoring this calendar")) << run.log;
  // Three calendars, two steps each; the skipped one does not advance the progress.
  EXPECT_EQ(uploadingProgress(run), (std::vector<double>{0, 34, 45, 56, 67, 78, 100, 100}));
  ASSERT_EQ(calendarFiles(), std::vector<std::string>{"Tessel-Family.ics"});
  const std::string text = calendarFile("Tessel-Family.ics");
  EXPECT_TRUE(contains(text, "X-WR-CALORDER:3l\r\n")) << text;
  EXPECT_TRUE(contains(text, "SUMMARY:Later\r\n")) << text;
  EXPECT_FALSE(contains(text, "Earlier")) << text;
}

// Without an order record, or with one without its list (reported even without debug log),
// calendars go in the engine's order.
TEST_F(CalendarsSync, WithoutAUsableCalendarOrderCalendarsGoInTheEnginesOrder) {
  // Two writes, so that the engine offers cal-z before cal-a.
  putRecords({calendar("cal-z", "Zulu", {})});
  putRecords({calendar("cal-a", "Alpha", {})});
  for (const bool orderRecord : {false, true}) {
    SCOPED_TRACE(orderRecord);
    if (orderRecord) {
      putRecords(
          {record("order", Json{{"tessel.record.entity", "tessel.calendars.CalendarOrder"}})});
      setDebugLog(false);
    }
    const SynctoolRun run = syncClient(kClientID);
    EXPECT_EQ(run.finalStatus(), 0) << run.log;
    EXPECT_EQ(run.logContains("*** Can't get list order of calendars!\n"), orderRecord) << run.log;
    EXPECT_TRUE(contains(calendarFile("Tessel-Zulu.ics"), "X-WR-CALORDER:1l\r\n"));
    EXPECT_TRUE(contains(calendarFile("Tessel-Alpha.ics"), "X-WR-CALORDER:2l\r\n"));
  }
}

TEST_F(CalendarsSync, TheFilterSelectsCalendarsAndTheUsersOrderIsKept) {
  putRecords({calendar("cal-a", "Alpha", {}), calendar("cal-b", "Bravo", {}),
              calendar("cal-c", "Charlie", {})});
  tessel({"calendars", "order", "cal-c", "cal-b", "cal-a"});
  tessel({"client", "filter", std::string(kClientID), "calendars", "--calendars", "cal-a,cal-c"});

  const SynctoolRun run = syncClient(kClientID);

  EXPECT_EQ(run.finalStatus(), 0) << run.log;
  EXPECT_EQ(calendarFiles(), (std::vector<std::string>{"Tessel-Alpha.ics", "Tessel-Charlie.ics"}));
  EXPECT_TRUE(contains(calendarFile("Tessel-Charlie.ics"), "X-WR-CALORDER:1l\r\n"));
  EXPECT_TRUE(contains(calendarFile("Tessel-Alpha.ics"), "X-WR-CALORDER:2l\r\n"));
  EXPECT_TRUE(run.logContains("Filtered calendar IDs are:\n(cal-c, cal-a)")) << run.log;
}

// Every run writes every calendar. One whose records have not changed is written from the text
// an earlier run kept: the same bytes, and the same log lines as an export. Nothing the text
// depends on can change without the next run exporting it again.
TEST_F(CalendarsSync, KeptTextsAreReusedOnlyWhileNothingTheyDependOnChanged) {
  // Contacts too, so that the session sees records of both classes.
  tessel({"client", "register", std::string(kClientID), "--contacts", "--calendars"});
  Json walk = event("ev-2", "Walk", "2007-03-16T09:00:00");
  walk["record"]["attendees"] = Json::array({"who"});
  const auto attendee = [](const std::string& entity, const std::string& email) {
    return record("who", Json{{"tessel.record.entity", entity}, {"email", email}});
  };
  putRecords({calendar("cal-home", "Home", {"ev-1", "ev-2"}),
              event("ev-1", "Lunch", "2007-03-15T12:30:00"), walk,
              attendee("tessel.calendars.Attendee", "ann@example.com")});
  const fs::path kept = folder() / ".cache/zetosynctool/calendars";
  // Texts are kept only where the store file and the zone rules can be told apart from others.
  for (const auto& identity : {zt::platform::fileIdentity(folder() / "truth.db"),
                               zt::platform::timeZoneDatabaseIdentity()})
    if (!identity) GTEST_SKIP() << "no texts are kept here: " << identity.error();
  const auto sync = [&] {
    const SynctoolRun run = syncClient(kClientID);
    EXPECT_EQ(run.finalStatus(), 0) << run.log;
    return std::pair{run.log, calendarFile("Tessel-Home.ics")};
  };
  sync();
  ASSERT_EQ(zt::test_support::namesIn(kept).size(), 1u);
  const auto fromKept = sync();
  fs::remove_all(kept);
  EXPECT_EQ(fromKept, sync());
  EXPECT_TRUE(contains(fromKept.second, "SUMMARY:Lunch\r\n")) << fromKept.second;

  // Each change, then what the next file must (and must no longer) say.
  const std::vector<std::tuple<const char*, std::function<void()>, std::string, std::string>>
      changes = {
          {"an event changed",
           [&] {
             Json dinner = event("ev-1", "Dinner", "2007-03-15T19:00:00");
             dinner["record"]["attendees"] = Json::array({"ghost"});
             putRecords({dinner});
           },
           "SUMMARY:Dinner", "Lunch"},
          {"an attendee deleted",
           [&] {
             tessel({"records", "delete", "who"});
           },
           "SUMMARY:Walk", "ann@example.com"},
          // Named but missing since the event changed, then a record of another class under
          // that name: the text depended on more than the calendar's records.
          {"a missing record put as a contact group",
           [&] {
             Json ghost = attendee("tessel.contacts.Group", "bob@example.com");
             ghost["id"] = "ghost";
             putRecords({ghost});
           },
           "bob@example.com", "Lunch"},
      };
  for (const auto& [name, change, now, gone] : changes) {
    SCOPED_TRACE(name);
    change();
    const std::string text = sync().second;
    EXPECT_TRUE(contains(text, now)) << text;
    EXPECT_FALSE(contains(text, gone)) << text;
  }

  // Another store put where the store was, with the same number of writes: the same version
  // of its calendar records, other records.
  const fs::path other = folder() / "other.db";
  setEnvironment("TESSEL_STORE", other.string());
  for (const char* summary : {"Before", "After"}) {
    SCOPED_TRACE(summary);
    for (const char* suffix : {"", "-wal", "-shm"}) fs::remove(other.string() + suffix);
    tessel({"init"});
    tessel({"client", "register", std::string(kClientID), "--calendars"});
    putRecords(
        {calendar("cal-home", "Home", {"ev-1"}), event("ev-1", summary, "2007-03-15T12:30:00")});
    const std::string text = sync().second;
    EXPECT_TRUE(contains(text, std::string("SUMMARY:") + summary)) << text;
  }
}

// Failures end the run with status 2 and say why; the calendars syncer still closes with 100
// (the manager's own 100 is posted only when the run goes on).
struct Failure {
  const char* name;
  std::vector<Json> records;
  std::vector<std::string> order;
  std::string line;
  std::vector<std::string> files;
  std::vector<double> progress;
};

void PrintTo(const Failure& failure, std::ostream* out) {
  *out << failure.name;
}

class CalendarsFailure : public CalendarsSync, public ::testing::WithParamInterface<Failure> {};

TEST_P(CalendarsFailure, EndsTheSyncWithStatusTwo) {
  putRecords(GetParam().records);
  if (!GetParam().order.empty()) {
    std::vector<std::string> command = {"calendars", "order"};
    command.insert(command.end(), GetParam().order.begin(), GetParam().order.end());
    tessel(command);
  }
  std::ofstream(calendarsFolder() / "stray.ics") << "x";
  const SynctoolRun run = syncClient(kClientID);
  EXPECT_EQ(run.finalStatus(), 2) << run.log;
  EXPECT_TRUE(run.logContains(GetParam().line)) << run.log;
  EXPECT_EQ(calendarFiles(), GetParam().files);
  EXPECT_EQ(uploadingProgress(run), GetParam().progress);
  // A failure before any write commits nothing; one while building a calendar is remembered
  // and cancels the session at the end.
  EXPECT_EQ(run.logged("Commiting accepted changes"), !GetParam().files.empty()) << run.log;
  if (!GetParam().files.empty()) {
    EXPECT_EQ(fs::file_size(calendarsFolder() / "Tessel-Broken.ics"), 0u);
    EXPECT_TRUE(contains(calendarFile("Tessel-Fine.ics"), "SUMMARY:Fine\r\n"));
  }
}

Json withMissingOrganizer(Json event) {
  event["record"]["organizer"] = Json::array({"org-missing"});
  return event;
}

INSTANTIATE_TEST_SUITE_P(
    Each, CalendarsFailure,
    ::testing::Values(
        // Deletes take a calendar out of the order, but a store written before they did may
        // still name one that is gone: nothing after it is written.
        Failure{"CalendarMissingFromTruth",
                {calendar("cal-home", "Home", {}),
                 record("tessel.calendars.order",
                        Json{{"tessel.record.entity", "tessel.calendars.CalendarOrder"},
                             {"calendars", {"cal-gone", "cal-home"}}})},
                {},
                "Can't get calendar record in truth",
                {},
                {0, 34, 100}},
        // The broken calendar leaves an empty file and the next one is still written.
        Failure{"OrganizerMissingFromTruth",
                {calendar("cal-broken", "Broken", {"ev-broken"}),
                 calendar("cal-fine", "Fine", {"ev-fine"}),
                 withMissingOrganizer(event("ev-broken", "Broken", "2007-03-05T09:00:00")),
                 event("ev-fine", "Fine", "2007-03-06T09:00:00")},
                {"cal-broken", "cal-fine"},
                "Exception while disassembling data:\n",
                {"Tessel-Broken.ics", "Tessel-Fine.ics"},
                {0, 34, 50.5, 67, 83.5, 100, 100, 100}},
        // Longer than a file name may be: the first step is reported before the write.
        Failure{"FileThePlayerRefuses",
                {calendar("cal-long", std::string(300, 'x'), {}), calendar("cal-home", "Home", {})},
                {"cal-long", "cal-home"},
                "Can't write calendar at path ",
                {},
                {0, 34, 50.5, 100}}),
    [](const ::testing::TestParamInfo<Failure>& failure) { return failure.param.name; });

}  // namespace
}  // namespace zt::sync::test_support
