#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/device_library.h"
#include "platform/linux/device_locks.h"
#include "platform/run_loop.h"
#include "platform/virtual/virtual_players.h"

namespace zt::platform {

// The device library over simulated players described by a device file (virtual_players.h),
// so that the whole tool runs without hardware. The file is read at the first operation
// that needs it; the locks are the real ones, files beside the device file shared by every
// process that reads it.
class VirtualDeviceLibrary final : public DeviceLibrary {
 public:
  explicit VirtualDeviceLibrary(std::string deviceFile);
  ~VirtualDeviceLibrary() override;

  std::int32_t ZetoCopyConnected(std::vector<ZetoRef>& devices) override;
  std::uint64_t ZetoGetUniqueID(ZetoRef device) override;
  std::int32_t ZetoAquireLock(ZetoRef device) override;
  std::int32_t ZetoReleaseLock(ZetoRef device) override;
  std::int32_t ZetoCopyMountpoint(ZetoRef device, std::string& path) override;
  std::int32_t ZetoRegisterWithServer(RunLoop& loop, std::string_view mode,
                                      ZetoEventCallback callback, void* context) override;
  std::int32_t ZetoUnregisterFromServer() override;
  // "/dev/zetovirtN", N the player's index in the device file.
  std::optional<std::string> mountedFromDevice(ZetoRef device) override;

  // The self-description document the player's probe answers with; none without one.
  std::optional<std::string> checkpoint(ZetoRef device);

 private:
  struct Player {
    VirtualPlayer description;
    bool mounted = false;
  };

  bool load();
  Player* playerOf(ZetoRef device);
  void deliverMount(std::size_t index);

  std::string deviceFile_;
  std::optional<std::vector<Player>> players_;
  DeviceLocks locks_;

  // Registration for events.
  RunLoop* loop_ = nullptr;
  ZetoEventCallback callback_ = nullptr;
  void* context_ = nullptr;
  std::vector<RunLoop::SourceId> sources_;
  int connection_ = -1;
  std::uint64_t registration_ = 0;  // counts registrations, to notice one ending mid-delivery
  std::optional<RunLoop::Clock::time_point> firstRegistration_;  // mount delays count from it
};

}  // namespace zt::platform
