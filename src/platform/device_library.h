#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/run_loop.h"

namespace zt::platform {

class DeviceLibrary;

// A reference to one Zeto player, handed out by the device library. It names the player,
// not one attachment of it: events about a player carry a reference equal to the one its
// listing gave, so the receiver can tell its own player's events from others'.
class ZetoRef {
 public:
  friend bool operator==(ZetoRef, ZetoRef) = default;

 private:
  friend class DeviceLibrary;
  explicit ZetoRef(std::uint64_t token) : token_(token) {}
  std::uint64_t token_;
};

// Device-event codes passed to the callback.
enum class ZetoEvent : std::int32_t {
  Attached = 1,
  Removed = 2,
  Mounted = 3,
  Unmounted = 4,
};

// Called on the thread whose run loop was registered, while that loop runs in the registered
// mode. The third argument is always null.
using ZetoEventCallback = void (*)(ZetoRef device, std::int32_t event, void* ignored,
                                   void* context);

// The text form of a player's unique identifier: upper-case hexadecimal without leading
// zeros ("%llX"). The sync client's identifier ends with it, and lock files are named by it.
std::string formatUniqueId(std::uint64_t id);

// Results of the library's operations, besides 0 for success.
inline constexpr std::int32_t kZetoSuccess = 0;
inline constexpr std::int32_t kZetoErrorNotMounted = -25178;
inline constexpr std::int32_t kZetoErrorFailed = -25161;         // the system refused; see the log
inline constexpr std::int32_t kZetoErrorNoSuchDevice = -25162;   // not (or no longer) connected
inline constexpr std::int32_t kZetoErrorLockBusy = -25163;       // someone holds the lock
inline constexpr std::int32_t kZetoErrorNotLocked = -25164;      // released without holding it
inline constexpr std::int32_t kZetoErrorBadDeviceFile = -25165;  // virtual players' file unusable

// The device library of the Zeto players: which players are connected, their identities,
// the lock that gives one process the player for a whole sync, where the volume is mounted,
// and events when a player comes, goes, mounts or unmounts.
class DeviceLibrary {
 public:
  virtual ~DeviceLibrary() = default;

  // Fills `devices` with every connected player, in a stable order.
  virtual std::int32_t ZetoCopyConnected(std::vector<ZetoRef>& devices) = 0;
  // The player's 64-bit unique identifier (its text form is "%llX").
  virtual std::uint64_t ZetoGetUniqueID(ZetoRef device) = 0;
  // The exclusive lock on the player, shared by every process that uses the library. Not
  // re-entrant: taking a lock this library already holds gives kZetoErrorLockBusy.
  virtual std::int32_t ZetoAquireLock(ZetoRef device) = 0;
  virtual std::int32_t ZetoReleaseLock(ZetoRef device) = 0;
  // The path of the mounted volume; kZetoErrorNotMounted while it is not mounted.
  virtual std::int32_t ZetoCopyMountpoint(ZetoRef device, std::string& path) = 0;
  // Starts delivering device events to `callback` through sources of `loop` in `mode`;
  // a second registration replaces the first. The registration ends with the library, and
  // `loop` must outlive it.
  virtual std::int32_t ZetoRegisterWithServer(RunLoop& loop, std::string_view mode,
                                              ZetoEventCallback callback, void* context) = 0;
  virtual std::int32_t ZetoUnregisterFromServer() = 0;

  // The device file the player's volume is mounted from ("/dev/sdb1"), for the capability
  // probe; none while the volume is not mounted.
  virtual std::optional<std::string> mountedFromDevice(ZetoRef device) = 0;

 protected:
  // Backends choose what a reference stands for; the token is theirs to interpret.
  static ZetoRef makeRef(std::uint64_t token) { return ZetoRef(token); }
  static std::uint64_t tokenOf(ZetoRef device) { return device.token_; }
};

// The library of this machine: the virtual players of the file $ZETO_VIRTUAL_DEVICES names
// when it is set, otherwise the USB players attached to the machine.
std::unique_ptr<DeviceLibrary> makeDeviceLibrary();

}  // namespace zt::platform
