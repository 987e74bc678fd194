// The command line, the outcome of a run and the notifications that report it, through the
// real zetosynctool on a real store and a virtual player.
#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <tuple>
#include <vector>

#include "sync/synctool_fixture.h"
#include "tessel/session.h"

namespace zt::sync::test_support {
namespace {

const std::string kConnecting = "TesselClientConnectingPhase";
const std::string kDisconnecting = "TesselClientDisconnectingPhase";

using CommandLine = SynctoolTest;

TEST_F(CommandLine, OnlyTheLastSyncValueCountsAndWithoutOneOnlyTheUsageLineIsLogged) {
  registerClient(kClientID, false, false);
  setDebugLog(false);
  const std::vector<std::vector<std::string>> badArguments = {
      {},
      {"--oneshot", std::string(kClientID)},  // an identifier without "--sync" is just an argument
      {"--SYNC", std::string(kClientID)},     // the option is case-sensitive
  };
  for (const auto& arguments : badArguments) {
    SCOPED_TRACE(::testing::PrintToString(arguments));
    const SynctoolRun run = runSynctool(arguments);
    EXPECT_EQ(run.exitStatus, 1);
    // Written although debug logging is off; nothing else is.
    EXPECT_EQ(run.log, "zetosynctool --oneshot --sync <sync_client_id>\n");
    EXPECT_TRUE(run.notifications.empty());
  }
  EXPECT_FALSE(client(kClientID)->lastSession().has_value());

  // No "--oneshot" at all, an unknown option, and two "--sync": the second one counts. A client
  // syncing neither class goes through every phase and finishes its session.
  setDebugLog(true);
  const SynctoolRun run = runSynctool(
      {"--sync", "FIRST", "--verbose", "-x", "--sync", std::string(kClientID), "extra"});
  EXPECT_EQ(run.exitStatus, 0);
  EXPECT_FALSE(run.logContains("FIRST"));
  const std::vector<Json> expected = {
      expectedNotification(kClientID, kConnecting, 0),
      expectedNotification(kClientID, kConnecting, 100, std::nullopt, std::vector<std::string>{}),
      expectedNotification(kClientID, "TesselClientMinglingPhase", 0),
      expectedNotification(kClientID, "TesselClientUploadingPhase", 100),
      expectedNotification(kClientID, kDisconnecting, 100, 0),
  };
  ASSERT_EQ(run.notifications, expected) << run.log;
  // The percentage is written as a floating-point number, the status as an integer.
  for (const Json& note : run.notifications)
    EXPECT_TRUE(note["userInfo"]["TesselClientPercentProgressionPhase"].is_number_float());
  EXPECT_TRUE(run.notifications.back()["userInfo"]["TesselClientStatus"].is_number_integer());
  // Both folders are made although neither class is synced.
  EXPECT_TRUE(fs::is_directory(volume() / "Contacts"));
  EXPECT_TRUE(fs::is_directory(volume() / "Calendars"));
  EXPECT_EQ(client(kClientID)->lastSession()->outcome, tessel::SessionOutcome::Finished);
  EXPECT_TRUE(run.logged("Unlocking Zeto"));
}

using RunOutcome = SynctoolTest;

// Runs that end before any session: the status they report, the line that says why, and
// nothing touched on the player or in the store.
TEST_F(RunOutcome, RunsThatCannotBeginReportTheirStatusAndTouchNothing) {
  registerClient(kClientID, true, true);
  const std::tuple<std::string, std::function<void()>, std::string, std::int64_t, std::string>
      cases[] = {
          {"no matching player", [&] { setPlayers({Player("BEEF")}); }, std::string(kClientID), 3,
           "Can't find Zeto"},
          {"unknown client", [&] { setPlayers({Player(std::string(kPlayerID))}); },
           "0000000A27001A2B3C4D", 0, "Can't get a sync client"},
          {"store that cannot be opened",
           [&] { setEnvironment("TESSEL_STORE", (folder() / "missing" / "truth.db").string()); },
           std::string(kClientID), 2, "Exception while getting sync client:\nTesselStoreException"},
      };
  for (const auto& [name, arrange, clientID, status, line] : cases) {
    SCOPED_TRACE(name);
    arrange();
    const SynctoolRun run = syncClient(clientID);
    EXPECT_EQ(run.exitStatus, 0);
    EXPECT_TRUE(run.logContains(line)) << run.log;
    EXPECT_EQ(run.notifications,
              (std::vector<Json>{expectedNotification(clientID, kConnecting, 0),
                                 expectedNotification(clientID, kDisconnecting, 100, status)}));
    EXPECT_FALSE(run.logged("Locking Zeto"));
    EXPECT_FALSE(fs::exists(volume() / "Contacts"));
  }
  EXPECT_FALSE(client(kClientID)->lastSession().has_value());
  // The tool never registers a client nor makes a store of its own.
  EXPECT_EQ(store().clientIdentifiers(), std::vector<std::string>{std::string(kClientID)});
  EXPECT_FALSE(fs::exists(folder() / "missing"));
}

TEST_F(RunOutcome, AnEngineFailureReportsStatusTwoAndCancelsNothingItDidNotBegin) {
  registerClient(kClientID, false, false);
  // This process runs a session of the client, so the tool cannot begin its own.
  auto running = tessel::Session::begin(*client(kClientID), {});
  const SynctoolRun run = syncClient(kClientID);
  EXPECT_TRUE(
      run.logContains("Exception while registering entities to sync and getting sync session:\n"
                      "TesselSessionRunningException"))
      << run.log;
  ASSERT_EQ(run.notifications.size(), 3u) << run.log;
  EXPECT_EQ(run.notifications[2], expectedNotification(kClientID, kDisconnecting, 100, 2));
  EXPECT_FALSE(run.logged("Cleaning sync session"));
  EXPECT_TRUE(run.logged("Unlocking Zeto"));
  // The session of this process is untouched.
  EXPECT_FALSE(running->isCancelled());
  EXPECT_EQ(client(kClientID)->lastSession()->outcome, tessel::SessionOutcome::Running);
  running->finishSyncing();
}

}  // namespace
}  // namespace zt::sync::test_support
