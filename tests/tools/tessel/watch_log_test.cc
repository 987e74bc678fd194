// `tessel watch` without a session bus follows the notifications log file: a sync already
// under way is shown from its start, an ended one is not, and the watched client's final
// notification ends the watch with its status.
#include <gtest/gtest.h>

#include <chrono>
#include <fstream>
#include <string>
#include <thread>

#include "support/files.h"
#include "support/process.h"
#include "support/scoped_environment.h"
#include "support/temporary_folder.h"

namespace {

std::string note(const std::string& client, const std::string& phase, double percent,
                 int status = -1) {
  std::string line = R"({"name":"TesselClientSyncNotification","object":")" + client +
                     R"(","userInfo":{"TesselClientCurrentPhase":")" + phase +
                     R"(","TesselClientPercentProgressionPhase":)" + std::to_string(percent);
  if (status >= 0) line += R"(,"TesselClientStatus":)" + std::to_string(status);
  return line + "}}\n";
}

void append(const std::filesystem::path& file, const std::string& text) {
  std::ofstream(file, std::ios::app) << text;
}

TEST(TesselWatchLog, FollowsTheFileFromTheSyncUnderWayToItsEnd) {
  zt::test_support::TemporaryFolder folder;
  const std::filesystem::path log = folder.path() / "notes.jsonl";
  // An earlier sync that ended, then the start of the one under way.
  append(log, note("zeto-1", "TesselClientConnectingPhase", 0) +
                  note("zeto-1", "TesselClientDisconnectingPhase", 100, 0) +
                  note("zeto-1", "TesselClientConnectingPhase", 0) + "not json\n" +
                  note("zeto-2", "TesselClientUploadingPhase", 50));
  zt::test_support::ScopedEnvironment environment;
  environment.unset("DBUS_SESSION_BUS_ADDRESS");
  environment.set("TESSEL_NOTIFICATIONS_LOG", log.string());
  zt::test_support::BackgroundProcess watcher({TESSEL_BINARY, "watch", "zeto-1"});
  ASSERT_TRUE(watcher.started());
  std::this_thread::sleep_for(std::chrono::milliseconds(500));
  append(log, note("zeto-1", "TesselClientUploadingPhase", 40));
  append(log, note("zeto-1", "TesselClientDisconnectingPhase", 100, 2));
  const zt::test_support::ProcessRun run = watcher.wait(20);
  EXPECT_EQ(run.status, 2);
  EXPECT_EQ(run.out,
            "zeto-1 [------------------------------]   0.0% connecting\n"
            "zeto-1 [############------------------]  40.0% writing\n"
            "zeto-1 [##############################] 100.0% done: failed\n");
}

TEST(TesselWatchLog, WithoutBusOrFileItSaysHowToGetOne) {
  zt::test_support::ScopedEnvironment environment;
  environment.unset("DBUS_SESSION_BUS_ADDRESS");
  environment.unset("TESSEL_NOTIFICATIONS_LOG");
  const zt::test_support::ProcessRun run = zt::test_support::runProcess({TESSEL_BINARY, "watch"});
  EXPECT_EQ(run.status, 1);
  EXPECT_CONTAINS(run.err, "dbus-run-session -- bash");
  EXPECT_CONTAINS(run.err, "TESSEL_NOTIFICATIONS_LOG");
}

}  // namespace
