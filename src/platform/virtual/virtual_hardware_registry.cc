#include "platform/virtual/virtual_hardware_registry.h"

#include <cerrno>
#include <charconv>
#include <filesystem>
#include <system_error>
#include <utility>

#include "platform/file_system.h"

namespace zt::platform {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view kRoot = "root";
constexpr std::string_view kNubPrefix = "root/bus/nub";
constexpr std::string_view kNubClass = "com_kestro_driver_ZetoNub";

// A number that makes up all of `text`.
std::optional<std::size_t> wholeNumber(std::string_view text) {
  std::size_t number = 0;
  auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (text.empty() || error != std::errc() || end != text.data() + text.size()) {
    return std::nullopt;
  }
  return number;
}

std::string diskPath(std::size_t index) {
  return VirtualHardwareRegistry::nubPath(index) + "/disk" + std::to_string(index);
}

std::string mediaPath(std::size_t index) {
  return diskPath(index) + "/zetovirt" + std::to_string(index);
}

bool sameFolder(const fs::path& a, const fs::path& b) {
  std::error_code error;
  if (fs::equivalent(a, b, error)) return true;
  return fs::weakly_canonical(a, error) == fs::weakly_canonical(b, error);
}

}  // namespace

VirtualHardwareRegistry::VirtualHardwareRegistry(std::optional<std::vector<VirtualPlayer>> players)
    : players_(std::move(players)) {}

std::string VirtualHardwareRegistry::nubPath(std::size_t index) {
  return std::string(kNubPrefix) + std::to_string(index);
}

std::optional<std::size_t> VirtualHardwareRegistry::playerOfNubPath(std::string_view path) {
  if (!path.starts_with(kNubPrefix)) return std::nullopt;
  return wholeNumber(path.substr(kNubPrefix.size()));
}

std::optional<std::string> VirtualHardwareRegistry::mountedFromDevice(
    const std::string& volumePath) {
  auto statistics = FileSystem().statistics(volumePath);
  if (!statistics) return std::nullopt;
  if (players_) {
    for (std::size_t i = 0; i < players_->size(); ++i) {
      if (sameFolder((*players_)[i].volume, volumePath)) return virtualDeviceNode(i);
    }
  }
  return statistics->mountedFrom.value_or(std::string());
}

std::int32_t VirtualHardwareRegistry::open() {
  return players_ ? 0 : ENOENT;
}

std::optional<RegistryIterator> VirtualHardwareRegistry::matchingServices(
    const BsdNameMatching& matching) {
  if (!players_) return std::nullopt;
  std::vector<std::string> found;
  auto index = virtualPlayerIndexOfNode("/dev/" + matching.bsdName);
  if (index && *index < players_->size()) found.push_back(mediaPath(*index));
  return makeIterator(std::move(found));
}

std::optional<RegistryEntry> VirtualHardwareRegistry::parent(const RegistryEntry& entry) {
  std::string_view path = entry.path();
  if (path == kRoot) return std::nullopt;
  std::size_t slash = path.rfind('/');
  if (slash == std::string_view::npos) return std::nullopt;
  return makeEntry(std::string(path.substr(0, slash)));
}

bool VirtualHardwareRegistry::conformsTo(const RegistryEntry& entry, std::string_view className) {
  return className == kNubClass && playerOfNubPath(entry.path()).has_value();
}

}  // namespace zt::platform
