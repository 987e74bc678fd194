// What a person who runs zetosynctool by hand reads on the terminal: the usage line, the
// version, and one closing line with the outcome and what was written. The runs go through
// script(1), so standard error is a pseudo-terminal as it would be in a shell.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "support/files.h"
#include "support/process.h"
#include "sync/synctool_fixture.h"

namespace zt::sync::test_support {
namespace {

const fs::path kSamples = fs::path(ZT_TEST_DATA_DIR) / ".." / ".." / "samples";

class OnTerminal : public SynctoolTest {
 protected:
  // zetosynctool with `arguments` under script(1): its exit status and what the terminal showed.
  std::pair<int, std::string> runOnTerminal(const std::string& arguments) {
    zt::test_support::ProcessOptions options;
    options.environment = environment();
    const auto run = zt::test_support::runProcess(
        {"/usr/bin/script", "-qec", std::string(ZETOSYNCTOOL_TEST_BINARY) + " " + arguments,
         "/dev/null"},
        options);
    std::string shown;
    for (char c : run.out) {
      if (c != '\r') shown += c;
    }
    return {run.status, shown};
  }
  void importSamples() {
    ASSERT_EQ(runTessel({"import", "vcard",
                         (kSamples / "contacts" / "friends-and-colleagues.vcf").string()})
                  .status,
              0);
    ASSERT_EQ(runTessel({"import", "ical", (kSamples / "calendars" / "work.ics").string(),
                         (kSamples / "calendars" / "home.ics").string()})
                  .status,
              0);
  }
};

TEST_F(OnTerminal, BadArgumentsShowTheUsageAndTheVersionButKeepTheirStatusAndLog) {
  struct Case {
    std::string arguments;
    std::string shown;
  };
  const std::vector<Case> cases = {
      {"", "usage: zetosynctool --oneshot --sync <sync_client_id>\n"},
      {"--version", "zetosynctool 38\nusage: zetosynctool --oneshot --sync <sync_client_id>\n"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.arguments);
    const auto [status, shown] = runOnTerminal(c.arguments);
    EXPECT_EQ(status, 1);
    EXPECT_EQ(shown, c.shown);
  }
  // Off a terminal nothing changes: the usage line is in the log only.
  const SynctoolRun run = runSynctool({"--version"});
  EXPECT_EQ(run.exitStatus, 1);
  EXPECT_EQ(zt::test_support::readFile(folder() / "stderr.txt"), "");
  EXPECT_EQ(run.log, "zetosynctool --oneshot --sync <sync_client_id>\n");
}

TEST_F(OnTerminal, ARunEndsWithItsOutcomeAndWhatWasWritten) {
  importSamples();
  ASSERT_EQ(
      runTessel({"client", "register", std::string(kClientID), "--contacts", "--calendars"}).status,
      0);
  const std::string sync = "--oneshot --sync " + std::string(kClientID);

  auto [status, shown] = runOnTerminal(sync);
  EXPECT_EQ(status, 0);
  EXPECT_EQ(shown, "zetosynctool: synced: Contacts/Tessel.vcf (26 contacts), 2 calendars\n");

  // Nothing changed: the contacts file stays, the calendars are written again.
  std::tie(status, shown) = runOnTerminal(sync);
  EXPECT_EQ(shown, "zetosynctool: synced: 2 calendars\n");

  // Off a terminal, the same run says nothing.
  syncClient(kClientID);
  EXPECT_EQ(zt::test_support::readFile(folder() / "stderr.txt"), "");

  const std::string store = (folder() / "truth.db").string();
  struct Failure {
    std::string client;
    std::vector<Player> players;
    std::string shown;
  };
  const std::vector<Failure> failures = {
      {"nobody",
       {Player(std::string(kPlayerID))},
       "zetosynctool: success, but nothing was written: no sync client nobody in the store " +
           store + "\n"},
      {std::string(kClientID),
       {},
       "zetosynctool: player unavailable: no connected player matches " + std::string(kClientID) +
           " (tessel devices lists them), or another sync holds it\n"},
  };
  for (const Failure& f : failures) {
    SCOPED_TRACE(f.client);
    setPlayers(f.players);
    std::tie(status, shown) = runOnTerminal("--oneshot --sync " + f.client);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(shown, f.shown);
  }
  setEnvironment("TESSEL_STORE", (folder() / "elsewhere.db").string());
  std::tie(status, shown) = runOnTerminal(sync);
  EXPECT_EQ(shown, "zetosynctool: error: no store at " + (folder() / "elsewhere.db").string() +
                       " (create it with tessel init, or set TESSEL_STORE)\n");
}

}  // namespace
}  // namespace zt::sync::test_support
