#pragma once

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>

namespace zt::platform {

enum class TransferDirection { None, FromDevice, ToDevice };

// One piece of the memory a command's data moves through.
using ScatterGatherEntry = std::span<std::uint8_t>;

// What a command that reached the device came back with. A command the device refused
// (CHECK CONDITION) still reached it: its status and sense data say so.
struct ScsiTaskOutcome {
  std::uint8_t taskStatus = 0;  // the SCSI status byte: 0 GOOD, 2 CHECK CONDITION...
  std::array<std::uint8_t, 32> senseData{};
  std::size_t senseLength = 0;
  std::uint64_t bytesTransferred = 0;
};

// One SCSI command to one device: set it up, then execute it. Each setter answers whether
// the task took the setting.
class ScsiTask {
 public:
  virtual ~ScsiTask() = default;

  virtual bool setCommandDescriptorBlock(std::span<const std::uint8_t> cdb) = 0;
  // The memory the data moves through, how many bytes in all, and which way. The entries'
  // memory must outlive the execution.
  virtual bool setScatterGatherEntries(std::span<const ScatterGatherEntry> entries,
                                       std::uint64_t transferCount,
                                       TransferDirection direction) = 0;
  virtual bool setTimeoutDuration(std::chrono::milliseconds timeout) = 0;
  // Runs the command and waits for it; none when it could not be delivered or did not come
  // back (no device, not a SCSI device, time-out, transport failure).
  virtual std::optional<ScsiTaskOutcome> executeTaskSync() = 0;
};

}  // namespace zt::platform
