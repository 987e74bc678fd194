#include "sync/zt_sync_manager.h"

#include <algorithm>
#include <mutex>

#include "filters/filter_classes.h"
#include "filters/zeto_calendar_filter.h"
#include "filters/zeto_contact_filter.h"
#include "platform/log.h"
#include "platform/sync_progress.h"
#include "sync/sync_status.h"
#include "tessel/schema.h"

namespace zt::sync {

using platform::Log;
using namespace platform::sync_progress;  // the progress names, in this source file only

namespace {

// The platform's identifier of the UTF-16 big-endian text encoding, in which the contacts
// file is written.
constexpr std::uint32_t kUtf16BigEndianEncoding = 0x90000100;

}  // namespace

ZTSyncManager::ZTSyncManager(std::string syncClientID, SyncServices services)
    : services_(std::move(services)), _syncClientID(std::move(syncClientID)) {
  static std::once_flag classInitialised;
  std::call_once(classInitialised, [] {
    filters::registerFilterClasses();
    Log::debug("UTF16BE encoding: %ul", kUtf16BigEndianEncoding);
  });
}

ZTSyncManager::~ZTSyncManager() {
  Log::debug("Deallocing Zeto sync manager");
  // The session and snapshot go before the store they read from.
  _contactSyncer.reset();
  _calendarSyncer.reset();
  _snapshot.reset();
  _syncSession.reset();
  _syncClient.reset();
  _pathToZetoVolume.clear();
  setZetoContactsFolder(std::nullopt);
  setZetoCalendarsFolder(std::nullopt);
}

const std::vector<std::string>& ZTSyncManager::entitiesForContacts() {
  static const std::vector<std::string> entities = {
      std::string(tessel::TesselEntity_Contacts_Contact),
      std::string(tessel::TesselEntity_Contacts_EmailAddress),
      std::string(tessel::TesselEntity_Contacts_PhoneNumber),
      std::string(tessel::TesselEntity_Contacts_IM),
      std::string(tessel::TesselEntity_Contacts_StreetAddress),
      std::string(tessel::TesselEntity_Contacts_URL),
      std::string(tessel::TesselEntity_Contacts_Group),
  };
  return entities;
}

const std::vector<std::string>& ZTSyncManager::entitiesForCalendars() {
  static const std::vector<std::string> entities = {
      std::string(tessel::TesselEntity_Calendars_CalendarOrder),
      std::string(tessel::TesselEntity_Calendars_Calendar),
      std::string(tessel::TesselEntity_Calendars_Event),
      std::string(tessel::TesselEntity_Calendars_Task),
      std::string(tessel::TesselEntity_Calendars_Recurrence),
      std::string(tessel::TesselEntity_Calendars_AudioAlarm),
      std::string(tessel::TesselEntity_Calendars_MailAlarm),
      std::string(tessel::TesselEntity_Calendars_DisplayAlarm),
      std::string(tessel::TesselEntity_Calendars_Organizer),
      std::string(tessel::TesselEntity_Calendars_Attendee),
  };
  return entities;
}

void ZTSyncManager::doSync() {
  notifyTesselWithPhase(kConnectingPhase, 0.0f);
  [&] {
    if (!initiateSyncSession()) return;
    upgradeClientIfNecessary(*_syncClient);
    _lastStatus = kStatusDeviceUnavailable;
    if (!checkForConnectedZeto()) return;
    if (!lockZeto()) return;
    if (!checkZetoPIMPaths()) return;
    notifyTesselWithPhase(kConnectingPhase, 100.0f, _shouldSyncContacts, _shouldSyncCalendars);
    if (!registerEntitiesToSync()) return;
    _lastStatus = kStatusSuccess;
    notifyTesselWithPhase(kMinglingPhase, 0.0f);
    if (!doCoreSync()) return;
    if (_shouldSyncContacts && !doContactsSync()) return;
    if (_shouldSyncCalendars && !doCalendarsSync()) return;
    notifyTesselWithPhase(kUploadingPhase, 100.0f);
  }();
  cleanupSyncSession();
  unlockZeto();
  notifyTesselWithPhase(kDisconnectingPhase, reportedStatus(_lastStatus), 100.0f);
}

bool ZTSyncManager::doCoreSync() {
  Log::debug("Prepare to pull changes from sync server");
  try {
    if (services_.syncers.calendars) {
      _calendarSyncer = services_.syncers.calendars(*this);
      filters::ZetoCalendarFilter::setCalendarFilterHelper(_calendarSyncer.get());
    }
    if (services_.syncers.contacts) {
      _contactSyncer = services_.syncers.contacts(*this);
      filters::ZetoContactFilter::setContactFilterHelper(_contactSyncer.get());
    }
    // The calendars syncer reads the changes of the calendar order and the calendars only:
    // every file is rebuilt from the snapshot, so the events and what hangs on them are
    // read there. Preparing their changes too would only fill the session's change table
    // with an add per record, every run, that nobody reads or accepts.
    std::vector<std::string> prepared;
    for (const std::string& entity : _entitiesToSync) {
      if (entity == tessel::TesselEntity_Calendars_CalendarOrder ||
          entity == tessel::TesselEntity_Calendars_Calendar ||
          std::find(entitiesForCalendars().begin(), entitiesForCalendars().end(), entity) ==
              entitiesForCalendars().end()) {
        prepared.push_back(entity);
      }
    }
    _syncSession->prepareToPullChanges(prepared);
    return true;
  } catch (const tessel::Exception& exception) {
    reportEngineException("preparing to pull changes from sync server", exception);
    return false;
  }
}

bool ZTSyncManager::doContactsSync() {
  Log::debug("Sync'ing Contacts");
  bool result = _contactSyncer && _contactSyncer->doSync();
  filters::ZetoContactFilter::setContactFilterHelper(nullptr);
  _contactSyncer.reset();
  return result;
}

bool ZTSyncManager::doCalendarsSync() {
  Log::debug("Sync'ing Calendars");
  bool result = _calendarSyncer && _calendarSyncer->doSync();
  filters::ZetoCalendarFilter::setCalendarFilterHelper(nullptr);
  _calendarSyncer.reset();
  return result;
}

void ZTSyncManager::setShouldSyncContacts(bool sync) {
  if (_shouldSyncContacts != sync) _shouldSyncContacts = sync;
}

void ZTSyncManager::setShouldSyncCalendars(bool sync) {
  if (_shouldSyncCalendars != sync) _shouldSyncCalendars = sync;
}

void ZTSyncManager::setShouldSyncContactImagesCached(bool cached) {
  if (_shouldSyncContactImagesCached != cached) _shouldSyncContactImagesCached = cached;
}

void ZTSyncManager::setShouldSyncContactImages(bool sync) {
  if (_shouldSyncContactImages != sync) _shouldSyncContactImages = sync;
}

void ZTSyncManager::setLastUsedSyncToolWasDifferent(bool different) {
  if (_lastUsedSyncToolWasDifferent != different) _lastUsedSyncToolWasDifferent = different;
}

void ZTSyncManager::setLastUsedSyncToolWasDifferentIsCached(bool cached) {
  if (_lastUsedSyncToolWasDifferentIsCached != cached) {
    _lastUsedSyncToolWasDifferentIsCached = cached;
  }
}

// Progress notifications.

void ZTSyncManager::notifyTesselWithPhase(
    const std::string& phase, std::int32_t status, float percent,
    const std::optional<std::string>& currentDataClass,
    const std::optional<std::vector<std::string>>& dataClassSyncing) {
  platform::Dictionary userInfo;
  userInfo.set(kCurrentPhaseKey, phase);
  if (status != -1) userInfo.set(kStatusKey, platform::Value::integer(status));
  if (dataClassSyncing) {
    platform::Array classes(dataClassSyncing->begin(), dataClassSyncing->end());
    userInfo.set(kDataClassSyncingKey, std::move(classes));
  }
  if (currentDataClass) userInfo.set(kDataClassKey, *currentDataClass);
  // A NaN is not equal to -1, so it is passed on like any other percentage.
  if (percent != -1.0f) userInfo.set(kPercentKey, platform::Value::real(percent));
  services_.notifications.post(kNotificationName, _syncClientID, userInfo);
}

void ZTSyncManager::notifyTesselWithPhase(const std::string& phase, float percent) {
  notifyTesselWithPhase(phase, -1, percent, std::nullopt, std::nullopt);
}

void ZTSyncManager::notifyTesselWithPhase(const std::string& phase, std::int32_t status,
                                          float percent) {
  notifyTesselWithPhase(phase, status, percent, std::nullopt, std::nullopt);
}

void ZTSyncManager::notifyTesselWithPhase(const std::string& phase, float percent,
                                          const std::string& /*currentDataClass*/) {
  notifyTesselWithPhase(phase, -1, percent, std::nullopt, std::nullopt);
}

void ZTSyncManager::notifyTesselWithPhase(const std::string& phase, float percent,
                                          bool syncingContact, bool syncingCalendar) {
  std::vector<std::string> classes;
  if (syncingContact) classes.emplace_back(tessel::TesselDataClass_Contacts);
  if (syncingCalendar) classes.emplace_back(tessel::TesselDataClass_Calendars);
  notifyTesselWithPhase(phase, -1, percent, std::nullopt, classes);
}

}  // namespace zt::sync
