#include "platform/device_library.h"

#include <cinttypes>
#include <cstdio>

#include "platform/linux/linux_device_library.h"
#include "platform/virtual/virtual_device_library.h"
#include "platform/virtual/virtual_players.h"

namespace zt::platform {

std::string formatUniqueId(std::uint64_t id) {
  char text[17];
  std::snprintf(text, sizeof text, "%" PRIX64, id);
  return text;
}

std::unique_ptr<DeviceLibrary> makeDeviceLibrary() {
  if (auto deviceFile = virtualDeviceFileFromEnvironment()) {
    return std::make_unique<VirtualDeviceLibrary>(std::move(*deviceFile));
  }
  return std::make_unique<LinuxDeviceLibrary>();
}

}  // namespace zt::platform
