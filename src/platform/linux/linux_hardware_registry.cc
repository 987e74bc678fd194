#include "platform/linux/linux_hardware_registry.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <fstream>
#include <system_error>
#include <utility>
#include <vector>

#include "platform/file_system.h"

namespace zt::platform {
namespace {

namespace fs = std::filesystem;

// The driver class names the probe looks for; every Zeto model is driven by sd on Linux.
constexpr std::array<std::string_view, 3> kZetoDriverClasses = {
    "com_kestro_driver_ZetoNub", "com_kestro_driver_ZetoRBCNub", "com_kestro_driver_ZetoSBCNub"};

std::string linkTarget(const fs::path& link) {
  std::error_code error;
  fs::path target = fs::read_symlink(link, error);
  return error ? std::string() : target.filename().string();
}

bool hasLine(const fs::path& file, std::string_view wanted) {
  std::ifstream in(file);
  for (std::string line; std::getline(in, line);) {
    if (line == wanted) return true;
  }
  return false;
}

bool isUnder(const fs::path& path, const fs::path& folder) {
  auto [end, unused] = std::mismatch(folder.begin(), folder.end(), path.begin(), path.end());
  return end == folder.end();
}

}  // namespace

LinuxHardwareRegistry::LinuxHardwareRegistry(fs::path sysfs) {
  std::error_code error;
  sysfs_ = fs::weakly_canonical(sysfs, error);
  if (error) sysfs_ = std::move(sysfs);
}

std::optional<std::string> LinuxHardwareRegistry::mountedFromDevice(const std::string& volumePath) {
  auto statistics = FileSystem().statistics(volumePath);
  if (!statistics) return std::nullopt;
  return statistics->mountedFrom.value_or(std::string());
}

std::int32_t LinuxHardwareRegistry::open() {
  if (::access((sysfs_ / "class" / "block").c_str(), R_OK | X_OK) != 0) return errno;
  return 0;
}

std::optional<RegistryIterator> LinuxHardwareRegistry::matchingServices(
    const BsdNameMatching& matching) {
  std::error_code error;
  const fs::path blocks = sysfs_ / "class" / "block";
  if (!fs::is_directory(blocks, error)) return std::nullopt;
  std::vector<std::string> found;
  // A BSD name is one path component; "mapper/root" names no entry of class/block.
  if (matching.bsdName.find('/') == std::string::npos && matching.bsdName != "." &&
      matching.bsdName != "..") {
    fs::path entry = fs::canonical(blocks / matching.bsdName, error);
    if (!error) found.push_back(entry.string());
  }
  return makeIterator(std::move(found));
}

std::optional<RegistryEntry> LinuxHardwareRegistry::parent(const RegistryEntry& entry) {
  const fs::path devices = sysfs_ / "devices";
  fs::path folder = fs::path(entry.path()).parent_path();
  std::error_code error;
  // Folders such as "block" or "host6/target6:0:0" group devices without being devices.
  while (isUnder(folder, devices) && folder != devices) {
    if (fs::exists(folder / "uevent", error)) return makeEntry(folder.string());
    folder = folder.parent_path();
  }
  return std::nullopt;
}

bool LinuxHardwareRegistry::conformsTo(const RegistryEntry& entry, std::string_view className) {
  if (std::find(kZetoDriverClasses.begin(), kZetoDriverClasses.end(), className) ==
      kZetoDriverClasses.end()) {
    return false;
  }
  const fs::path folder = entry.path();
  return linkTarget(folder / "subsystem") == "scsi" && linkTarget(folder / "driver") == "sd" &&
         hasLine(folder / "uevent", "DEVTYPE=scsi_device");
}

}  // namespace zt::platform
