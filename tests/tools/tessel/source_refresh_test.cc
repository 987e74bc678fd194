// `tessel source add` and `tessel refresh` against real servers on 127.0.0.1: Radicale (a
// CalDAV/CardDAV server, filled with HTTP PUT and DELETE as any client fills it) and a plain
// HTTP server of files that the test controls (collection_server.py), each with its own
// temporary storage and a free port. Skipped where radicale or python3 is not installed
// (scripts/setup --tests installs them).

#include <chrono>
#include <thread>

#include "support/radicale_server.h"
#include "support/scoped_environment.h"
#include "tools/tessel/tessel_command_fixture.h"

namespace {

using namespace tessel::testing;
using zt::test_support::cardText;
using zt::test_support::contains;
using zt::test_support::eventText;
using zt::test_support::splitLines;

constexpr const char* kPython = "/usr/bin/python3";

class SourceRefresh : public TesselCommandTest {
 protected:
  void SetUp() override {
    TesselCommandTest::SetUp();
    if (!zt::test_support::RadicaleServer::installed())
      GTEST_SKIP() << "radicale (or python3) is not installed";
    environment_.set("XDG_CONFIG_HOME", (dir_ / "config").string());
    ASSERT_EQ(tessel({"init"}).status, 0);
    writeCredentials("alice:secret");
  }

  void writeCredentials(const std::string& line) {
    writeFile(credentials_, line + "\n");
    fs::permissions(credentials_, fs::perms::owner_read | fs::perms::owner_write);
  }

  std::size_t count(std::string_view entity) {
    const Outcome run = tessel({"records", "list", "--entity", std::string(entity)});
    EXPECT_EQ(run.status, 0) << run.err;
    return splitLines(run.out).size();
  }

  zt::test_support::ScopedEnvironment environment_;
  fs::path credentials_ = dir_ / "credentials";
};

TEST_F(SourceRefresh, RadicaleCollectionsComeInLeaveTheStoreAndSurviveAWrongPassword) {
  writeFile(dir_ / "users", "alice:secret\n");
  const zt::test_support::RadicaleServer radicale(dir_.path(), dir_ / "users");
  ASSERT_TRUE(radicale.listening());
  const std::string base = radicale.home();
  ASSERT_EQ(radicale.makeCalendar("work"), "201");
  ASSERT_EQ(radicale.makeAddressBook("people"), "201");
  for (const char* uid : {"e1", "e2"})
    ASSERT_EQ(radicale.request("PUT", std::string("work/") + uid + ".ics", eventText(uid, uid)),
              "201");
  for (const char* uid : {"c1", "c2"})
    ASSERT_EQ(radicale.request("PUT", std::string("people/") + uid + ".vcf", cardText(uid, uid),
                               "text/vcard"),
              "201");

  // A credentials file that others can read is refused before anything is downloaded.
  fs::permissions(credentials_, fs::perms::group_read | fs::perms::others_read,
                  fs::perm_options::add);
  Outcome run = tessel({"source", "add", base + "work/", "--credentials", credentials_.string()});
  EXPECT_EQ(run.status, 1);
  EXPECT_CONTAINS(run.err, "chmod 600");
  writeCredentials("alice:secret");
  // What each collection holds is read from it.
  for (const char* collection : {"work/", "people/"}) {
    run = tessel({"source", "add", base + collection, "--credentials", credentials_.string()});
    ASSERT_EQ(run.status, 0) << run.err;
  }
  run = tessel({"source", "list"});
  EXPECT_CONTAINS(run.out, "1\tcalendar\t" + base + "work/");
  EXPECT_CONTAINS(run.out, "2\taddress book\t" + base + "people/");

  // A card imported by hand is not the source's, and stays whatever the source loses.
  writeFile(dir_ / "hand.vcf", cardText("h1", "Hand"));
  ASSERT_EQ(tessel({"import", "vcard", (dir_ / "hand.vcf").string()}).status, 0);
  run = tessel({"refresh"});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_CONTAINS(run.out, "\"work\": 2 events, 0 tasks");
  EXPECT_CONTAINS(run.out, "2 contacts, 0 groups");
  EXPECT_EQ(count("tessel.calendars.Event"), 2u);
  EXPECT_EQ(count("tessel.contacts.Contact"), 3u);

  // What left the server leaves the store.
  ASSERT_EQ(radicale.request("DELETE", "work/e2.ics"), "200");
  ASSERT_EQ(radicale.request("DELETE", "people/c2.vcf"), "200");
  run = tessel({"refresh"});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_EQ(count("tessel.calendars.Event"), 1u);
  EXPECT_EQ(count("tessel.contacts.Contact"), 2u);

  // A wrong password fails both sources, says why without the password, and keeps the data.
  writeCredentials("alice:not-the-secret");
  run = tessel({"refresh"});
  EXPECT_EQ(run.status, 1);
  EXPECT_CONTAINS(run.err, "refused the user name or password (HTTP 401)");
  EXPECT_CONTAINS(run.err, "the store keeps what it had from it");
  EXPECT_FALSE(contains(run.err + run.out, "not-the-secret"));
  EXPECT_EQ(count("tessel.calendars.Event"), 1u);
  EXPECT_EQ(count("tessel.contacts.Contact"), 2u);

  // An emptied collection is exported as nothing at all (an address book) or as a calendar of
  // no events, and empties the store of what it brought.
  writeCredentials("alice:secret");
  ASSERT_EQ(radicale.request("DELETE", "work/e1.ics"), "200");
  ASSERT_EQ(radicale.request("DELETE", "people/c1.vcf"), "200");
  run = tessel({"refresh"});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_EQ(count("tessel.calendars.Event"), 0u);
  EXPECT_EQ(count("tessel.contacts.Contact"), 1u);
}

TEST_F(SourceRefresh, PlainServerAnswersUnchangedAndABrokenDownloadKeepsTheStore) {
  const fs::path root = dir_ / "www";
  fs::create_directories(root);
  writeFile(root / "home.ics", eventText("h1", "Dentist"));
  const fs::path portFile = dir_ / "port";
  const fs::path requests = dir_ / "requests";
  zt::test_support::BackgroundProcess server(
      {kPython, (fs::path(ZT_TEST_DATA_DIR) / "collection_server.py").string(), root.string(),
       portFile.string(), requests.string()});
  for (int tries = 0; tries < 200 && !fs::exists(portFile); ++tries)
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
  const std::string address = "http://127.0.0.1:" + readFile(portFile) + "/home.ics";

  ASSERT_EQ(tessel({"source", "add", address, "--calendar"}).status, 0);
  Outcome run = tessel({"refresh"});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_CONTAINS(run.out, "\"home\": 1 event, 0 tasks");

  // The second refresh asks only for a changed collection, and the server has none.
  run = tessel({"refresh"});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_CONTAINS(run.out, address + ": not changed since the last refresh");
  const std::vector<std::string> log = splitLines(readFile(requests));
  ASSERT_EQ(log.size(), 2u);
  EXPECT_CONTAINS(log[0], R"("status": 200, "if-none-match": null)");
  EXPECT_CONTAINS(log[1], R"("status": 304, "if-none-match": "\")");

  // A changed collection that cannot be read keeps what the store had.
  const std::tuple<std::string, std::string, std::string> broken[] = {
      {"cut", eventText("h2", "Gone"), "the download stopped before its end"},
      {"login", eventText("h2", "Gone"), "the server sent a web page, not a calendar"},
      {"", "BEGIN:VCALENDAR\r\nBEGIN:VEVENT\r\n", "home.ics: line 2: "},
  };
  for (const auto& [mode, text, message] : broken) {
    SCOPED_TRACE(message);
    writeFile(root / "home.ics", text);
    writeFile(root / "home.ics.mode", mode);
    run = tessel({"refresh"});
    EXPECT_EQ(run.status, 1);
    EXPECT_CONTAINS(run.err, message);
    const std::string events =
        tessel({"records", "list", "--entity", "tessel.calendars.Event"}).out;
    EXPECT_CONTAINS(events, "Dentist");
    EXPECT_EQ(splitLines(events).size(), 1u);
  }

  // A lenient source is read as `tessel import` reads: a fault costs what it is in.
  std::string lunch = eventText("l1", "Lunch");
  lunch.insert(lunch.find("SUMMARY"), "RRULE:FREQ=NEVER\r\n");
  writeFile(dir_ / "lunch.ics", lunch);
  ASSERT_EQ(tessel({"source", "add", (dir_ / "lunch.ics").string(), "--lenient"}).status, 0);
  run = tessel({"refresh"});
  EXPECT_CONTAINS(run.err, "tessel: source 2: warning: ");
  EXPECT_CONTAINS(run.err, "dropped the RRULE of the event \"Lunch\"");
  EXPECT_CONTAINS(tessel({"records", "list", "--entity", "tessel.calendars.Event"}).out, "Lunch");
}

}  // namespace
