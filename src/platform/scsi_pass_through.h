#pragma once

#include <memory>

#include "platform/registry_entry.h"
#include "platform/scsi_plug_in.h"

namespace zt::platform {

// SCSI pass-through: commands of the program's own making sent to a device found in the
// hardware registry.
class ScsiPassThrough {
 public:
  virtual ~ScsiPassThrough() = default;

  // The plug-in of a registry entry (a SCSI device); null when the entry is none.
  virtual std::unique_ptr<ScsiPlugIn> createPlugIn(const RegistryEntry& entry) = 0;
};

// The pass-through of this machine, over the same backend as makeHardwareRegistry(): the
// virtual players when $ZETO_VIRTUAL_DEVICES names a device file, SG_IO otherwise.
std::unique_ptr<ScsiPassThrough> makeScsiPassThrough();

}  // namespace zt::platform
