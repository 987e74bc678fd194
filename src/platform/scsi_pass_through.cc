#include "platform/scsi_pass_through.h"

#include <string>

#include "platform/linux/linux_scsi_pass_through.h"
#include "platform/virtual/virtual_players.h"
#include "platform/virtual/virtual_scsi_pass_through.h"

namespace zt::platform {

std::unique_ptr<ScsiPassThrough> makeScsiPassThrough() {
  if (auto deviceFile = virtualDeviceFileFromEnvironment()) {
    return std::make_unique<VirtualScsiPassThrough>(loadVirtualPlayers(*deviceFile).valueOrNone());
  }
  return std::make_unique<LinuxScsiPassThrough>();
}

}  // namespace zt::platform
