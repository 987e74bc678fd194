// Giving up on a player whose volume never mounts, through the real sync manager in this
// process with a shortened wait, so the test takes a fraction of a second instead of the
// program's twenty.
#include <gtest/gtest.h>

#include <chrono>
#include <fstream>

#include "support/captured_log.h"
#include "support/in_process_sync.h"
#include "sync/sync_status.h"
#include "sync/zt_sync_manager.h"
#include "tessel/store.h"

namespace zt::sync {
namespace {

namespace fs = std::filesystem;
constexpr std::string_view kClientID = "000A27001A2B3C4D";

TEST(MountGiveUp, AVolumeThatNeverMountsIsGivenUpAfterTheWaitWithTheLockGivenBack) {
  test_support::CapturedLog log;
  test_support::TemporaryFolder folder;
  test_support::ScopedEnvironment environment;
  environment.set("XDG_RUNTIME_DIR", folder.path().string());
  fs::create_directories(folder / "vol");
  std::ofstream(folder / "devices.json") << R"([{"id": ")" << kClientID << R"(", "volume": ")"
                                         << (folder / "vol").string() << R"(", "mounted": false}])";
  tessel::Store::open(folder / "truth.db")
      ->registerClient(kClientID, "Zeto", ZTSyncManager::entitiesForContacts());
  test_support::InProcessSync inProcess(folder / "devices.json", "");
  SyncServices services = inProcess.services(folder / "truth.db", SyncerMakers{},
                                             [](const std::string&) { return false; });
  EXPECT_EQ(services.mountWaitSeconds, 20.0) << "the program waits twenty seconds";
  services.mountWaitSeconds = 0.3;

  const auto start = std::chrono::steady_clock::now();
  std::int32_t lastStatus = 0;
  {
    ZTSyncManager manager(std::string(kClientID), std::move(services));
    manager.doSync();
    lastStatus = manager.lastStatus();
  }
  const std::chrono::duration<double> waited = std::chrono::steady_clock::now() - start;
  EXPECT_GE(waited.count(), 0.3);
  EXPECT_LT(waited.count(), 5.0);

  // The lock is taken before the wait, the wait gives up, and the lock is given back.
  const std::vector<std::string> lines = log.lines();
  std::vector<std::string> steps;
  for (const std::string& line : lines) {
    if (line == "Locking Zeto" || line == "Needing to mount Zeto" ||
        line == "Time outing mounting Zeto" || line == "Unlocking Zeto")
      steps.push_back(line);
  }
  EXPECT_EQ(steps, (std::vector<std::string>{"Locking Zeto", "Needing to mount Zeto",
                                             "Time outing mounting Zeto", "Unlocking Zeto"}))
      << log.text();
  EXPECT_EQ(lastStatus, kStatusDeviceUnavailable);
  ASSERT_EQ(inProcess.posted().size(), 2u);
  EXPECT_EQ(*inProcess.posted().back().userInfo.find("TesselClientStatus"),
            platform::Value::integer(3));
  // Nothing was written, and the engine has no session for the client.
  EXPECT_TRUE(fs::is_empty(folder / "vol"));
  EXPECT_FALSE(tessel::Store::open(folder / "truth.db")
                   ->clientWithIdentifier(kClientID)
                   ->lastSession()
                   .has_value());
}

}  // namespace
}  // namespace zt::sync
