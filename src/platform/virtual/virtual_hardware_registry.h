#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/hardware_registry.h"
#include "platform/virtual/virtual_players.h"

namespace zt::platform {

// The hardware registry of the virtual players. Player N's volume is mounted from
// /dev/zetovirtN, and its entries form the tree
//   root / bus / nubN (com_kestro_driver_ZetoNub) / diskN / zetovirtN (the media)
// which is what a real player's driver stack looks like to the probe.
class VirtualHardwareRegistry final : public HardwareRegistry {
 public:
  // None: the device file could not be read, and the registry cannot be opened.
  explicit VirtualHardwareRegistry(std::optional<std::vector<VirtualPlayer>> players);

  // A player's volume answers its device node; any other path the file system it is on.
  std::optional<std::string> mountedFromDevice(const std::string& volumePath) override;
  std::int32_t open() override;
  std::optional<RegistryIterator> matchingServices(const BsdNameMatching& matching) override;
  std::optional<RegistryEntry> parent(const RegistryEntry& entry) override;
  bool conformsTo(const RegistryEntry& entry, std::string_view className) override;

  // The path of player N's nub, the entry whose SCSI interface answers for the player, and
  // the player of such a path.
  static std::string nubPath(std::size_t index);
  static std::optional<std::size_t> playerOfNubPath(std::string_view path);

 private:
  std::optional<std::vector<VirtualPlayer>> players_;
};

}  // namespace zt::platform
