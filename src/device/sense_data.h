#pragma once

#include <cstdint>
#include <span>

namespace zt::device {

// Writes the sense key, additional sense code and qualifier of fixed-format sense data to
// the debug log. Kept for diagnosing a player by hand: the probe itself never reads sense
// data. Sense data shorter than 14 bytes are left unlogged.
void logSenseData(std::span<const std::uint8_t> sense);

}  // namespace zt::device
