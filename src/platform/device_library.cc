#include "platform/device_library.h"

#include "platform/linux/linux_device_library.h"
#include "platform/virtual/virtual_device_library.h"
#include "platform/virtual/virtual_players.h"

namespace zt::platform {

std::unique_ptr<DeviceLibrary> makeDeviceLibrary() {
  if (auto deviceFile = virtualDeviceFileFromEnvironment()) {
    return std::make_unique<VirtualDeviceLibrary>(std::move(*deviceFile));
  }
  return std::make_unique<LinuxDeviceLibrary>();
}

}  // namespace zt::platform
