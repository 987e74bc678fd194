#pragma once

#include <memory>

#include "platform/scsi_task_device.h"

namespace zt::platform {

// The storage stack's plug-in for one registry entry, through which its SCSI task interface
// is reached. Destroying it ends what it opened.
class ScsiPlugIn {
 public:
  virtual ~ScsiPlugIn() = default;

  // The entry's SCSI task interface; null when the entry has none or it cannot be opened.
  // The plug-in must outlive it.
  virtual std::unique_ptr<ScsiTaskDevice> scsiTaskDevice() = 0;
};

}  // namespace zt::platform
