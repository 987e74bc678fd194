#pragma once

#include <memory>

#include "platform/scsi_task.h"

namespace zt::platform {

// The SCSI task interface of one device: commands are made here, and exclusive access keeps
// other programs' commands away while a sequence of them runs.
class ScsiTaskDevice {
 public:
  virtual ~ScsiTaskDevice() = default;

  virtual bool obtainExclusiveAccess() = 0;
  // Nothing happens when access is not held.
  virtual void releaseExclusiveAccess() = 0;
  // A new task for this device; null when none can be made. The device must outlive it.
  virtual std::unique_ptr<ScsiTask> createTask() = 0;
};

}  // namespace zt::platform
