#pragma once

#include <cstdint>
#include <span>
#include <string>

#include "platform/hardware_registry.h"
#include "platform/scsi_pass_through.h"

namespace zt::device {

// Whether the player whose volume is mounted at `volumePath` takes JPEG photos inside
// vCards, as its self-description says ("vCardWithJPEGSupported"). Asks this machine's
// registry and pass-through (the virtual players' when $ZETO_VIRTUAL_DEVICES is set). Every
// failure answers false; the debug log says why.
bool deviceSupportsContactPictures(const std::string& volumePath);

// The same over given services; an empty path is no volume at all.
bool deviceSupportsContactPictures(const std::string& volumePath,
                                   platform::HardwareRegistry& registry,
                                   platform::ScsiPassThrough& passThrough);

// What a self-description document says about photos: true only for a property list
// dictionary whose "vCardWithJPEGSupported" is a true number or boolean.
bool checkpointSupportsContactPictures(std::span<const std::uint8_t> document);

}  // namespace zt::device
