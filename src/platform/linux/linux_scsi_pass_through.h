#pragma once

#include <filesystem>
#include <memory>
#include <optional>

#include "platform/scsi_pass_through.h"
#include "platform/scsi_task_device.h"

namespace zt::platform {

// The device nodes of one SCSI device: its disk ("/dev/sdb"), through which commands go
// while nobody holds exclusive access, and its scsi-generic node ("/dev/sg2"), whose
// exclusive open is the exclusive access and carries the commands while held.
struct ScsiNodes {
  std::optional<std::filesystem::path> disk;
  std::optional<std::filesystem::path> generic;
};

// SCSI pass-through with the SG_IO ioctl. The plug-in of a registry entry of
// LinuxHardwareRegistry (a SCSI device's sysfs folder) finds the device's nodes from its
// block and scsi_generic subfolders.
class LinuxScsiPassThrough final : public ScsiPassThrough {
 public:
  // `devices` is the folder of the device nodes; tests pass their own.
  explicit LinuxScsiPassThrough(std::filesystem::path devices = "/dev");

  std::unique_ptr<ScsiPlugIn> createPlugIn(const RegistryEntry& entry) override;

  // The task interface over these nodes, as a plug-in gives it; null when a disk node is
  // given and cannot be opened, or when no node is given.
  static std::unique_ptr<ScsiTaskDevice> openTaskDevice(const ScsiNodes& nodes);

 private:
  std::filesystem::path devices_;
};

}  // namespace zt::platform
