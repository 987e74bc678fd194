#pragma once

#include <cstdint>
#include <map>
#include <string>

namespace zt::platform {

// The exclusive per-player lock of the device library: flock(2) on a file named after the
// player's identifier, so that every process using the library, of either backend, sees the
// same lock. The kernel drops the lock when its holder dies, so a crashed sync never leaves a
// player locked.
class DeviceLocks {
 public:
  DeviceLocks() = default;
  DeviceLocks(const DeviceLocks&) = delete;
  DeviceLocks& operator=(const DeviceLocks&) = delete;
  ~DeviceLocks();  // releases every lock still held

  // kZetoSuccess, kZetoErrorLockBusy (held elsewhere, or already by this table) or
  // kZetoErrorFailed (no lock file can be made).
  std::int32_t acquire(std::uint64_t uniqueId);
  // kZetoSuccess, or kZetoErrorNotLocked when this table does not hold it.
  std::int32_t release(std::uint64_t uniqueId);
  bool holds(std::uint64_t uniqueId) const { return held_.contains(uniqueId); }

  // "$XDG_RUNTIME_DIR/zeto/<ID>.lock" (the folder is made, mode 0700), or
  // "/run/lock/zeto-<ID>.lock" without a usable runtime folder; ID is "%llX".
  static std::string lockPathFor(std::uint64_t uniqueId);

 private:
  std::map<std::uint64_t, int> held_;  // identifier -> open descriptor holding the flock
};

}  // namespace zt::platform
