#pragma once

#include <sys/types.h>

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/device_library.h"
#include "platform/linux/device_locks.h"
#include "platform/linux/mount_info.h"
#include "platform/run_loop.h"

struct sd_device;
struct sd_device_monitor;
struct sd_event;

namespace zt::platform {

// The device library over the machine's hardware: a Zeto is a USB disk whose serial number
// is 1 to 16 hexadecimal digits, that serial read as a number being its unique identifier.
// Its volume is the first mount, in /proc/self/mountinfo, of one of its partitions (or of
// the whole disk). Attach and remove events come from udev, mount and unmount events from
// changes of the mount table.
class LinuxDeviceLibrary final : public DeviceLibrary {
 public:
  LinuxDeviceLibrary() = default;
  LinuxDeviceLibrary(const LinuxDeviceLibrary&) = delete;
  LinuxDeviceLibrary& operator=(const LinuxDeviceLibrary&) = delete;
  ~LinuxDeviceLibrary() override;

  std::int32_t ZetoCopyConnected(std::vector<ZetoRef>& devices) override;
  std::uint64_t ZetoGetUniqueID(ZetoRef device) override;
  std::int32_t ZetoAquireLock(ZetoRef device) override;
  std::int32_t ZetoReleaseLock(ZetoRef device) override;
  std::int32_t ZetoCopyMountpoint(ZetoRef device, std::string& path) override;
  std::int32_t ZetoRegisterWithServer(RunLoop& loop, std::string_view mode,
                                      ZetoEventCallback callback, void* context) override;
  std::int32_t ZetoUnregisterFromServer() override;
  // The mount's source in /proc/self/mountinfo ("/dev/sdb1").
  std::optional<std::string> mountedFromDevice(ZetoRef device) override;

  // The player's identifier when `device` (an sd-device of a block disk) is a Zeto.
  static std::optional<std::uint64_t> zetoIdOf(sd_device* device);

 private:
  struct Disk {
    std::uint64_t uniqueId = 0;
    std::string syspath;
  };
  // What the event sources remember of a player between two looks.
  struct KnownDisk {
    std::string syspath;
    bool mounted = false;
  };

  // Every connected Zeto, in udev's order; none when udev cannot be asked.
  static std::optional<std::vector<Disk>> connectedDisks();
  static std::optional<Disk> diskWithId(std::uint64_t uniqueId);
  // The disk's first mount in the mount table.
  static std::optional<MountInfoEntry> mountOf(const std::string& diskSyspath,
                                               const std::vector<MountInfoEntry>& table);
  static std::vector<dev_t> deviceNumbersOf(const std::string& diskSyspath);

  bool startDeviceMonitor();
  void stopDeviceMonitor();
  void onDeviceEvent(sd_device* device);
  void onMountTableChange();
  void deliver(std::uint64_t uniqueId, ZetoEvent event);

  DeviceLocks locks_{DeviceLocks::machineFolder()};

  RunLoop* loop_ = nullptr;
  std::string mode_;
  ZetoEventCallback callback_ = nullptr;
  void* context_ = nullptr;
  std::vector<RunLoop::SourceId> sources_;
  sd_event* event_ = nullptr;
  sd_device_monitor* monitor_ = nullptr;
  int mountTableFd_ = -1;
  std::map<std::uint64_t, KnownDisk> known_;
};

}  // namespace zt::platform
