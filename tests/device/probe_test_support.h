#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <filesystem>
#include <optional>
#include <sstream>
#include <string>
#include <string_view>
#include <vector>

#include "platform/virtual/virtual_players.h"
#include "support/captured_log.h"
#include "support/scoped_environment.h"
#include "support/temporary_folder.h"

namespace zt::device::test_support {

namespace fs = std::filesystem;

using zt::test_support::CapturedLog;
using zt::test_support::writeFile;

// A player's self-description: an XML property list whose "vCardWithJPEGSupported" holds
// `value` (a whole element such as "<true/>"), padded with a filler string to at least
// `size` bytes.
inline std::string checkpointDocument(std::string_view value, std::size_t size = 0) {
  const std::string head =
      "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
      "<!DOCTYPE plist PUBLIC \"-//Apple//DTD PLIST 1.0//EN\" "
      "\"http://www.apple.com/DTDs/PropertyList-1.0.dtd\">\n"
      "<plist version=\"1.0\">\n<dict>\n<key>Model</key><string>Zeto 4</string>\n"
      "<key>vCardWithJPEGSupported</key>" +
      std::string(value) + "\n<key>Filler</key><string>";
  const std::string tail = "</string>\n</dict>\n</plist>\n";
  std::string filler;
  if (size > head.size() + tail.size()) filler.assign(size - head.size() - tail.size(), 'x');
  return head + filler + tail;
}

inline std::vector<std::uint8_t> bytesOf(std::string_view text) {
  return std::vector<std::uint8_t>(text.begin(), text.end());
}

inline std::string textOf(const std::vector<std::uint8_t>& bytes) {
  return std::string(bytes.begin(), bytes.end());
}

// One virtual player in a folder of the test: its volume, and its self-description when
// the test gives one.
class VirtualPlayerFolder {
 public:
  explicit VirtualPlayerFolder(std::optional<std::string> document) {
    fs::create_directories(volume());
    player_.uniqueId = 0xA27001A2B3C4DULL;
    player_.volume = volume().string();
    if (document) {
      writeFile(folder_ / "checkpoint.xml", *document);
      player_.checkpoint = (folder_ / "checkpoint.xml").string();
    }
  }

  fs::path volume() const { return folder_ / "vol"; }
  const fs::path& folder() const { return folder_.path(); }
  std::vector<platform::VirtualPlayer> players() const { return {player_}; }

  // The virtual device file naming this player, for code that finds the players through
  // $ZETO_VIRTUAL_DEVICES.
  fs::path writeDeviceFile() const {
    std::ostringstream json;
    json << "[{\"id\": \"000A27001A2B3C4D\", \"volume\": \"" << player_.volume << "\"";
    if (player_.checkpoint) json << ", \"checkpoint\": \"" << *player_.checkpoint << "\"";
    json << "}]";
    writeFile(folder_ / "devices.json", json.str());
    return folder_ / "devices.json";
  }

 private:
  zt::test_support::TemporaryFolder folder_;
  platform::VirtualPlayer player_;
};

}  // namespace zt::device::test_support
