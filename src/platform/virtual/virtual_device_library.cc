#include "platform/virtual/virtual_device_library.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <filesystem>
#include <system_error>
#include <utility>

#include "platform/log.h"

namespace zt::platform {

namespace {

// The virtual players' locks live beside their device file, so that every process that sees
// the same players shares their locks, whatever its environment, while tests with device files
// of their own never contend for the same identifiers. The link-free path makes processes that
// name the file differently agree.
std::string lockFolderOf(const std::string& deviceFile) {
  std::error_code error;
  std::filesystem::path path = std::filesystem::weakly_canonical(deviceFile, error);
  if (error) path = std::filesystem::absolute(deviceFile, error);
  std::filesystem::path folder = path.parent_path();
  return folder.empty() ? std::string(".") : folder.string();
}

}  // namespace

VirtualDeviceLibrary::VirtualDeviceLibrary(std::string deviceFile)
    : deviceFile_(std::move(deviceFile)), locks_(lockFolderOf(deviceFile_)) {}

VirtualDeviceLibrary::~VirtualDeviceLibrary() {
  ZetoUnregisterFromServer();
}

bool VirtualDeviceLibrary::load() {
  if (players_) return true;
  Result<std::vector<VirtualPlayer>> players = loadVirtualPlayers(deviceFile_);
  if (!players) {
    Log::always("Virtual Zeto device file %s unusable: %s", deviceFile_, players.error());
    return false;
  }
  players_.emplace();
  for (auto& description : *players) {
    bool mounted = description.mounted;
    players_->push_back(Player{std::move(description), mounted});
  }
  return true;
}

VirtualDeviceLibrary::Player* VirtualDeviceLibrary::playerOf(ZetoRef device) {
  std::uint64_t index = tokenOf(device);
  if (!players_ || index >= players_->size()) return nullptr;
  return &(*players_)[index];
}

std::int32_t VirtualDeviceLibrary::ZetoCopyConnected(std::vector<ZetoRef>& devices) {
  if (!load()) return kZetoErrorBadDeviceFile;
  devices.clear();
  for (std::size_t i = 0; i < players_->size(); ++i) devices.push_back(makeRef(i));
  return kZetoSuccess;
}

std::uint64_t VirtualDeviceLibrary::ZetoGetUniqueID(ZetoRef device) {
  Player* player = playerOf(device);
  return player ? player->description.uniqueId : 0;
}

std::int32_t VirtualDeviceLibrary::ZetoAquireLock(ZetoRef device) {
  Player* player = playerOf(device);
  if (!player) return kZetoErrorNoSuchDevice;
  return locks_.acquire(player->description.uniqueId);
}

std::int32_t VirtualDeviceLibrary::ZetoReleaseLock(ZetoRef device) {
  Player* player = playerOf(device);
  if (!player) return kZetoErrorNoSuchDevice;
  return locks_.release(player->description.uniqueId);
}

std::int32_t VirtualDeviceLibrary::ZetoCopyMountpoint(ZetoRef device, std::string& path) {
  Player* player = playerOf(device);
  if (!player) return kZetoErrorNoSuchDevice;
  if (!player->mounted) return kZetoErrorNotMounted;
  path = player->description.volume;
  return kZetoSuccess;
}

std::optional<std::string> VirtualDeviceLibrary::mountedFromDevice(ZetoRef device) {
  Player* player = playerOf(device);
  if (!player || !player->mounted) return std::nullopt;
  return virtualDeviceNode(tokenOf(device));
}

std::optional<std::string> VirtualDeviceLibrary::checkpoint(ZetoRef device) {
  Player* player = playerOf(device);
  if (!player) return std::nullopt;
  return player->description.checkpoint;
}

std::int32_t VirtualDeviceLibrary::ZetoRegisterWithServer(RunLoop& loop, std::string_view mode,
                                                          ZetoEventCallback callback,
                                                          void* context) {
  ZetoUnregisterFromServer();
  if (!load()) return kZetoErrorBadDeviceFile;
  loop_ = &loop;
  callback_ = callback;
  context_ = context;
  ++registration_;
  // The connection to the device server of a real library: a source of the mode that stays
  // quiet, so that a wait for a player that never mounts waits its full time.
  connection_ = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
  if (connection_ < 0) {
    Log::debug("Can't register for Zeto events: %s", std::strerror(errno));
    ZetoUnregisterFromServer();
    return kZetoErrorFailed;
  }
  sources_.push_back(
      loop.addDescriptor(connection_, POLLIN, {std::string(mode)}, [](int, short) {}));
  auto now = RunLoop::Clock::now();
  if (!firstRegistration_) firstRegistration_ = now;
  for (std::size_t i = 0; i < players_->size(); ++i) {
    const Player& player = (*players_)[i];
    if (player.mounted || !player.description.mountAfter) continue;
    auto mountAt =
        *firstRegistration_ + std::chrono::duration_cast<RunLoop::Clock::duration>(
                                  std::chrono::duration<double>(*player.description.mountAfter));
    auto delay = std::max(mountAt - now, RunLoop::Clock::duration::zero());
    sources_.push_back(loop.addTimer(delay, RunLoop::Repeat::Once, {std::string(mode)},
                                     [this, i] { deliverMount(i); }));
  }
  return kZetoSuccess;
}

void VirtualDeviceLibrary::deliverMount(std::size_t index) {
  (*players_)[index].mounted = true;
  std::uint64_t registration = registration_;
  ZetoRef device = makeRef(index);
  // A player that mounts late was, to the system, only now attached and then mounted.
  for (ZetoEvent event : {ZetoEvent::Attached, ZetoEvent::Mounted}) {
    // The receiver may unregister from inside its callback; nothing is delivered after that.
    if (registration != registration_ || !callback_) return;
    callback_(device, static_cast<std::int32_t>(event), nullptr, context_);
  }
}

std::int32_t VirtualDeviceLibrary::ZetoUnregisterFromServer() {
  if (loop_) {
    for (RunLoop::SourceId timer : sources_) loop_->removeSource(timer);
  }
  sources_.clear();
  if (connection_ >= 0) close(connection_);
  connection_ = -1;
  loop_ = nullptr;
  callback_ = nullptr;
  context_ = nullptr;
  ++registration_;
  return kZetoSuccess;
}

}  // namespace zt::platform
