#include "device/contact_pictures.h"

#include <gtest/gtest.h>

#include <string>
#include <tuple>

#include "device/probe_test_support.h"
#include "platform/virtual/virtual_hardware_registry.h"
#include "platform/virtual/virtual_scsi_pass_through.h"

namespace zt::device {
namespace {

using test_support::bytesOf;
using test_support::CapturedLog;
using test_support::checkpointDocument;
using test_support::VirtualPlayerFolder;

// What the player's self-description says, and the last log line that says why.
TEST(CheckpointDocument, OnlyATrueNumberInADictionaryMeansPictures) {
  std::string withoutKey = checkpointDocument("<true/>");
  withoutKey.replace(withoutKey.find("vCardWithJPEGSupported"), 22, "vCardWithGIFSupported");
  const std::tuple<std::string, bool, std::string> cases[] = {
      {checkpointDocument("<true/>"), true, "Value for vCardWithJPEGSupported is 1"},
      {checkpointDocument("<false/>"), false, "Value for vCardWithJPEGSupported is 0"},
      {checkpointDocument("<string>YES</string>"), false,
       "Error: Value for vCardWithJPEGSupported key is not a boolean. This is a string"},
      {withoutKey, false,
       "Checkpoint dict does not have vCardWithJPEGSupported key - likely this Zeto does not "
       "support Contact pictures"},
      {"<?xml version=\"1.0\"?><plist version=\"1.0\"><array><true/></array></plist>", false,
       "Checkpoint data was not a dictionary property list. It is a array"},
      {checkpointDocument("<true/>").substr(0, 200), false, "Can't parse XML checkpoint data: "},
      // The entity the players write, left in place, is not parsed.
      {checkpointDocument("<true/>&xff;"), false, "Can't parse XML checkpoint data: "},
  };
  for (const auto& [document, pictures, last] : cases) {
    CapturedLog log;
    EXPECT_EQ(checkpointSupportsContactPictures(bytesOf(document)), pictures) << last;
    EXPECT_TRUE(log.last().starts_with(last)) << log.last();
  }
}

TEST(ContactPictures, EveryFailureAnswersFalseAndEndsTheLogs) {
  VirtualPlayerFolder player(std::nullopt);
  platform::VirtualHardwareRegistry registry(player.players());
  platform::VirtualScsiPassThrough passThrough(player.players());
  // An empty path, a player without self-description, a folder that is no player's volume.
  for (const std::string& volume :
       {std::string(), player.volume().string(), player.folder().string()}) {
    CapturedLog log;
    EXPECT_FALSE(deviceSupportsContactPictures(volume, registry, passThrough)) << volume;
    EXPECT_EQ(log.lines().front(),
              "Start of process to get info on Zeto. Logs might become a little bit cryptic");
    EXPECT_EQ(log.last(), "End of cryptic logs");
  }
}

}  // namespace
}  // namespace zt::device
