#include "device/contact_pictures.h"

#include <gtest/gtest.h>

#include <string>

#include "device/probe_test_support.h"
#include "platform/linux/linux_hardware_registry.h"
#include "platform/linux/linux_scsi_pass_through.h"
#include "platform/virtual/virtual_hardware_registry.h"
#include "platform/virtual/virtual_scsi_pass_through.h"

namespace zt::device {
namespace {

using test_support::bytesOf;
using test_support::CapturedLog;
using test_support::checkpointDocument;
using test_support::VirtualPlayerFolder;

bool documentSays(const std::string& document) {
  return checkpointSupportsContactPictures(bytesOf(document));
}

TEST(CheckpointDocument, OnlyATrueNumberMeansPictures) {
  CapturedLog log;
  EXPECT_TRUE(documentSays(checkpointDocument("<true/>")));
  EXPECT_EQ(log.last(), "Value for vCardWithJPEGSupported is 1");
  EXPECT_FALSE(documentSays(checkpointDocument("<false/>")));
  EXPECT_EQ(log.last(), "Value for vCardWithJPEGSupported is 0");

  EXPECT_FALSE(documentSays(checkpointDocument("<string>YES</string>")));
  EXPECT_EQ(log.last(),
            "Error: Value for vCardWithJPEGSupported key is not a boolean. This is a string");

  std::string withoutKey = checkpointDocument("<true/>");
  withoutKey.replace(withoutKey.find("vCardWithJPEGSupported"), 22, "vCardWithGIFSupported");
  EXPECT_FALSE(documentSays(withoutKey));
  EXPECT_EQ(log.last(),
            "Checkpoint dict does not have vCardWithJPEGSupported key - likely this Zeto does "
            "not support Contact pictures");
}

TEST(CheckpointDocument, AnythingButADictionaryIsRefused) {
  CapturedLog log;
  EXPECT_FALSE(
      documentSays("<?xml version=\"1.0\"?><plist version=\"1.0\"><array><true/></array></plist>"));
  EXPECT_EQ(log.last(), "Checkpoint data was not a dictionary property list. It is a array");

  EXPECT_FALSE(documentSays(checkpointDocument("<true/>").substr(0, 200)));
  EXPECT_TRUE(log.last().starts_with("Can't parse XML checkpoint data: "));
  // The entity the players write, left in place, is not parsed.
  EXPECT_FALSE(documentSays(checkpointDocument("<true/>&xff;")));
}

TEST(ContactPictures, VirtualPlayerAnswersFromItsDocument) {
  for (const char* value : {"<true/>", "<false/>"}) {
    SCOPED_TRACE(value);
    VirtualPlayerFolder player(checkpointDocument(value, 1000));
    platform::VirtualHardwareRegistry registry(player.players());
    platform::VirtualScsiPassThrough passThrough(player.players());
    CapturedLog log;
    EXPECT_EQ(deviceSupportsContactPictures(player.volume().string(), registry, passThrough),
              std::string(value) == "<true/>");
    auto lines = log.lines();
    ASSERT_GE(lines.size(), 2u);
    EXPECT_EQ(lines.front(),
              "Start of process to get info on Zeto. Logs might become a little bit cryptic");
    EXPECT_EQ(lines.back(), "End of cryptic logs");
    EXPECT_TRUE(log.has("Trying to get Checkpoint data from Hwtree object"));
    EXPECT_EQ(registry.liveReferences(), 0u);
    EXPECT_EQ(passThrough.trace().openPlugIns, 0);
  }
}

TEST(ContactPictures, EveryFailureAnswersFalseAndEndsTheLogs) {
  VirtualPlayerFolder player(std::nullopt);
  platform::VirtualHardwareRegistry registry(player.players());
  platform::VirtualScsiPassThrough passThrough(player.players());
  {
    CapturedLog log;
    EXPECT_FALSE(deviceSupportsContactPictures("", registry, passThrough));
    EXPECT_EQ(log.lines(), (std::vector<std::string>{
                               "Start of process to get info on Zeto. Logs might become a little "
                               "bit cryptic",
                               "Invalid volume", "End of cryptic logs"}));
  }
  {
    CapturedLog log;
    EXPECT_FALSE(deviceSupportsContactPictures((player.folder() / "missing").string(), registry,
                                               passThrough));
    EXPECT_TRUE(log.has("Errror getting volume stats"));
    EXPECT_EQ(log.last(), "End of cryptic logs");
  }
  {
    // No self-description.
    CapturedLog log;
    EXPECT_FALSE(deviceSupportsContactPictures(player.volume().string(), registry, passThrough));
    EXPECT_TRUE(
        log.has("Error getting Checkpoint data - Can't determine Zeto features - "
                "Considering Zeto does not support Contact pictures"));
    EXPECT_EQ(log.last(), "End of cryptic logs");
  }
  {
    // A folder that is no player's volume is on some real file system, not a Zeto.
    CapturedLog log;
    EXPECT_FALSE(deviceSupportsContactPictures(player.folder().string(), registry, passThrough));
    EXPECT_EQ(log.last(), "End of cryptic logs");
  }
}

TEST(ContactPictures, LinuxBackendOnThisMachineAnswersFalseForANonPlayer) {
  platform::LinuxHardwareRegistry registry;
  platform::LinuxScsiPassThrough passThrough;
  zt::test_support::TemporaryFolder folder;
  CapturedLog log;
  EXPECT_FALSE(deviceSupportsContactPictures(folder.path().string(), registry, passThrough));
  EXPECT_EQ(log.last(), "End of cryptic logs");
  EXPECT_EQ(registry.liveReferences(), 0u);
}

TEST(ContactPictures, EnvironmentChoosesTheVirtualPlayers) {
  VirtualPlayerFolder player(checkpointDocument("<true/>"));
  zt::test_support::ScopedEnvironment environment;
  environment.set("ZETO_VIRTUAL_DEVICES", player.writeDeviceFile().string());
  EXPECT_TRUE(deviceSupportsContactPictures(player.volume().string()));
  environment.set("ZETO_VIRTUAL_DEVICES", (player.folder() / "missing.json").string());
  EXPECT_FALSE(deviceSupportsContactPictures(player.volume().string()));
}

}  // namespace
}  // namespace zt::device
