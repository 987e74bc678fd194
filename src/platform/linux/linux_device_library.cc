#include "platform/linux/linux_device_library.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/sysmacros.h>
#include <systemd/sd-device.h>
#include <systemd/sd-event.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "platform/linux/unique_id.h"
#include "platform/log.h"

namespace zt::platform {
namespace {

// Owns one reference of an sd-device object.
struct DeviceRef {
  sd_device* device = nullptr;
  DeviceRef() = default;
  DeviceRef(const DeviceRef&) = delete;
  DeviceRef& operator=(const DeviceRef&) = delete;
  ~DeviceRef() { sd_device_unref(device); }
};

struct EnumeratorRef {
  sd_device_enumerator* enumerator = nullptr;
  EnumeratorRef() = default;
  EnumeratorRef(const EnumeratorRef&) = delete;
  EnumeratorRef& operator=(const EnumeratorRef&) = delete;
  ~EnumeratorRef() { sd_device_enumerator_unref(enumerator); }
};

std::string text(const char* value) {
  return value ? value : "";
}

}  // namespace

LinuxDeviceLibrary::~LinuxDeviceLibrary() {
  ZetoUnregisterFromServer();
}

std::optional<std::uint64_t> LinuxDeviceLibrary::zetoIdOf(sd_device* device) {
  const char* devtype = nullptr;
  if (sd_device_get_devtype(device, &devtype) < 0 || text(devtype) != "disk") return std::nullopt;
  const char* bus = nullptr;
  if (sd_device_get_property_value(device, "ID_BUS", &bus) < 0 || text(bus) != "usb") {
    return std::nullopt;
  }
  const char* serial = nullptr;
  if (sd_device_get_property_value(device, "ID_SERIAL_SHORT", &serial) < 0 || !serial) {
    return std::nullopt;
  }
  return parseUniqueId(serial);
}

std::optional<std::vector<LinuxDeviceLibrary::Disk>> LinuxDeviceLibrary::connectedDisks() {
  EnumeratorRef e;
  int r = sd_device_enumerator_new(&e.enumerator);
  if (r >= 0) r = sd_device_enumerator_add_match_subsystem(e.enumerator, "block", 1);
  // Several property matches would be alternatives; the disk type is tested below.
  if (r >= 0) r = sd_device_enumerator_add_match_property(e.enumerator, "ID_BUS", "usb");
  if (r < 0) {
    Log::debug("Can't enumerate block devices: %s", std::strerror(-r));
    return std::nullopt;
  }
  std::vector<Disk> disks;
  for (sd_device* device = sd_device_enumerator_get_device_first(e.enumerator); device;
       device = sd_device_enumerator_get_device_next(e.enumerator)) {
    auto id = zetoIdOf(device);
    if (!id) continue;
    // Two disks with one serial would be one player to the sync client; the first wins.
    if (std::any_of(disks.begin(), disks.end(), [&](const Disk& d) { return d.uniqueId == *id; }))
      continue;
    const char* syspath = nullptr;
    if (sd_device_get_syspath(device, &syspath) < 0) continue;
    disks.push_back(Disk{*id, syspath});
  }
  return disks;
}

std::optional<LinuxDeviceLibrary::Disk> LinuxDeviceLibrary::diskWithId(std::uint64_t uniqueId) {
  auto disks = connectedDisks();
  if (!disks) return std::nullopt;
  for (const Disk& disk : *disks) {
    if (disk.uniqueId == uniqueId) return disk;
  }
  return std::nullopt;
}

std::vector<dev_t> LinuxDeviceLibrary::deviceNumbersOf(const std::string& diskSyspath) {
  std::vector<dev_t> numbers;
  DeviceRef disk;
  if (sd_device_new_from_syspath(&disk.device, diskSyspath.c_str()) < 0) return numbers;
  dev_t number;
  if (sd_device_get_devnum(disk.device, &number) >= 0) numbers.push_back(number);
  EnumeratorRef e;
  if (sd_device_enumerator_new(&e.enumerator) < 0 ||
      sd_device_enumerator_add_match_subsystem(e.enumerator, "block", 1) < 0 ||
      sd_device_enumerator_add_match_parent(e.enumerator, disk.device) < 0) {
    return numbers;
  }
  // Partitions need not be known to udev yet when a player has just been attached.
  sd_device_enumerator_allow_uninitialized(e.enumerator);
  for (sd_device* part = sd_device_enumerator_get_device_first(e.enumerator); part;
       part = sd_device_enumerator_get_device_next(e.enumerator)) {
    if (sd_device_get_devnum(part, &number) >= 0 &&
        std::find(numbers.begin(), numbers.end(), number) == numbers.end()) {
      numbers.push_back(number);
    }
  }
  return numbers;
}

std::optional<MountInfoEntry> LinuxDeviceLibrary::mountOf(
    const std::string& diskSyspath, const std::vector<MountInfoEntry>& table) {
  std::vector<dev_t> numbers = deviceNumbersOf(diskSyspath);
  for (const MountInfoEntry& entry : table) {
    if (std::find(numbers.begin(), numbers.end(), makedev(entry.major, entry.minor)) !=
        numbers.end()) {
      return entry;
    }
  }
  return std::nullopt;
}

std::int32_t LinuxDeviceLibrary::ZetoCopyConnected(std::vector<ZetoRef>& devices) {
  auto disks = connectedDisks();
  if (!disks) return kZetoErrorFailed;
  devices.clear();
  for (const Disk& disk : *disks) devices.push_back(makeRef(disk.uniqueId));
  return kZetoSuccess;
}

std::uint64_t LinuxDeviceLibrary::ZetoGetUniqueID(ZetoRef device) {
  return tokenOf(device);
}

std::int32_t LinuxDeviceLibrary::ZetoAquireLock(ZetoRef device) {
  return locks_.acquire(tokenOf(device));
}

std::int32_t LinuxDeviceLibrary::ZetoReleaseLock(ZetoRef device) {
  return locks_.release(tokenOf(device));
}

std::int32_t LinuxDeviceLibrary::ZetoCopyMountpoint(ZetoRef device, std::string& path) {
  auto disk = diskWithId(tokenOf(device));
  if (!disk) return kZetoErrorNoSuchDevice;
  auto table = readMountInfo();
  if (!table) return kZetoErrorFailed;
  auto mount = mountOf(disk->syspath, parseMountInfo(*table));
  if (!mount) return kZetoErrorNotMounted;
  path = mount->mountPoint;
  return kZetoSuccess;
}

std::optional<std::string> LinuxDeviceLibrary::mountedFromDevice(ZetoRef device) {
  auto disk = diskWithId(tokenOf(device));
  auto table = readMountInfo();
  if (!disk || !table) return std::nullopt;
  auto mount = mountOf(disk->syspath, parseMountInfo(*table));
  if (!mount) return std::nullopt;
  return mount->source;
}

std::int32_t LinuxDeviceLibrary::ZetoRegisterWithServer(RunLoop& loop, std::string_view mode,
                                                        ZetoEventCallback callback, void* context) {
  ZetoUnregisterFromServer();
  loop_ = &loop;
  mode_ = std::string(mode);
  callback_ = callback;
  context_ = context;

  // What is there now; events report the differences from it.
  known_.clear();
  auto table = readMountInfo();
  std::vector<MountInfoEntry> mounts =
      table ? parseMountInfo(*table) : std::vector<MountInfoEntry>{};
  if (auto disks = connectedDisks()) {
    for (const Disk& disk : *disks) {
      known_[disk.uniqueId] = KnownDisk{disk.syspath, mountOf(disk.syspath, mounts).has_value()};
    }
  }

  // Without udev's monitor (no netlink in a container) mounts are still followed.
  if (!startDeviceMonitor()) Log::debug("Zeto attach and remove events are not available");

  mountTableFd_ = open("/proc/self/mountinfo", O_RDONLY | O_CLOEXEC);
  if (mountTableFd_ < 0) {
    Log::debug("Can't watch the mount table: %s", std::strerror(errno));
    if (!monitor_) {
      ZetoUnregisterFromServer();
      return kZetoErrorFailed;
    }
  } else {
    // The kernel flags a change of the mount table as POLLPRI (with POLLERR).
    sources_.push_back(loop.addDescriptor(mountTableFd_, POLLPRI, {mode_},
                                          [this](int, short) { onMountTableChange(); }));
  }
  return kZetoSuccess;
}

bool LinuxDeviceLibrary::startDeviceMonitor() {
  int r = sd_event_new(&event_);
  if (r >= 0) r = sd_device_monitor_new(&monitor_);
  if (r >= 0) r = sd_device_monitor_filter_add_match_subsystem_devtype(monitor_, "block", "disk");
  if (r >= 0) r = sd_device_monitor_attach_event(monitor_, event_);
  if (r >= 0) {
    r = sd_device_monitor_start(
        monitor_,
        [](sd_device_monitor*, sd_device* device, void* self) -> int {
          static_cast<LinuxDeviceLibrary*>(self)->onDeviceEvent(device);
          return 0;
        },
        this);
  }
  int fd = r >= 0 ? sd_event_get_fd(event_) : r;
  if (fd < 0) {
    Log::debug("Can't monitor devices: %s", std::strerror(-fd));
    stopDeviceMonitor();
    return false;
  }
  sources_.push_back(loop_->addDescriptor(fd, POLLIN, {mode_}, [this](int, short) {
    // A callback may unregister, dropping the library's references; these keep the monitor
    // alive until its dispatch has returned.
    sd_event* event = sd_event_ref(event_);
    sd_device_monitor* monitor = sd_device_monitor_ref(monitor_);
    sd_event_run(event, 0);
    sd_device_monitor_unref(monitor);
    sd_event_unref(event);
  }));
  return true;
}

void LinuxDeviceLibrary::stopDeviceMonitor() {
  if (monitor_) {
    sd_device_monitor_stop(monitor_);
    sd_device_monitor_detach_event(monitor_);
  }
  monitor_ = sd_device_monitor_unref(monitor_);
  event_ = sd_event_unref(event_);
}

void LinuxDeviceLibrary::onDeviceEvent(sd_device* device) {
  sd_device_action_t action;
  const char* syspath = nullptr;
  if (sd_device_get_action(device, &action) < 0 || sd_device_get_syspath(device, &syspath) < 0) {
    return;
  }
  if (action == SD_DEVICE_REMOVE) {
    // The removed disk's properties may be gone; the player is known by its path.
    for (auto it = known_.begin(); it != known_.end(); ++it) {
      if (it->second.syspath != syspath) continue;
      std::uint64_t id = it->first;
      known_.erase(it);
      deliver(id, ZetoEvent::Removed);
      return;
    }
    return;
  }
  if (action != SD_DEVICE_ADD) return;
  auto id = zetoIdOf(device);
  if (!id || known_.contains(*id)) return;
  known_[*id] = KnownDisk{syspath, false};
  deliver(*id, ZetoEvent::Attached);
  if (callback_) onMountTableChange();  // a volume may have been mounted in the meantime
}

void LinuxDeviceLibrary::onMountTableChange() {
  auto table = readMountInfo();
  if (!table) return;
  std::vector<MountInfoEntry> mounts = parseMountInfo(*table);
  std::vector<std::pair<std::uint64_t, ZetoEvent>> events;
  for (auto& [id, disk] : known_) {
    bool mounted = mountOf(disk.syspath, mounts).has_value();
    if (mounted == disk.mounted) continue;
    disk.mounted = mounted;
    events.emplace_back(id, mounted ? ZetoEvent::Mounted : ZetoEvent::Unmounted);
  }
  // Delivered after the walk: a callback may unregister, which empties the table.
  for (auto [id, event] : events) deliver(id, event);
}

void LinuxDeviceLibrary::deliver(std::uint64_t uniqueId, ZetoEvent event) {
  if (!callback_) return;  // unregistered by an earlier callback
  callback_(makeRef(uniqueId), static_cast<std::int32_t>(event), nullptr, context_);
}

std::int32_t LinuxDeviceLibrary::ZetoUnregisterFromServer() {
  if (loop_) {
    for (RunLoop::SourceId source : sources_) loop_->removeSource(source);
  }
  sources_.clear();
  stopDeviceMonitor();
  if (mountTableFd_ >= 0) close(mountTableFd_);
  mountTableFd_ = -1;
  loop_ = nullptr;
  callback_ = nullptr;
  context_ = nullptr;
  known_.clear();
  return kZetoSuccess;
}

}  // namespace zt::platform
