// Giving up on a player whose volume never mounts, through the real sync manager in this
// process with a shortened wait, so the test takes a fraction of a second instead of the
// program's twenty.
#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "platform/file_system.h"
#include "platform/log.h"
#include "platform/notification_center.h"
#include "platform/run_loop.h"
#include "platform/user_defaults.h"
#include "platform/virtual/virtual_device_library.h"
#include "support/scoped_environment.h"
#include "support/temporary_folder.h"
#include "sync/sync_services.h"
#include "sync/sync_status.h"
#include "sync/zt_sync_manager.h"
#include "tessel/store.h"

namespace zt::sync {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view kClientID = "000A27001A2B3C4D";

class RecordingCenter final : public platform::NotificationCenter {
 public:
  void post(std::string_view name, std::string_view sender,
            const platform::Dictionary& userInfo) override {
    posted.push_back({std::string(name), std::string(sender), userInfo});
  }
  std::vector<platform::Notification> posted;
};

std::vector<std::string> lines(const fs::path& path) {
  std::ifstream in(path);
  std::vector<std::string> result;
  for (std::string line; std::getline(in, line);) result.push_back(line);
  return result;
}

class MountGiveUp : public ::testing::Test {
 protected:
  void SetUp() override {
    fs::create_directories(folder_ / "vol");
    std::ofstream(folder_ / "devices.json")
        << R"([{"id": ")" << kClientID << R"(", "volume": ")" << (folder_ / "vol").string()
        << R"(", "mounted": false}])";
    environment_.set("XDG_RUNTIME_DIR", folder_.path().string());
    environment_.set("ZETOSYNCTOOL_LOG", (folder_ / "log").string());
    platform::Log::configureFromEnvironment();
    platform::Log::setDebugEnabled(true);
    auto store = tessel::Store::open(folder_ / "truth.db");
    store->registerClient(kClientID, "Zeto", ZTSyncManager::entitiesForContacts());
  }

  void TearDown() override {
    platform::Log::setDebugEnabled(false);
    environment_.unset("ZETOSYNCTOOL_LOG");
    platform::Log::configureFromEnvironment();
  }

  test_support::TemporaryFolder folder_;
  test_support::ScopedEnvironment environment_;
};

TEST_F(MountGiveUp, AVolumeThatNeverMountsIsGivenUpAfterTheWait) {
  platform::VirtualDeviceLibrary devices((folder_ / "devices.json").string());
  RecordingCenter center;
  const platform::UserDefaults defaults = platform::UserDefaults::fromText("");
  const platform::FileSystem files;
  SyncServices services{devices,
                        center,
                        defaults,
                        files,
                        platform::RunLoop::current(),
                        folder_ / "truth.db",
                        SyncerMakers{},
                        [](const std::string&) { return false; }};
  EXPECT_EQ(services.mountWaitSeconds, 20.0) << "the program waits twenty seconds";
  services.mountWaitSeconds = 0.3;

  const auto start = std::chrono::steady_clock::now();
  std::int32_t lastStatus = 0;
  {
    ZTSyncManager manager(std::string(kClientID), std::move(services));
    manager.doSync();
    lastStatus = manager.lastStatus();
  }
  const double seconds =
      std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();

  // It waited the whole time, and no longer than that by much.
  EXPECT_GE(seconds, 0.3);
  EXPECT_LT(seconds, 5.0);

  const std::vector<std::string> log = lines(folder_ / "log");
  std::ostringstream text;
  for (const std::string& line : log) text << line << '\n';
  const auto at = [&log](std::string_view line) {
    return std::find(log.begin(), log.end(), line) - log.begin();
  };
  const auto end = static_cast<std::ptrdiff_t>(log.size());
  // The lock is taken before the wait, the wait gives up, and the lock is given back.
  EXPECT_LT(at("Locking Zeto"), at("Needing to mount Zeto")) << text.str();
  EXPECT_LT(at("Needing to mount Zeto"), at("Time outing mounting Zeto")) << text.str();
  EXPECT_LT(at("Time outing mounting Zeto"), at("Unlocking Zeto")) << text.str();
  EXPECT_LT(at("Unlocking Zeto"), end) << text.str();

  EXPECT_EQ(lastStatus, kStatusDeviceUnavailable);
  ASSERT_EQ(center.posted.size(), 2u);
  const platform::Value* status = center.posted.back().userInfo.find("TesselClientStatus");
  ASSERT_TRUE(status && status->asNumber());
  EXPECT_EQ(status->asNumber()->int64Value(), 3);

  // Nothing was written, and the engine has no session for the client.
  EXPECT_TRUE(fs::is_empty(folder_ / "vol"));
  EXPECT_FALSE(tessel::Store::open(folder_ / "truth.db")
                   ->clientWithIdentifier(kClientID)
                   ->lastSession()
                   .has_value());
}

}  // namespace
}  // namespace zt::sync
