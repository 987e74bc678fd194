#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

#include "platform/hardware_registry.h"

namespace zt::platform {

// The hardware registry over sysfs. A device file's BSD name is found under class/block; an
// entry's parent is the nearest enclosing sysfs folder that is a device (has a uevent file),
// up to, not including, the devices folder. A Zeto's driver is its SCSI device: an entry
// conforms to the Zeto driver class names when it is a SCSI device bound to the sd driver.
// The mounted-from device file comes from /proc/self/mountinfo.
class LinuxHardwareRegistry final : public HardwareRegistry {
 public:
  // `sysfs` is where sysfs is mounted; tests pass a folder laid out the same way.
  explicit LinuxHardwareRegistry(std::filesystem::path sysfs = "/sys");

  std::optional<std::string> mountedFromDevice(const std::string& volumePath) override;
  std::int32_t open() override;
  std::optional<RegistryIterator> matchingServices(const BsdNameMatching& matching) override;
  std::optional<RegistryEntry> parent(const RegistryEntry& entry) override;
  bool conformsTo(const RegistryEntry& entry, std::string_view className) override;

 private:
  std::filesystem::path sysfs_;
};

}  // namespace zt::platform
