#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "platform/registry_entry.h"
#include "platform/scsi_pass_through.h"

namespace zt::device {

using CheckpointData = std::vector<std::uint8_t>;

// Reads a player's self-description ("checkpoint data") through its driver's SCSI
// interface, under exclusive access: the table of contents (vital product data page 0xC0)
// lists up to 62 page codes, each above 0xC1, whose payloads joined in table order make the
// document. The table is checked whole before any page is read. A page that fails leaves a
// gap, except the last one, whose failure discards everything. None on any failure, and for
// a document of no bytes; the debug log says why.
std::optional<CheckpointData> readCheckpointData(platform::ScsiPassThrough& passThrough,
                                                 const platform::RegistryEntry& driver);

// Overwrites every "&xff;" before the first NUL byte with "00000", keeping the length: the
// players write that entity, which XML parsers reject, into their documents.
void replaceUnparsableEntities(CheckpointData& data);

}  // namespace zt::device
