#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/device_library.h"
#include "platform/folder_handle.h"
#include "platform/value.h"
#include "sync/data_class_syncer.h"
#include "sync/sync_services.h"
#include "tessel/client.h"
#include "tessel/exception.h"
#include "tessel/session.h"
#include "tessel/snapshot.h"
#include "tessel/store.h"

namespace zt::sync {

// The spine of one sync: one instance per process, made with the sync client identifier and
// asked once to doSync. It owns the engine client, session and snapshot, the player's
// reference, lock and paths, the per-data-class decisions and the outcome status, and posts
// the progress notifications. The syncers, made through the makers it is given, use it for
// all of these.
class ZTSyncManager {
 public:
  ZTSyncManager(std::string syncClientID, SyncServices services);
  ~ZTSyncManager();
  ZTSyncManager(const ZTSyncManager&) = delete;
  ZTSyncManager& operator=(const ZTSyncManager&) = delete;

  // Runs one whole sync. Whatever happens, the session is ended, the lock released and a
  // final notification posted.
  void doSync();

  // The entity names of each data class, in the engine's published order.
  static const std::vector<std::string>& entitiesForContacts();
  static const std::vector<std::string>& entitiesForCalendars();

  // Steps of doSync; each answers whether the run goes on.
  bool initiateSyncSession();
  void upgradeClientIfNecessary(tessel::Client& client);
  bool registerEntitiesToSync();
  bool doCoreSync();
  bool doContactsSync();
  bool doCalendarsSync();
  bool commitAcceptedChanges();
  void cleanupSyncSession();

  // The player: connection, lock and mount.
  bool checkForConnectedZeto();
  bool zetoIDMatchesSyncClientID(const std::string& zetoID) const;
  std::optional<platform::ZetoRef> zetoRef() const { return _zetoRef; }
  bool lockZeto();
  bool unlockZeto();
  bool mountZeto();
  void setZetoIsMounted(bool mounted);
  bool zetoIsMounted() const { return _forceMounted; }

  // The player's folders and the contact-picture decision. The path of the real folder
  // `name` at the root of the volume (created when missing and asked for), or of the missing
  // folder that was not to be created; none for anything else in its place, a link included.
  std::optional<std::string> checkForZetoFolder(const std::string& name, bool createIfNeeded);
  bool checkZetoPIMPaths();
  bool shouldSyncContactImages();

  // Progress notifications. A status of -1, a percentage of -1 and none are left out.
  void notifyTesselWithPhase(const std::string& phase, std::int32_t status, float percent,
                             const std::optional<std::string>& currentDataClass,
                             const std::optional<std::vector<std::string>>& dataClassSyncing);
  void notifyTesselWithPhase(const std::string& phase, float percent);
  void notifyTesselWithPhase(const std::string& phase, std::int32_t status, float percent);
  // The data class is accepted and deliberately not passed on.
  void notifyTesselWithPhase(const std::string& phase, float percent,
                             const std::string& currentDataClass);
  void notifyTesselWithPhase(const std::string& phase, float percent, bool syncingContact,
                             bool syncingCalendar);

  // What the syncers read and set.
  tessel::Client* syncClient() const { return _syncClient.get(); }
  tessel::Session* syncSession() const { return _syncSession.get(); }
  const std::string& syncClientID() const { return _syncClientID; }
  std::shared_ptr<tessel::Snapshot> snapshotOfRecordsInTruth();
  bool lastUsedSyncToolWasDifferent();
  void setLastUsedSyncToolWasDifferent(bool different);
  bool lastUsedSyncToolWasDifferentIsCached() const {
    return _lastUsedSyncToolWasDifferentIsCached;
  }
  void setLastUsedSyncToolWasDifferentIsCached(bool cached);
  void setLastStatusForException(const tessel::Exception& exception);
  // How every step reports an engine exception it stops on: a debug line "Exception while
  // <doing>:" with the exception, and the status the exception stands for.
  void reportEngineException(std::string_view doing, const tessel::Exception& exception);
  void setLastStatus(std::int32_t status) { _lastStatus = status; }
  std::int32_t lastStatus() const { return _lastStatus; }
  bool shouldSyncContacts() const { return _shouldSyncContacts; }
  void setShouldSyncContacts(bool sync);
  bool shouldSyncCalendars() const { return _shouldSyncCalendars; }
  void setShouldSyncCalendars(bool sync);
  const std::string& pathToZetoVolume() const { return _pathToZetoVolume; }
  void setPathToZetoVolume(const std::string& path) { _pathToZetoVolume = path; }
  // The player's folders as opened by checkZetoPIMPaths: their paths for the log, and the
  // handles every file operation on them goes through. None: the folder is not usable.
  const std::optional<std::string>& pathToZetoContactsFolder() const {
    return _pathToZetoContactsFolder;
  }
  const std::optional<std::string>& pathToZetoCalendarsFolder() const {
    return _pathToZetoCalendarsFolder;
  }
  const platform::FolderHandle* zetoContactsFolder() const {
    return _zetoContactsFolder ? &*_zetoContactsFolder : nullptr;
  }
  const platform::FolderHandle* zetoCalendarsFolder() const {
    return _zetoCalendarsFolder ? &*_zetoCalendarsFolder : nullptr;
  }
  void setZetoContactsFolder(std::optional<platform::FolderHandle> folder);
  void setZetoCalendarsFolder(std::optional<platform::FolderHandle> folder);
  bool shouldSyncContactImagesCached() const { return _shouldSyncContactImagesCached; }
  void setShouldSyncContactImagesCached(bool cached);
  void setShouldSyncContactImages(bool sync);

  const SyncServices& services() const { return services_; }

 private:
  void _cacheShouldSyncContactImages();
  // What checkForZetoFolder finds: the folder opened without following links, so that a link
  // put in its place later cannot lead anywhere; or nothing, with whether nothing was there.
  struct ZetoFolder {
    std::optional<platform::FolderHandle> opened;
    bool missing = false;
  };
  ZetoFolder openZetoFolder(const std::string& name, bool createIfNeeded);

  SyncServices services_;
  std::unique_ptr<tessel::Store> store_;

  std::optional<platform::ZetoRef> _zetoRef;
  bool _forceMounted = false;
  bool _locked = false;
  std::string _syncClientID;
  std::unique_ptr<tessel::Client> _syncClient;
  std::unique_ptr<ContactsSyncing> _contactSyncer;
  std::unique_ptr<CalendarsSyncing> _calendarSyncer;
  std::unique_ptr<tessel::Session> _syncSession;
  bool _shouldSyncContacts = false;
  bool _shouldSyncContactImages = false;
  bool _shouldSyncContactImagesCached = false;
  bool _shouldSyncCalendars = false;
  std::vector<std::string> _entitiesToSync;
  std::int32_t _lastStatus = 0;
  std::string _pathToZetoVolume;
  std::optional<std::string> _pathToZetoCalendarsFolder;
  std::optional<std::string> _pathToZetoContactsFolder;
  std::optional<platform::FolderHandle> _zetoCalendarsFolder;
  std::optional<platform::FolderHandle> _zetoContactsFolder;
  std::shared_ptr<tessel::Snapshot> _snapshot;
  bool _lastUsedSyncToolWasDifferent = false;
  bool _lastUsedSyncToolWasDifferentIsCached = false;
};

// The device-event callback registered while the manager waits for the volume; the context
// is the manager. Events of other players and unknown codes change nothing.
void zetoEventCallback(platform::ZetoRef device, std::int32_t event, void* ignored, void* context);

}  // namespace zt::sync
