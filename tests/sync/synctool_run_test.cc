// The command line, the outcome of a run and the notifications that report it, through the
// real zetosynctool on a real store and a virtual player.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "sync/synctool_fixture.h"
#include "tessel/session.h"

namespace zt::sync::test_support {
namespace {

const std::string kUsage = "zetosynctool --oneshot --sync <sync_client_id>";
const std::string kConnecting = "TesselClientConnectingPhase";
const std::string kMingling = "TesselClientMinglingPhase";
const std::string kUploading = "TesselClientUploadingPhase";
const std::string kDisconnecting = "TesselClientDisconnectingPhase";

using CommandLine = SynctoolTest;

TEST_F(CommandLine, WithoutAnIdentifierOnlyTheUsageLineIsLoggedAndTheExitStatusIsOne) {
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
    EXPECT_EQ(run.log, kUsage + "\n");
    EXPECT_TRUE(run.notifications.empty());
  }
  EXPECT_FALSE(client(kClientID)->lastSession().has_value());
  EXPECT_FALSE(fs::exists(volume() / "Contacts"));
}

TEST_F(CommandLine, TheLastSyncValueWinsAndEveryOtherArgumentIsIgnored) {
  registerClient(kClientID, false, false);
  // No "--oneshot" at all, an unknown option, and two "--sync": the second one counts.
  const SynctoolRun run = runSynctool(
      {"--sync", "FIRST", "--verbose", "-x", "--sync", std::string(kClientID), "extra"});
  EXPECT_EQ(run.exitStatus, 0);
  EXPECT_TRUE(run.logged("Starting sync for Zeto with ID " + std::string(kClientID))) << run.log;
  EXPECT_FALSE(run.logContains("FIRST"));
  EXPECT_EQ(run.logLines.back(), "Done sync'ing Zeto");
  ASSERT_FALSE(run.notifications.empty());
  for (const Json& note : run.notifications) EXPECT_EQ(note["object"], kClientID);
  EXPECT_EQ(run.finalStatus(), 0);
  EXPECT_TRUE(client(kClientID)->lastSession().has_value());
}

using RunOutcome = SynctoolTest;

TEST_F(RunOutcome, AClientSyncingNeitherClassGoesThroughEveryPhaseAndFinishesItsSession) {
  registerClient(kClientID, false, false);
  const SynctoolRun run = syncClient(kClientID);
  EXPECT_EQ(run.exitStatus, 0);

  const std::vector<Json> expected = {
      expectedNotification(kClientID, kConnecting, 0),
      expectedNotification(kClientID, kConnecting, 100, std::nullopt, std::vector<std::string>{}),
      expectedNotification(kClientID, kMingling, 0),
      expectedNotification(kClientID, kUploading, 100),
      expectedNotification(kClientID, kDisconnecting, 100, 0),
  };
  ASSERT_EQ(run.notifications.size(), expected.size()) << run.log;
  for (std::size_t i = 0; i < expected.size(); ++i) {
    SCOPED_TRACE(i);
    EXPECT_EQ(run.notifications[i], expected[i]);
    // The percentage is written as a floating-point number, the status as an integer.
    EXPECT_TRUE(
        run.notifications[i]["userInfo"]["TesselClientPercentProgressionPhase"].is_number_float());
  }
  EXPECT_TRUE(run.notifications.back()["userInfo"]["TesselClientStatus"].is_number_integer());

  // Both folders are made although neither class is synced.
  EXPECT_TRUE(fs::is_directory(volume() / "Contacts"));
  EXPECT_TRUE(fs::is_directory(volume() / "Calendars"));
  EXPECT_TRUE(run.logged("Need to create Contacts on Zeto"));
  EXPECT_TRUE(run.logged("Need to create Calendars on Zeto"));

  const auto session = client(kClientID)->lastSession();
  ASSERT_TRUE(session.has_value());
  EXPECT_EQ(session->outcome, tessel::SessionOutcome::Finished);
  EXPECT_TRUE(run.logged("Telling sync session we have finished sync'ing"));
  EXPECT_TRUE(run.logged("Unlocking Zeto"));
}

TEST_F(RunOutcome, WithoutTheMatchingPlayerTheRunReportsStatusThreeAndBeginsNoSession) {
  registerClient(kClientID, true, true);
  setPlayers({Player("BEEF")});
  const SynctoolRun run = syncClient(kClientID);
  EXPECT_EQ(run.exitStatus, 0);
  EXPECT_TRUE(run.logged("Can't find Zeto")) << run.log;
  const std::vector<Json> expected = {
      expectedNotification(kClientID, kConnecting, 0),
      expectedNotification(kClientID, kDisconnecting, 100, 3),
  };
  EXPECT_EQ(run.notifications, expected);
  EXPECT_EQ(run.dataClassesSyncing(), std::nullopt);
  EXPECT_FALSE(client(kClientID)->lastSession().has_value());
  EXPECT_FALSE(run.logged("Cleaning sync session"));
  EXPECT_FALSE(run.logged("Locking Zeto"));
  EXPECT_FALSE(fs::exists(volume() / "Contacts"));
}

TEST_F(RunOutcome, AnUnknownClientEndsTheRunWithStatusZeroBeforeThePlayerIsTouched) {
  registerClient(kClientID, true, true);
  const SynctoolRun run = syncClient("0000000A27001A2B3C4D");
  EXPECT_EQ(run.exitStatus, 0);
  EXPECT_TRUE(run.logged("Can't get a sync client")) << run.log;
  const std::vector<Json> expected = {
      expectedNotification("0000000A27001A2B3C4D", kConnecting, 0),
      expectedNotification("0000000A27001A2B3C4D", kDisconnecting, 100, 0),
  };
  EXPECT_EQ(run.notifications, expected);
  EXPECT_FALSE(run.logged("Checking that Zeto is connected"));
  EXPECT_FALSE(fs::exists(volume() / "Contacts"));
  // The tool never registers a client itself.
  EXPECT_EQ(store().clientIdentifiers(), std::vector<std::string>{std::string(kClientID)});
}

TEST_F(RunOutcome, AnEngineFailureReportsStatusTwoAndCancelsNothingItDidNotBegin) {
  registerClient(kClientID, false, false);
  // This process runs a session of the client, so the tool cannot begin its own.
  auto running = tessel::Session::begin(*client(kClientID), {});
  const SynctoolRun run = syncClient(kClientID);
  EXPECT_EQ(run.exitStatus, 0);
  EXPECT_TRUE(
      run.logContains("Exception while registering entities to sync and getting sync session:\n"
                      "TesselSessionRunningException"))
      << run.log;
  ASSERT_EQ(run.notifications.size(), 3u) << run.log;
  EXPECT_EQ(run.notifications[1]["userInfo"]["TesselClientCurrentPhase"], kConnecting);
  EXPECT_EQ(run.notifications[2], expectedNotification(kClientID, kDisconnecting, 100, 2));
  EXPECT_FALSE(run.logged("Cleaning sync session"));
  EXPECT_TRUE(run.logged("Unlocking Zeto"));
  // The session of this process is untouched.
  EXPECT_FALSE(running->isCancelled());
  EXPECT_EQ(client(kClientID)->lastSession()->outcome, tessel::SessionOutcome::Running);
  running->finishSyncing();
}

TEST_F(RunOutcome, AStoreThatCannotBeOpenedReportsStatusTwo) {
  setEnvironment("TESSEL_STORE", (folder() / "missing" / "truth.db").string());
  const SynctoolRun run = syncClient(kClientID);
  EXPECT_EQ(run.exitStatus, 0);
  EXPECT_TRUE(run.logContains("Exception while getting sync client:\nTesselStoreException"))
      << run.log;
  const std::vector<Json> expected = {
      expectedNotification(kClientID, kConnecting, 0),
      expectedNotification(kClientID, kDisconnecting, 100, 2),
  };
  EXPECT_EQ(run.notifications, expected);
  // The tool never makes a store of its own.
  EXPECT_FALSE(fs::exists(folder() / "missing"));
}

}  // namespace
}  // namespace zt::sync::test_support
