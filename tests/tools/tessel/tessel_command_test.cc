// Runs the real `tessel` binary in a fresh folder per test, as scripts and users do.

#include <algorithm>
#include <string>
#include <vector>

#include "tools/tessel/tessel_command_fixture.h"

namespace {

using namespace tessel::testing;

class TesselCommand : public TesselCommandTest {
 protected:
  // Puts `text` through a file and expects success.
  void put(const std::string& text) {
    writeFile(dir_ / "put.jsonl", text);
    const Outcome run = tessel({"records", "put", (dir_ / "put.jsonl").string()});
    ASSERT_EQ(run.status, 0) << run.err;
  }
};

// Lines as `records list --json` writes them: in identifier order, keys in record order.
const std::string kCalendar =
    R"({"id":"cal-1","record":{"tessel.record.entity":"tessel.calendars.Calendar","title":"Work","events":["ev-1"]}})";
const std::string kEvent =
    R"({"id":"ev-1","record":{"tessel.record.entity":"tessel.calendars.Event","summary":"Caf\u00e9 \"Meeting\"","start date":{"$date":"2007-03-15T12:30:00","tz":"Europe/Paris"},"end date":{"$date":"2007-03-15T13:30:00.25","tz":{"std":3600,"dst":7200,"rule":"M3.5.0,M10.5.0/3"}},"all day":false,"priority":5,"weight":0.5,"url":{"$url":"https://example.org/m"},"exception dates":[{"$date":"2007-03-22T12:00:00","tz":"GMT"},{"$date":"2007-03-29T12:00:00","tz":"UTC"}],"calendar":["cal-1"]}})";
const std::string kContact =
    R"({"id":"p-1","record":{"zeta":"last key first","tessel.record.entity":"tessel.contacts.Contact","last name":"Lovelace","first name":"Ada","image":{"$data":"iVBORw0KGgo="},"extra":{"b":1,"a":[1,2]}}})";

TEST_F(TesselCommand, PutThenListJsonGivesTheSameLinesInIdentifierOrder) {
  ASSERT_EQ(tessel({"init"}).status, 0);
  // Given out of identifier order; listed in it.
  put(kContact + "\n" + kEvent + "\n" + kCalendar + "\n");
  const std::string listed = listJson();
  // The event's summary is written back with the character itself, not the \u escape.
  std::string event = kEvent;
  event.replace(event.find("\\u00e9"), 6, "\xC3\xA9");
  EXPECT_EQ(listed, kCalendar + "\n" + event + "\n" + kContact + "\n");

  // Reading the listing back changes nothing.
  put(listed);
  EXPECT_EQ(listJson(), listed);
}

TEST_F(TesselCommand, PutReadsStandardInputAndReplacesById) {
  ASSERT_EQ(tessel({"init"}).status, 0);
  ASSERT_EQ(tessel({"records", "put", "-"}, kCalendar + "\n").status, 0);
  const std::string renamed =
      R"({"id":"cal-1","record":{"tessel.record.entity":"tessel.calendars.Calendar","title":"Home"}})";
  const Outcome run = tessel({"records", "put", "-"}, renamed);
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_EQ(listJson(), renamed + "\n");
}

TEST_F(TesselCommand, AMalformedLineAnywhereChangesNothing) {
  ASSERT_EQ(tessel({"init"}).status, 0);
  put(kCalendar + "\n" + kContact + "\n");
  const std::string before = listJson();

  const std::string changedCalendar =
      R"({"id":"cal-1","record":{"tessel.record.entity":"tessel.calendars.Calendar","title":"Changed"}})";
  const std::string newEvent =
      R"({"id":"ev-9","record":{"tessel.record.entity":"tessel.calendars.Event","summary":"x"}})";
  const std::vector<std::pair<std::string, std::string>> badLines = {
      {R"({"id":"b","record":{"tessel.record.entity":"e","d":{"$date":"2007-02-30T10:00","tz":"UTC"}}})",
       "day 30"},
      {R"({"id":"b","record":{"tessel.record.entity":"e")", "invalid JSON"},
      {R"({"id":"b","record":{"first name":"no entity"}})", "entity"},
  };
  for (const auto& [bad, reason] : badLines) {
    writeFile(dir_ / "bad.jsonl", changedCalendar + "\n" + bad + "\n" + newEvent + "\n");
    const Outcome run = tessel({"records", "put", (dir_ / "bad.jsonl").string()});
    EXPECT_EQ(run.status, 1) << bad;
    EXPECT_CONTAINS(run.err, "tessel: ");
    EXPECT_CONTAINS(run.err, "bad.jsonl: line 2: ");
    EXPECT_CONTAINS(run.err, reason);
    EXPECT_EQ(listJson(), before) << bad;
  }
}

TEST_F(TesselCommand, ReadableListingHasIdEntityAndSummaryAndFiltersByEntity) {
  ASSERT_EQ(tessel({"init"}).status, 0);
  put(kCalendar + "\n" + kEvent + "\n" + kContact + "\n");

  const Outcome all = tessel({"records", "list"});
  ASSERT_EQ(all.status, 0) << all.err;
  std::istringstream lines(all.out);
  std::string first;
  std::getline(lines, first);
  EXPECT_EQ(first, "cal-1\ttessel.calendars.Calendar\tWork");
  EXPECT_CONTAINS(all.out, "p-1\ttessel.contacts.Contact\tAda Lovelace\n");

  const Outcome events = tessel({"records", "list", "--entity", "tessel.calendars.Event"});
  ASSERT_EQ(events.status, 0) << events.err;
  EXPECT_EQ(events.out.rfind("ev-1\ttessel.calendars.Event\tCaf\xC3\xA9 \"Meeting\"", 0), 0u)
      << events.out;
  EXPECT_EQ(std::count(events.out.begin(), events.out.end(), '\n'), 1);
}

TEST_F(TesselCommand, DeleteIsAllOrNothing) {
  ASSERT_EQ(tessel({"init"}).status, 0);
  put(kCalendar + "\n" + kEvent + "\n" + kContact + "\n");

  const Outcome unknown = tessel({"records", "delete", "ev-1", "no-such-record"});
  EXPECT_EQ(unknown.status, 1);
  EXPECT_CONTAINS(unknown.err, "no-such-record");
  EXPECT_CONTAINS(listJson(), "\"ev-1\"");

  const Outcome run = tessel({"records", "delete", "ev-1", "p-1"});
  ASSERT_EQ(run.status, 0) << run.err;
  // The calendar no longer names the deleted event.
  EXPECT_EQ(
      listJson(),
      R"({"id":"cal-1","record":{"tessel.record.entity":"tessel.calendars.Calendar","title":"Work"}})"
      "\n");
}

TEST_F(TesselCommand, CalendarOrderIsTheOneOrderRecord) {
  ASSERT_EQ(tessel({"init"}).status, 0);
  put(kCalendar + "\n" +
      R"({"id":"cal-2","record":{"tessel.record.entity":"tessel.calendars.Calendar","title":"Home"}})" +
      "\n");
  ASSERT_EQ(tessel({"calendars", "order", "cal-2", "cal-1"}).status, 0);
  ASSERT_EQ(tessel({"calendars", "order", "cal-1", "cal-2"}).status, 0);

  const Outcome order =
      tessel({"records", "list", "--json", "--entity", "tessel.calendars.CalendarOrder"});
  ASSERT_EQ(order.status, 0) << order.err;
  EXPECT_EQ(std::count(order.out.begin(), order.out.end(), '\n'), 1) << order.out;
  EXPECT_CONTAINS(order.out, R"("calendars":["cal-1","cal-2"])");

  const Outcome unknown = tessel({"calendars", "order", "cal-1", "cal-404"});
  EXPECT_EQ(unknown.status, 1);
  EXPECT_CONTAINS(unknown.err, "cal-404");
}

TEST_F(TesselCommand, ClientSettingsAreSetShownAndUnset) {
  ASSERT_EQ(tessel({"init"}).status, 0);
  Outcome run = tessel(
      {"client", "register", "zeto-000A27001A2B3C4D", "--contacts", "--name", "Kitchen player"});
  ASSERT_EQ(run.status, 0) << run.err;
  ASSERT_EQ(tessel({"client", "set", "zeto-000A27001A2B3C4D", "SyncContactPicturesEnabled", "true"})
                .status,
            0);
  ASSERT_EQ(tessel({"client", "set", "zeto-000A27001A2B3C4D", "LastSyncToolVersion", "38"}).status,
            0);
  ASSERT_EQ(tessel({"client", "set", "zeto-000A27001A2B3C4D", "LastModDateForVCF",
                    "2026-11-21T11:00:00+01:00"})
                .status,
            0);

  run = tessel({"client", "show", "zeto-000A27001A2B3C4D"});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_CONTAINS(run.out, "name: Kitchen player\n");
  EXPECT_CONTAINS(run.out, "  tessel.contacts.Contact\n");
  EXPECT_EQ(run.out.find("tessel.calendars."), std::string::npos) << run.out;
  EXPECT_CONTAINS(run.out, "  SyncContactPicturesEnabled = true\n");
  EXPECT_CONTAINS(run.out, "  LastSyncToolVersion = 38\n");
  EXPECT_CONTAINS(run.out, "  LastModDateForVCF = 2026-11-21T11:00:00+01:00\n");
  EXPECT_CONTAINS(run.out, "filters: none\n");

  ASSERT_EQ(tessel({"client", "unset", "zeto-000A27001A2B3C4D", "LastSyncToolVersion"}).status, 0);
  run = tessel({"client", "show", "zeto-000A27001A2B3C4D"});
  EXPECT_EQ(run.out.find("LastSyncToolVersion"), std::string::npos) << run.out;

  run = tessel({"client", "unset", "zeto-000A27001A2B3C4D", "LastSyncToolVersion"});
  EXPECT_EQ(run.status, 1);
  EXPECT_CONTAINS(run.err, "LastSyncToolVersion");

  for (const char* bad : {"yes", "2026-11-21T10:00:00"}) {
    run = tessel({"client", "set", "zeto-000A27001A2B3C4D", "Key", bad});
    EXPECT_EQ(run.status, 2) << bad;
    EXPECT_CONTAINS(run.err, "tessel: ");
  }
}

TEST_F(TesselCommand, ClientFiltersSelectExistingGroupsAndCalendarsOnly) {
  ASSERT_EQ(tessel({"init"}).status, 0);
  put(kCalendar + "\n" +
      R"({"id":"g-1","record":{"tessel.record.entity":"tessel.contacts.Group","name":"Family"}})" +
      "\n");
  ASSERT_EQ(tessel({"client", "register", "c", "--contacts", "--calendars"}).status, 0);

  Outcome run = tessel({"client", "filter", "c", "contacts", "--groups", "g-1"});
  ASSERT_EQ(run.status, 0) << run.err;
  run = tessel({"client", "filter", "c", "calendars", "--calendars", "cal-1"});
  ASSERT_EQ(run.status, 0) << run.err;
  // Setting the contacts again replaces the earlier contact filter instead of adding one.
  ASSERT_EQ(tessel({"client", "filter", "c", "contacts", "--all"}).status, 0);
  run = tessel({"client", "show", "c"});
  EXPECT_CONTAINS(run.out, "ZetoContactFilter: Contact Filter 0x");
  EXPECT_CONTAINS(run.out, ": enableAll YES");
  EXPECT_CONTAINS(run.out, "ZetoCalendarFilter: Calendar Filter 0x");
  EXPECT_CONTAINS(run.out, ": enableALL NO, with options (");
  EXPECT_EQ(run.out.find("ZetoContactFilter", run.out.find("ZetoContactFilter") + 1),
            std::string::npos);

  // A group given as a calendar, an unknown identifier, or both --all and a list: usage
  // errors that leave the stored filters as they were.
  const std::string before = tessel({"client", "show", "c"}).out;
  for (const std::vector<std::string>& args : std::vector<std::vector<std::string>>{
           {"client", "filter", "c", "calendars", "--calendars", "g-1"},
           {"client", "filter", "c", "calendars", "--all", "--calendars", "cal-1"},
       }) {
    run = tessel(args);
    EXPECT_EQ(run.status, 2) << args[4];
    EXPECT_CONTAINS(run.err, "tessel: ");
  }
  const std::string after = tessel({"client", "show", "c"}).out;
  // Filter descriptions carry object addresses; compare what they select.
  auto selection = [](const std::string& text) {
    std::string kept;
    for (std::size_t at = text.find(": enable"); at != std::string::npos;
         at = text.find(": enable", at + 1)) {
      kept += text.substr(at, text.find('\n', at) - at) + "\n";
    }
    return kept;
  };
  EXPECT_EQ(selection(after), selection(before));
  EXPECT_EQ(tessel({"client", "filter", "ghost", "contacts", "--all"}).status, 1);
}

TEST_F(TesselCommand, DevicesListsThePlayersWithTheirSuggestedClients) {
  writeFile(dir_ / "players.json",
            R"([{"id": "000A27001A2B3C4D", "volume": ")" + (dir_ / "vol").string() +
                R"(", "mounted": true}, {"id": "1a2b", "volume": "/nowhere", "mounted": false}])");
  setenv("ZETO_VIRTUAL_DEVICES", (dir_ / "players.json").c_str(), 1);
  Outcome run = tessel({"devices"});
  EXPECT_EQ(run.status, 0) << run.err;
  EXPECT_EQ(run.out, "A27001A2B3C4D\t" + (dir_ / "vol").string() +
                         "\tclient: zeto-A27001A2B3C4D\n"
                         "1A2B\tnot mounted\tclient: zeto-1A2B\n");

  writeFile(dir_ / "players.json", "[]");
  run = tessel({"devices"});
  EXPECT_EQ(run.out, "no Zeto player is connected\n");

  writeFile(dir_ / "players.json", "{not json");
  run = tessel({"devices"});
  EXPECT_EQ(run.status, 1);
  EXPECT_CONTAINS(run.err, "tessel: cannot list the connected players");
  unsetenv("ZETO_VIRTUAL_DEVICES");
}

TEST_F(TesselCommand, SessionCancelWithNothingRunningSaysSo) {
  ASSERT_EQ(tessel({"init"}).status, 0);
  ASSERT_EQ(tessel({"client", "register", "c", "--calendars"}).status, 0);
  const Outcome run = tessel({"session", "cancel", "c"});
  EXPECT_EQ(run.status, 0) << run.err;
  EXPECT_CONTAINS(run.out, "no session");
}

// Failures exit with 1, usage errors with 2, both saying why on standard error; none of
// them makes a store.
TEST_F(TesselCommand, FailuresAndUsageErrorsExitWithTheirStatusAndSayWhy) {
  const struct {
    bool storeExists;
    std::vector<std::string> args;
    int status;
    const char* says;
  } cases[] = {
      {true, {"client", "show", "ghost"}, 1, "ghost"},
      {true, {"session", "cancel", "ghost"}, 1, "ghost"},
      {false, {"records", "list"}, 1, "tessel: "},
      {false, {}, 2, "tessel: "},
      {false, {"records", "list", "--colour"}, 2, "tessel: "},
      {false, {"client", "set", "c", "K"}, 2, "tessel: "},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(::testing::PrintToString(c.args));
    for (const char* end : {"", "-wal", "-shm"}) fs::remove(store_.string() + end);
    if (c.storeExists) {
      ASSERT_EQ(tessel({"init"}).status, 0);
    }
    const Outcome run = tessel(c.args);
    EXPECT_EQ(run.status, c.status);
    EXPECT_CONTAINS(run.err, c.says);
    EXPECT_EQ(fs::exists(store_), c.storeExists);
  }
  for (const std::vector<std::string>& args : std::vector<std::vector<std::string>>{
           {TESSEL_BINARY, "--help"}, {TESSEL_BINARY, "records", "put", "--help"}}) {
    const Outcome run = runRaw(args);
    EXPECT_EQ(run.status, 0) << args[1] << ": " << run.err;
    EXPECT_CONTAINS(run.out, "Usage");
  }
}

}  // namespace
