#pragma once

#include <optional>
#include <string_view>

#include "platform/hardware_registry.h"
#include "platform/registry_entry.h"

namespace zt::device {

// Up to three registry class names, any of which makes an entry the answer.
struct DriverClassNames {
  std::string_view first;
  std::optional<std::string_view> second;
  std::optional<std::string_view> third;
};

// The classes of the Zeto players' drivers, in the order they are tried.
inline constexpr DriverClassNames kZetoDriverClassNames{
    "com_kestro_driver_ZetoNub", "com_kestro_driver_ZetoRBCNub", "com_kestro_driver_ZetoSBCNub"};

// Finds the driver of the disk a device file belongs to: the service of the device file's
// BSD name ("/dev/sdb1" gives "sdb1"; the first five characters are taken to be "/dev/"
// without looking), then the nearest ancestor conforming to one of the classes; the service
// itself is never a candidate. On success `entry` holds the ancestor's reference and the
// answer is true; on failure it is empty and the debug log says why. With no `entry` at all
// nothing can be handed back, so the answer is false.
bool findDriverEntry(platform::HardwareRegistry& registry, std::string_view devicePath,
                     const DriverClassNames& classes,
                     std::optional<platform::RegistryEntry>* entry);

}  // namespace zt::device
