// The contact-picture decision of a sync, made by the sync manager in this process with a
// virtual player, a store of its own and the real probe.
#include <gtest/gtest.h>

#include <optional>
#include <string>

#include "device/contact_pictures.h"
#include "device/probe_test_support.h"
#include "support/in_process_sync.h"
#include "sync/zt_sync_manager.h"
#include "tessel/store.h"

namespace zt::device {
namespace {

using test_support::checkpointDocument;
using test_support::VirtualPlayerFolder;

constexpr std::string_view kClientID = "000A27001A2B3C4D";

class PhotoDecisionTest : public ::testing::Test {
 protected:
  // The decision of a run against a player whose document holds `value`, or that has no
  // document; `setting` is the client's "SyncContactPicturesEnabled", `defaults` the tool's.
  bool decide(std::optional<std::string> document, std::optional<bool> setting,
              std::string_view defaults = "") {
    VirtualPlayerFolder player(std::move(document));
    const auto deviceFile = player.writeDeviceFile();
    zt::test_support::ScopedEnvironment environment;
    environment.set("ZETO_VIRTUAL_DEVICES", deviceFile.string());
    environment.set("XDG_RUNTIME_DIR", player.folder().string());

    const auto storePath = player.folder() / "truth.db";
    {
      auto store = tessel::Store::open(storePath);
      auto client =
          store->registerClient(kClientID, "Zeto", sync::ZTSyncManager::entitiesForContacts());
      if (setting)
        client->setSetting("SyncContactPicturesEnabled", platform::Value::boolean(*setting));
    }
    zt::test_support::InProcessSync inProcess(deviceFile, defaults);
    probes_ = 0;
    sync::SyncServices services =
        inProcess.services(storePath, sync::SyncerMakers{}, [this](const std::string& volumePath) {
          ++probes_;
          return deviceSupportsContactPictures(volumePath);
        });
    sync::ZTSyncManager manager(std::string(kClientID), std::move(services));
    EXPECT_TRUE(manager.initiateSyncSession());
    EXPECT_TRUE(manager.checkForConnectedZeto());
    EXPECT_TRUE(manager.lockZeto());
    EXPECT_TRUE(manager.checkZetoPIMPaths());
    const bool decision = manager.shouldSyncContactImages();
    // Worked out once: the player is not asked again.
    EXPECT_EQ(manager.shouldSyncContactImages(), decision);
    EXPECT_LE(probes_, 1);
    manager.unlockZeto();
    return decision;
  }

  int probes_ = 0;
};

TEST_F(PhotoDecisionTest, PlayerThatTakesPicturesGetsThemUnlessTheClientSaysNo) {
  EXPECT_TRUE(decide(checkpointDocument("<true/>"), std::nullopt));
  EXPECT_TRUE(decide(checkpointDocument("<true/>"), true));
  EXPECT_FALSE(decide(checkpointDocument("<true/>"), false));
  // A player that cannot tell gets none.
  EXPECT_FALSE(decide(checkpointDocument("<false/>"), true));
  EXPECT_FALSE(decide(std::nullopt, true));
}

TEST_F(PhotoDecisionTest, AlwaysSyncContactImagesSkipsTheProbe) {
  EXPECT_TRUE(decide(checkpointDocument("<false/>"), false, "AlwaysSyncContactImages = true"));
  EXPECT_EQ(probes_, 0);
  EXPECT_TRUE(decide(std::nullopt, std::nullopt, "AlwaysSyncContactImages = yes"));
  EXPECT_FALSE(decide(checkpointDocument("<true/>"), false, "AlwaysSyncContactImages = false"));
  EXPECT_EQ(probes_, 1);
}

}  // namespace
}  // namespace zt::device
