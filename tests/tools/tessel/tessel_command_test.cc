// Runs the real `tessel` binary in a fresh folder per test, as scripts and users do.

#include <algorithm>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include "support/scoped_environment.h"
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

TEST_F(TesselCommand, PutThenListJsonGivesTheSameLinesInIdentifierOrderAndReplacesById) {
  ASSERT_EQ(tessel({"init"}).status, 0);
  // Given out of identifier order; listed in it.
  put(kContact + "\n" + kEvent + "\n" + kCalendar + "\n");
  const std::string listed = listJson();
  // The event's summary is written back with the character itself, not the \u escape.
  std::string event = kEvent;
  event.replace(event.find("\\u00e9"), 6, "\xC3\xA9");
  EXPECT_EQ(listed, kCalendar + "\n" + event + "\n" + kContact + "\n");
  put(listed);
  EXPECT_EQ(listJson(), listed);
  // The readable listing: identifier, entity and summary, of one entity if asked.
  EXPECT_CONTAINS(tessel({"records", "list"}).out, "p-1\ttessel.contacts.Contact\tAda Lovelace\n");
  const std::string events = tessel({"records", "list", "--entity", "tessel.calendars.Event"}).out;
  EXPECT_EQ(events.rfind("ev-1\ttessel.calendars.Event\tCaf\xC3\xA9 \"Meeting\"", 0), 0u) << events;
  EXPECT_EQ(std::count(events.begin(), events.end(), '\n'), 1);

  const std::string renamed =
      R"({"id":"cal-1","record":{"tessel.record.entity":"tessel.calendars.Calendar","title":"Home"}})";
  ASSERT_EQ(tessel({"records", "put", "-"}, renamed).status, 0);
  EXPECT_CONTAINS(listJson(), renamed + "\n");
}

TEST_F(TesselCommand, AMalformedLineAnywhereChangesNothing) {
  ASSERT_EQ(tessel({"init"}).status, 0);
  put(kCalendar + "\n" + kContact + "\n");
  const std::string before = listJson();
  const std::string changedCalendar =
      R"({"id":"cal-1","record":{"tessel.record.entity":"tessel.calendars.Calendar","title":"Changed"}})";
  for (const auto& [bad, reason] : std::vector<std::pair<std::string, std::string>>{
           {R"({"id":"b","record":{"tessel.record.entity":"e")", "invalid JSON"},
           {R"({"id":"b","record":{"first name":"no entity"}})", "entity"}}) {
    writeFile(dir_ / "bad.jsonl", changedCalendar + "\n" + bad + "\n" + kEvent + "\n");
    const Outcome run = tessel({"records", "put", (dir_ / "bad.jsonl").string()});
    EXPECT_EQ(run.status, 1) << bad;
    EXPECT_CONTAINS(run.err, "bad.jsonl: line 2: ");
    EXPECT_CONTAINS(run.err, reason);
    EXPECT_EQ(listJson(), before) << bad;
  }
}

TEST_F(TesselCommand, DeleteAndCalendarOrderAreAllOrNothing) {
  ASSERT_EQ(tessel({"init"}).status, 0);
  put(kCalendar + "\n" + kEvent + "\n" + kContact + "\n" +
      R"({"id":"cal-2","record":{"tessel.record.entity":"tessel.calendars.Calendar","title":"Home"}})" +
      "\n");
  Outcome run = tessel({"records", "delete", "ev-1", "no-such-record"});
  EXPECT_EQ(run.status, 1);
  EXPECT_CONTAINS(run.err, "no-such-record");
  EXPECT_CONTAINS(listJson(), "\"ev-1\"");
  ASSERT_EQ(tessel({"records", "delete", "ev-1", "p-1"}).status, 0);
  // The calendar no longer names the deleted event.
  EXPECT_CONTAINS(listJson(), R"("title":"Work"}})");

  ASSERT_EQ(tessel({"calendars", "order", "cal-2", "cal-1"}).status, 0);
  ASSERT_EQ(tessel({"calendars", "order", "cal-1", "cal-2"}).status, 0);
  run = tessel({"calendars", "order", "cal-1", "cal-404"});
  EXPECT_EQ(run.status, 2);
  EXPECT_CONTAINS(run.err, "cal-404");
  run = tessel({"records", "list", "--json", "--entity", "tessel.calendars.CalendarOrder"});
  EXPECT_EQ(std::count(run.out.begin(), run.out.end(), '\n'), 1) << run.out;
  EXPECT_CONTAINS(run.out, R"("calendars":["cal-1","cal-2"])");
}

TEST_F(TesselCommand, ClientSettingsAreSetShownAndUnset) {
  ASSERT_EQ(tessel({"init"}).status, 0);
  const std::string client = "zeto-000A27001A2B3C4D";
  ASSERT_EQ(tessel({"client", "register", client, "--contacts", "--name", "Kitchen player"}).status,
            0);
  const std::vector<std::pair<std::string, std::string>> settings = {
      {"SyncContactPicturesEnabled", "true"},
      {"LastSyncToolVersion", "38"},
      {"LastModDateForVCF", "2026-11-21T11:00:00+01:00"}};
  for (const auto& [key, value] : settings)
    ASSERT_EQ(tessel({"client", "set", client, key, value}).status, 0) << key;
  Outcome run = tessel({"client", "show", client});
  EXPECT_CONTAINS(run.out, "name: Kitchen player\n");
  EXPECT_CONTAINS(run.out, "  tessel.contacts.Contact\n");
  EXPECT_EQ(run.out.find("tessel.calendars."), std::string::npos) << run.out;
  for (const auto& [key, value] : settings)
    EXPECT_CONTAINS(run.out, "  " + key + " = " + value + "\n");
  EXPECT_CONTAINS(run.out, "filters: none\n");

  ASSERT_EQ(tessel({"client", "unset", client, "LastSyncToolVersion"}).status, 0);
  EXPECT_EQ(tessel({"client", "show", client}).out.find("LastSyncToolVersion"), std::string::npos);
  EXPECT_EQ(tessel({"client", "unset", client, "LastSyncToolVersion"}).status, 1);
  EXPECT_EQ(tessel({"client", "set", client, "Key", "yes"}).status, 2);
  run = tessel({"session", "cancel", client});
  EXPECT_EQ(run.status, 0) << run.err;
  EXPECT_CONTAINS(run.out, "no session");
}

TEST_F(TesselCommand, DevicesListsThePlayersWithTheirSuggestedClients) {
  zt::test_support::ScopedEnvironment environment;
  environment.set("ZETO_VIRTUAL_DEVICES", (dir_ / "players.json").string());
  writeFile(dir_ / "players.json",
            R"([{"id": "000A27001A2B3C4D", "volume": ")" + (dir_ / "vol").string() +
                R"(", "mounted": true}, {"id": "1a2b", "volume": "/nowhere", "mounted": false}])");
  // Without a store no client is registered; each line says how to register its client.
  Outcome run = tessel({"devices"});
  EXPECT_EQ(run.out, "A27001A2B3C4D\t" + (dir_ / "vol").string() +
                         "\tclient: zeto-A27001A2B3C4D\tnot registered: tessel client register "
                         "zeto-A27001A2B3C4D --contacts --calendars\n"
                         "1A2B\tnot mounted\tclient: zeto-1A2B\tnot registered: tessel client "
                         "register zeto-1A2B --contacts --calendars\n");
  ASSERT_EQ(tessel({"init"}).status, 0);
  ASSERT_EQ(tessel({"client", "register", "zeto-1A2B", "--contacts"}).status, 0);
  run = tessel({"devices"});
  EXPECT_CONTAINS(run.out, "\tclient: zeto-A27001A2B3C4D\tnot registered: ");
  EXPECT_CONTAINS(run.out, "\tclient: zeto-1A2B\tregistered\n");
  writeFile(dir_ / "players.json", "[]");
  EXPECT_EQ(tessel({"devices"}).out, "no Zeto player is connected\n");
  writeFile(dir_ / "players.json", "{not json");
  run = tessel({"devices"});
  EXPECT_EQ(run.status, 1);
  EXPECT_CONTAINS(run.err, "tessel: cannot list the connected players");
}

// Failures exit with 1, usage errors with 2, both saying why on standard error; none of
// them makes a store.
TEST_F(TesselCommand, FailuresAndUsageErrorsExitWithTheirStatusAndSayWhy) {
  const std::tuple<bool, std::vector<std::string>, int, std::string> cases[] = {
      {true, {"client", "show", "ghost"}, 1, "ghost"},
      {true, {"session", "cancel", "ghost"}, 1, "ghost"},
      {false, {"records", "list"}, 1, "tessel: "},
      {false, {}, 2, "tessel: "},
      {false, {"records", "list", "--colour"}, 2, "tessel: "},
      {false, {"client", "set", "c", "K"}, 2, "tessel: "},
  };
  for (const auto& [storeExists, args, status, says] : cases) {
    SCOPED_TRACE(::testing::PrintToString(args));
    for (const char* end : {"", "-wal", "-shm"}) fs::remove(store_.string() + end);
    if (storeExists) {
      ASSERT_EQ(tessel({"init"}).status, 0);
    }
    const Outcome run = tessel(args);
    EXPECT_EQ(run.status, status);
    EXPECT_CONTAINS(run.err, says);
    EXPECT_EQ(fs::exists(store_), storeExists);
  }
  for (const std::vector<std::string>& args : std::vector<std::vector<std::string>>{
           {TESSEL_BINARY, "--help"}, {TESSEL_BINARY, "records", "put", "--help"}}) {
    const Outcome run = runRaw(args);
    EXPECT_EQ(run.status, 0) << args[1] << ": " << run.err;
    EXPECT_CONTAINS(run.out, "Usage");
  }
}

}  // namespace
