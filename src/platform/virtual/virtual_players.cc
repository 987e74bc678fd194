#include "platform/virtual/virtual_players.h"

#include <charconv>
#include <cstdlib>
#include <fstream>
#include <nlohmann/json.hpp>
#include <sstream>

#include "platform/linux/unique_id.h"

namespace zt::platform {
namespace {

constexpr std::string_view kNodePrefix = "/dev/zetovirt";

Result<VirtualPlayer> parsePlayer(const nlohmann::json& entry, std::size_t index) {
  auto fail = [&](const std::string& reason) -> Result<VirtualPlayer> {
    return Error{"entry " + std::to_string(index) + ": " + reason};
  };
  if (!entry.is_object()) return fail("not an object");
  VirtualPlayer player;

  auto id = entry.find("id");
  if (id == entry.end() || !id->is_string()) return fail("\"id\" is missing or not a text");
  auto uniqueId = parseUniqueId(id->get<std::string>());
  if (!uniqueId) return fail("\"id\" is not 1 to 16 hexadecimal digits");
  player.uniqueId = *uniqueId;

  auto volume = entry.find("volume");
  if (volume == entry.end() || !volume->is_string() || volume->get<std::string>().empty()) {
    return fail("\"volume\" is missing or not a path");
  }
  player.volume = volume->get<std::string>();

  if (auto after = entry.find("mount_after"); after != entry.end()) {
    if (!after->is_number() || after->get<double>() < 0) {
      return fail("\"mount_after\" is not a number of seconds");
    }
    player.mountAfter = after->get<double>();
  }
  player.mounted = !player.mountAfter;
  if (auto mounted = entry.find("mounted"); mounted != entry.end()) {
    if (!mounted->is_boolean()) return fail("\"mounted\" is not true or false");
    player.mounted = mounted->get<bool>();
  }
  if (auto checkpoint = entry.find("checkpoint"); checkpoint != entry.end()) {
    if (!checkpoint->is_string()) return fail("\"checkpoint\" is not a path");
    player.checkpoint = checkpoint->get<std::string>();
  }
  return player;
}

}  // namespace

Result<std::vector<VirtualPlayer>> parseVirtualPlayers(std::string_view json) {
  nlohmann::json document = nlohmann::json::parse(json, nullptr, /*allow_exceptions=*/false);
  if (document.is_discarded()) return Error{"not JSON"};
  if (!document.is_array()) return Error{"not an array of players"};
  std::vector<VirtualPlayer> players;
  for (std::size_t i = 0; i < document.size(); ++i) {
    Result<VirtualPlayer> player = parsePlayer(document[i], i);
    if (!player) return Error{player.error()};
    players.push_back(std::move(player).value());
  }
  return players;
}

Result<std::vector<VirtualPlayer>> loadVirtualPlayers(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  if (!file) return Error{"cannot be read"};
  std::ostringstream text;
  text << file.rdbuf();
  return parseVirtualPlayers(text.str());
}

std::optional<std::string> virtualDeviceFileFromEnvironment() {
  const char* path = std::getenv("ZETO_VIRTUAL_DEVICES");
  if (!path || !*path) return std::nullopt;
  return std::string(path);
}

std::string virtualDeviceNode(std::size_t index) {
  return std::string(kNodePrefix) + std::to_string(index);
}

std::optional<std::size_t> virtualPlayerIndexOfNode(std::string_view node) {
  if (!node.starts_with(kNodePrefix)) return std::nullopt;
  std::string_view digits = node.substr(kNodePrefix.size());
  std::size_t index = 0;
  auto [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), index);
  if (digits.empty() || error != std::errc() || end != digits.data() + digits.size()) {
    return std::nullopt;
  }
  return index;
}

}  // namespace zt::platform
