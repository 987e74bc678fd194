// The manager's dealings with the player: finding it, its lock, waiting for its volume, and
// the folders on it.
#include <chrono>
#include <cstdio>
#include <utility>
#include <variant>

#include "platform/log.h"
#include "sync/sync_status.h"
#include "sync/zt_sync_manager.h"
#include "tessel/schema.h"

namespace zt::sync {

using platform::Log;

namespace {

constexpr std::string_view kZetoMode = "ZetoMode";

}  // namespace

bool ZTSyncManager::zetoIDMatchesSyncClientID(const std::string& zetoID) const {
  return _syncClientID.size() >= zetoID.size() &&
         _syncClientID.compare(_syncClientID.size() - zetoID.size(), zetoID.size(), zetoID) == 0;
}

bool ZTSyncManager::checkForConnectedZeto() {
  if (_zetoRef) return true;
  Log::debug("Checking that Zeto is connected");
  std::vector<platform::ZetoRef> devices;
  if (services_.devices.ZetoCopyConnected(devices) != platform::kZetoSuccess) {
    Log::debug("Can't get list of connected Zetos");
    return false;
  }
  for (platform::ZetoRef device : devices) {
    if (zetoIDMatchesSyncClientID(
            platform::formatUniqueId(services_.devices.ZetoGetUniqueID(device)))) {
      Log::debug("Zeto is connected");
      _zetoRef = device;
      return true;
    }
  }
  Log::debug("Can't find Zeto");
  return false;
}

bool ZTSyncManager::lockZeto() {
  if (_locked) return true;
  Log::debug("Locking Zeto");
  if (services_.devices.ZetoAquireLock(*_zetoRef) == platform::kZetoSuccess) {
    _locked = true;
    return true;
  }
  Log::debug("Can't get a lock on Zeto");
  return false;
}

bool ZTSyncManager::unlockZeto() {
  if (!_locked) return true;
  Log::debug("Unlocking Zeto");
  if (services_.devices.ZetoReleaseLock(*_zetoRef) == platform::kZetoSuccess) {
    _locked = false;
    return true;
  }
  Log::debug("Can't unlock Zeto");
  return false;
}

void ZTSyncManager::setZetoIsMounted(bool mounted) {
  if (_forceMounted != mounted) _forceMounted = mounted;
}

bool ZTSyncManager::mountZeto() {
  platform::DeviceLibrary& devices = services_.devices;
  devices.ZetoRegisterWithServer(services_.runLoop, kZetoMode, zetoEventCallback, this);
  std::string path;
  std::int32_t result = devices.ZetoCopyMountpoint(*_zetoRef, path);
  if (result == kStatusVolumeNotMounted) {
    Log::debug("Needing to mount Zeto");
    // The system mounts the player by itself; the tool only waits this long for it.
    const double waitSeconds = services_.mountWaitSeconds;
    auto start = std::chrono::steady_clock::now();
    while (!zetoIsMounted()) {
      double elapsed =
          std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
      if (elapsed > waitSeconds) {
        Log::debug("Time outing mounting Zeto");
        break;
      }
      services_.runLoop.runInMode(kZetoMode, waitSeconds - elapsed,
                                  platform::RunLoop::ReturnAfter::SourceHandled);
    }
    if (!zetoIsMounted()) {
      devices.ZetoUnregisterFromServer();
      return false;
    }
    result = devices.ZetoCopyMountpoint(*_zetoRef, path);
  }
  bool mounted = false;
  if (result == platform::kZetoSuccess) {
    if (path.empty()) {
      Log::debug("Can't get path from URL: %@", path);
    } else {
      setPathToZetoVolume(path);
      mounted = true;
    }
  } else {
    Log::debug("Can't get Zeto mount point");
  }
  devices.ZetoUnregisterFromServer();
  return mounted;
}

std::optional<std::string> ZTSyncManager::checkForZetoFolder(const std::string& name,
                                                             bool createIfNeeded) {
  ZetoFolder folder = openZetoFolder(name, createIfNeeded);
  if (!folder.opened && !folder.missing) return std::nullopt;
  return (std::filesystem::path(_pathToZetoVolume) / name).string();
}

ZTSyncManager::ZetoFolder ZTSyncManager::openZetoFolder(const std::string& name,
                                                        bool createIfNeeded) {
  Log::debug("Checking %@ folder on Zeto", name);
  platform::Result<platform::FolderHandle> root = services_.files.openFolder(_pathToZetoVolume);
  if (!root) {
    Log::debug("Can't create folder. Reason: %@", root.error());
    return {};
  }
  const platform::FolderHandle& volume = *root;
  // A link is not the player's folder even when it leads to one: following it would let the
  // sync empty and fill a folder anywhere on the computer.
  platform::Result<platform::FileAttributes> existing = volume.attributes(name);
  if (existing && existing->type != platform::FileType::Directory) {
    Log::debug("Folder %@ on Zeto is a regular file, we can't use it to sync", name);
    return {};
  }
  if (!existing) {
    if (!createIfNeeded) return {.opened = std::nullopt, .missing = true};
    Log::debug("Need to create %@ on Zeto", name);
  }
  // Opened without following links, so a link put in the folder's place after the check
  // fails here instead of leading elsewhere.
  platform::Result<platform::FolderHandle> folder =
      volume.openChild(name, existing ? platform::IfMissing::Fail : platform::IfMissing::Create);
  if (!folder) {
    Log::debug("Can't create folder. Reason: %@", folder.error());
    return {};
  }
  return {.opened = std::move(folder).value()};
}

bool ZTSyncManager::checkZetoPIMPaths() {
  Log::debug("Checking for PIM paths");
  if (!mountZeto()) return false;
  setZetoContactsFolder(openZetoFolder("Contacts", true).opened);
  if (_shouldSyncContacts && !_zetoContactsFolder) setShouldSyncContacts(false);
  setZetoCalendarsFolder(openZetoFolder("Calendars", true).opened);
  if (_shouldSyncCalendars && !_zetoCalendarsFolder) setShouldSyncCalendars(false);
  return true;
}

void ZTSyncManager::setZetoContactsFolder(std::optional<platform::FolderHandle> folder) {
  _pathToZetoContactsFolder =
      folder ? std::optional<std::string>(folder->path().string()) : std::nullopt;
  _zetoContactsFolder = std::move(folder);
}

void ZTSyncManager::setZetoCalendarsFolder(std::optional<platform::FolderHandle> folder) {
  _pathToZetoCalendarsFolder =
      folder ? std::optional<std::string>(folder->path().string()) : std::nullopt;
  _zetoCalendarsFolder = std::move(folder);
}

bool ZTSyncManager::shouldSyncContactImages() {
  if (!_shouldSyncContactImagesCached) {
    _cacheShouldSyncContactImages();
    setShouldSyncContactImagesCached(true);
  }
  return _shouldSyncContactImages;
}

void ZTSyncManager::_cacheShouldSyncContactImages() {
  if (services_.defaults.boolForKey("AlwaysSyncContactImages").value_or(false)) {
    Log::debug("Force pushing contact pictures per AlwaysSyncContactImages default");
    setShouldSyncContactImages(true);
    return;
  }
  bool supported = services_.deviceSupportsContactPictures &&
                   services_.deviceSupportsContactPictures(_pathToZetoVolume);
  setShouldSyncContactImages(supported);
  Log::debug("Sync Contact Images supported: %@", supported ? "YES" : "NO");
  if (!supported) return;
  std::optional<platform::Value> enabled =
      _syncClient ? _syncClient->setting("SyncContactPicturesEnabled") : std::nullopt;
  if (enabled) {
    Log::debug("Sync Contact Images enabled: %@", *enabled);
    const platform::Number* flag = enabled->asNumber();
    setShouldSyncContactImages(flag && flag->boolValue());
  } else {
    Log::debug("Sync Contact Images enabled: YES (Default)");
  }
}

void zetoEventCallback(platform::ZetoRef device, std::int32_t event, void* /*ignored*/,
                       void* context) {
  auto* manager = static_cast<ZTSyncManager*>(context);
  if (!manager->zetoRef() || !(*manager->zetoRef() == device)) return;
  switch (static_cast<platform::ZetoEvent>(event)) {
    case platform::ZetoEvent::Attached:
      Log::debug("Zeto attached");
      break;
    case platform::ZetoEvent::Removed:
      Log::debug("Zeto removed");
      manager->setZetoIsMounted(false);
      break;
    case platform::ZetoEvent::Mounted:
      Log::debug("Zeto mounted");
      manager->setZetoIsMounted(true);
      break;
    case platform::ZetoEvent::Unmounted:
      Log::debug("Zeto unmounted");
      manager->setZetoIsMounted(false);
      break;
  }
}

}  // namespace zt::sync
