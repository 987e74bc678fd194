// From a CalDAV/CardDAV server to the player: Radicale on 127.0.0.1 holds a calendar and an
// address book, `tessel source add` names them, and `tessel sync` refreshes the store and syncs
// a virtual player with the real zetosynctool. Skipped where radicale is not installed.
#include <gtest/gtest.h>

#include <string>

#include "support/files.h"
#include "support/radicale_server.h"
#include "sync/synctool_fixture.h"

namespace zt::sync::test_support {
namespace {

using zt::test_support::RadicaleServer;
using zt::test_support::readFile;
using zt::test_support::writeFile;

const std::string kClient = "zeto-A27001A2B3C4D";

class ServerToPlayer : public SynctoolTest {};

TEST_F(ServerToPlayer, TheRefreshedStoreIsWhatThePlayerGetsEvenWhenTheServerTurnsItAway) {
  if (!RadicaleServer::installed()) GTEST_SKIP() << "radicale (or python3) is not installed";
  writeFile(folder() / "users", "alice:secret\n");
  const RadicaleServer radicale(folder(), folder() / "users");
  ASSERT_TRUE(radicale.listening());
  ASSERT_EQ(radicale.makeCalendar("work"), "201");
  ASSERT_EQ(radicale.makeAddressBook("people"), "201");
  ASSERT_EQ(
      radicale.request("PUT", "work/b1.ics", zt::test_support::eventText("b1", "Board meeting")),
      "201");
  ASSERT_EQ(radicale.request("PUT", "people/a1.vcf",
                             zt::test_support::cardText("a1", "Ada Lovelace"), "text/vcard"),
            "201");

  const fs::path credentials = folder() / "credentials";
  const auto writeCredentials = [&](const std::string& line) {
    writeFile(credentials, line + "\n");
    fs::permissions(credentials, fs::perms::owner_read | fs::perms::owner_write);
  };
  writeCredentials("alice:secret");
  for (const char* collection : {"work/", "people/"})
    tessel({"source", "add", radicale.home() + collection, "--credentials", credentials.string()});
  tessel({"client", "register", kClient, "--contacts", "--calendars"});
  // The zetosynctool of the build tree, and progress through a notifications file of its own.
  setEnvironment("PATH", fs::path(ZETOSYNCTOOL_BINARY).parent_path().string());
  setEnvironment("TESSEL_NOTIFICATIONS_LOG", "");

  const auto playerHolds = [&] {
    EXPECT_CONTAINS(readFile(volume() / "Calendars" / "Tessel-work.ics"),
                    "SUMMARY:Board meeting\r\n");
    EXPECT_CONTAINS(
        zt::test_support::utf8OfUtf16BigEndian(readFile(volume() / "Contacts" / "Tessel.vcf")),
        "N:Ada Lovelace;");
  };
  zt::test_support::ProcessRun run = runTessel({"sync", kClient});
  EXPECT_EQ(run.status, 0) << run.out;
  EXPECT_CONTAINS(run.out, kClient + ": synced: 1 contact, 1 calendar");
  playerHolds();

  // A refused password: the store keeps what the server gave, the player gets it again, and
  // the status says that a source could not be refreshed.
  writeCredentials("alice:wrong");
  run = runTessel({"sync", kClient});
  EXPECT_EQ(run.status, 4) << run.out;
  EXPECT_CONTAINS(run.out, "refused the user name or password");
  playerHolds();
}

}  // namespace
}  // namespace zt::sync::test_support
