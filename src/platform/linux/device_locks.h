#pragma once

#include <cstdint>
#include <map>
#include <string>

namespace zt::platform {

// The exclusive per-player lock of the device library: flock(2) on "<folder>/zeto-<ID>.lock",
// ID the player's identifier as "%llX". Every process that must not write to one player at
// the same time has to reach the same file whoever runs it and whatever its environment, so
// the folder is never derived from per-user variables: the linux backend locks in the
// machine's lock folder, the virtual backend beside its device file. The kernel drops the lock
// when its holder dies, so a crashed sync never leaves a player locked.
class DeviceLocks {
 public:
  explicit DeviceLocks(std::string folder);
  DeviceLocks(const DeviceLocks&) = delete;
  DeviceLocks& operator=(const DeviceLocks&) = delete;
  ~DeviceLocks();  // releases every lock still held

  // kZetoSuccess, kZetoErrorLockBusy (held elsewhere, or already by this table) or
  // kZetoErrorFailed (no lock file can be opened or made, or the name is not a regular file).
  std::int32_t acquire(std::uint64_t uniqueId);
  // kZetoSuccess, or kZetoErrorNotLocked when this table does not hold it.
  std::int32_t release(std::uint64_t uniqueId);
  bool holds(std::uint64_t uniqueId) const { return held_.contains(uniqueId); }

  std::string lockPathFor(std::uint64_t uniqueId) const;

  // The machine-wide folder for real players' locks: /run/lock, or /var/lock then /tmp on a
  // system without it.
  static std::string machineFolder();

 private:
  std::string folder_;
  std::map<std::uint64_t, int> held_;  // identifier -> open descriptor holding the flock
};

}  // namespace zt::platform
