// What a person who runs zetosynctool by hand reads on the terminal: the usage line, the
// version, and one closing line with the outcome and what was written. The runs go through
// script(1), so standard error is a pseudo-terminal as it would be in a shell.
#include <gtest/gtest.h>

#include <string>
#include <tuple>
#include <utility>
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
    std::string shown = run.out;
    std::erase(shown, '\r');
    return {run.status, shown};
  }
  void importSamples() {
    tessel({"import", "vcard", (kSamples / "contacts" / "friends-and-colleagues.vcf").string()});
    tessel({"import", "ical", (kSamples / "calendars" / "work.ics").string(),
            (kSamples / "calendars" / "home.ics").string()});
  }
};

TEST_F(OnTerminal, BadArgumentsShowTheUsageAndTheVersionButKeepTheirStatusAndLog) {
  const std::pair<std::string, std::string> cases[] = {
      {"", "usage: zetosynctool --oneshot --sync <sync_client_id>\n"},
      {"--version", "zetosynctool 38\nusage: zetosynctool --oneshot --sync <sync_client_id>\n"},
  };
  for (const auto& [arguments, expected] : cases) {
    SCOPED_TRACE(arguments);
    EXPECT_EQ(runOnTerminal(arguments), std::pair(1, expected));
  }
  // Off a terminal nothing changes: the usage line is in the log only.
  const SynctoolRun run = runSynctool({"--version"});
  EXPECT_EQ(run.exitStatus, 1);
  EXPECT_EQ(zt::test_support::readFile(folder() / "stderr.txt"), "");
  EXPECT_EQ(run.log, "zetosynctool --oneshot --sync <sync_client_id>\n");
}

TEST_F(OnTerminal, ARunEndsWithItsOutcomeAndWhatWasWritten) {
  importSamples();
  tessel({"client", "register", std::string(kClientID), "--contacts", "--calendars"});
  const std::string sync = "--oneshot --sync " + std::string(kClientID);

  EXPECT_EQ(runOnTerminal(sync),
            std::pair(0, std::string("zetosynctool: synced: Contacts/Tessel.vcf (26 contacts), "
                                     "2 calendars\n")));

  // Nothing changed: the contacts file stays, the calendars are written again.
  EXPECT_EQ(runOnTerminal(sync).second, "zetosynctool: synced: 2 calendars\n");

  // Off a terminal, the same run says nothing.
  syncClient(kClientID);
  EXPECT_EQ(zt::test_support::readFile(folder() / "stderr.txt"), "");

  const std::string store = (folder() / "truth.db").string();
  const std::tuple<std::string, std::vector<Player>, std::string> failures[] = {
      {"nobody",
       {Player(std::string(kPlayerID))},
       "zetosynctool: success, but nothing was written: no sync client nobody in the store " +
           store + "\n"},
      {std::string(kClientID),
       {},
       "zetosynctool: player unavailable: no connected player matches " + std::string(kClientID) +
           " (tessel devices lists them), or another sync holds it\n"},
  };
  for (const auto& [client, players, expected] : failures) {
    SCOPED_TRACE(client);
    setPlayers(players);
    EXPECT_EQ(runOnTerminal("--oneshot --sync " + client), std::pair(0, expected));
  }
  setEnvironment("TESSEL_STORE", (folder() / "elsewhere.db").string());
  EXPECT_EQ(runOnTerminal(sync).second, "zetosynctool: error: no store at " +
                                            (folder() / "elsewhere.db").string() +
                                            " (create it with tessel init, or set TESSEL_STORE)\n");
}

}  // namespace
}  // namespace zt::sync::test_support
