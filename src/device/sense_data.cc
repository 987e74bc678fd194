#include "device/sense_data.h"

#include "platform/log.h"

namespace zt::device {

void logSenseData(std::span<const std::uint8_t> sense) {
  if (sense.size() < 14) return;
  platform::Log::debug("Key: $%02lx, ASC: $%02lx, ASCQ: $%02lx  ",
                       static_cast<unsigned>(sense[2] & 0x0F), static_cast<unsigned>(sense[12]),
                       static_cast<unsigned>(sense[13]));
}

}  // namespace zt::device
