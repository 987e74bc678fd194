// The manager's dealings with the sync engine: the client, its settings and filters, the
// session, and the mapping of engine failures to statuses.
#include <charconv>

#include "filters/zeto_calendar_filter.h"
#include "filters/zeto_contact_filter.h"
#include "platform/log.h"
#include "sync/sync_status.h"
#include "sync/zt_sync_manager.h"
#include "tessel/schema.h"

namespace zt::sync {

using platform::Log;

namespace {

constexpr std::string_view kLastSyncToolVersion = "LastSyncToolVersion";
// The tool's own version; 37 and below are the previous generation of the tool.
constexpr std::int64_t kSyncToolVersion = 38;
constexpr std::int64_t kLastBraskVersion = 37;

// A setting's integer value, read the way the settings were always read: numbers by value,
// texts by their leading decimal digits, anything else as 0.
std::int64_t integerValue(const platform::Value& value) {
  if (const platform::Number* number = value.asNumber()) return number->int64Value();
  if (const std::string* text = value.asString()) {
    std::size_t start = text->find_first_not_of(" \t");
    if (start == std::string::npos) return 0;
    if ((*text)[start] == '+') ++start;
    std::int64_t result = 0;
    std::from_chars(text->data() + start, text->data() + text->size(), result);
    return result;
  }
  return 0;
}

}  // namespace

bool ZTSyncManager::initiateSyncSession() {
  Log::debug("Getting sync client");
  try {
    store_ = tessel::Store::open(services_.storePath, tessel::StoreOpening::MustExist);
    _syncClient = store_->clientWithIdentifier(_syncClientID);
    if (!_syncClient) {
      Log::debug("Can't get a sync client");
      return false;
    }
    if (_syncClient->isEnabledForEntityName(tessel::TesselEntity_Contacts_Contact)) {
      setShouldSyncContacts(true);
    }
    if (_syncClient->isEnabledForEntityName(tessel::TesselEntity_Calendars_Calendar)) {
      setShouldSyncCalendars(true);
    }
  } catch (const tessel::Exception& exception) {
    reportEngineException("getting sync client", exception);
    return false;
  }
  // A data class whose syncer this tool does not have is left out, so that the engine never
  // believes its records reached the player.
  if (_shouldSyncContacts && !services_.syncers.contacts) {
    Log::debug("No contacts syncer in this tool, contacts are left out of this sync");
    setShouldSyncContacts(false);
  }
  if (_shouldSyncCalendars && !services_.syncers.calendars) {
    Log::debug("No calendars syncer in this tool, calendars are left out of this sync");
    setShouldSyncCalendars(false);
  }
  return true;
}

void ZTSyncManager::upgradeClientIfNecessary(tessel::Client& client) {
  try {
    std::optional<platform::Value> version = client.setting(kLastSyncToolVersion);
    if (!version) {
      Log::debug("Last tool used to sync this zeto was a old one. No need to upgrade");
      return;
    }
    if (integerValue(*version) > kLastBraskVersion) return;
    Log::debug("Last tool used to sync this zeto was on Brask. Upgrade is needed");

    tessel::FilterList filters = client.filters();
    tessel::FilterList upgraded;
    std::shared_ptr<tessel::Snapshot> snapshot = store_->snapshotOfRecordsInTruth(
        {std::string(tessel::TesselEntity_Contacts_Group),
         std::string(tessel::TesselEntity_Calendars_Calendar),
         std::string(tessel::TesselEntity_Calendars_CalendarOrder)},
        client);
    for (const std::shared_ptr<tessel::Filtering>& filter : filters) {
      if (auto* old = dynamic_cast<filters::ZetoCalendarFilter*>(filter.get())) {
        auto fresh = std::make_shared<filters::ZetoCalendarFilter>();
        fresh->setUseAllCalendars(old->useAllCalendars());
        if (!old->useAllCalendars()) {
          fresh->setUsedCalendarGroupIDs(old->usedCalendarGroupIDsForSnapshot(*snapshot),
                                         *snapshot);
        }
        upgraded.push_back(fresh);
      } else if (auto* oldContacts = dynamic_cast<filters::ZetoContactFilter*>(filter.get())) {
        auto fresh = std::make_shared<filters::ZetoContactFilter>();
        fresh->setUseAllContacts(oldContacts->useAllContacts());
        if (!oldContacts->useAllContacts()) {
          fresh->setUsedContactGroupIDs(oldContacts->usedContactGroupIDsForSnapshot(*snapshot),
                                        *snapshot);
        }
        upgraded.push_back(fresh);
      } else {
        upgraded.push_back(filter);
      }
    }
    std::string list = "(";
    for (std::size_t i = 0; i < upgraded.size(); ++i) {
      list += (i > 0 ? ", " : "") + upgraded[i]->description();
    }
    list += ")";
    Log::always("Upgrading Brask client with filters: %@", list);
    client.setFilters(upgraded);
  } catch (const tessel::Exception& exception) {
    Log::always("Exception while upgrading sync client: %@", exception);
  }
}

bool ZTSyncManager::lastUsedSyncToolWasDifferent() {
  if (_lastUsedSyncToolWasDifferentIsCached) return _lastUsedSyncToolWasDifferent;
  std::optional<platform::Value> version =
      _syncClient ? _syncClient->setting(kLastSyncToolVersion) : std::nullopt;
  bool different = true;
  if (!version) {
    Log::debug("Last tool used to sync this zeto was a old one");
  } else if (integerValue(*version) == kSyncToolVersion) {
    Log::debug("Last tool used to sync this zeto was already this one");
    different = false;
  } else {
    Log::debug("Last tool used to sync this zeto was different");
  }
  setLastUsedSyncToolWasDifferent(different);
  setLastUsedSyncToolWasDifferentIsCached(true);
  return _lastUsedSyncToolWasDifferent;
}

bool ZTSyncManager::registerEntitiesToSync() {
  _entitiesToSync.clear();
  try {
    if (_shouldSyncContacts) {
      _entitiesToSync.insert(_entitiesToSync.end(), entitiesForContacts().begin(),
                             entitiesForContacts().end());
    }
    if (_shouldSyncCalendars) {
      _entitiesToSync.insert(_entitiesToSync.end(), entitiesForCalendars().begin(),
                             entitiesForCalendars().end());
      // Calendars are always pushed whole: the player's calendar files are rewritten.
      _syncClient->shouldReplaceClientRecords(entitiesForCalendars());
    }
    Log::debug("Beginning new sync session");
    _syncSession = tessel::Session::begin(*_syncClient, _entitiesToSync);
    return true;
  } catch (const tessel::Exception& exception) {
    reportEngineException("registering entities to sync and getting sync session", exception);
    return false;
  }
}

bool ZTSyncManager::commitAcceptedChanges() {
  Log::debug("Commiting accepted changes");
  try {
    _syncSession->clientCommittedAcceptedChanges();
    return true;
  } catch (const tessel::Exception& exception) {
    reportEngineException("commiting accepted changes", exception);
    return false;
  }
}

void ZTSyncManager::cleanupSyncSession() {
  if (!_syncSession) return;
  Log::debug("Cleaning sync session");
  try {
    if (_lastStatus != kStatusSuccess) {
      Log::debug("Telling sync session our sync was unsuccessful");
      _syncSession->cancelSyncing();
    } else {
      Log::debug("Telling sync session we have finished sync'ing");
      _syncSession->finishSyncing();
      if (lastUsedSyncToolWasDifferent()) {
        _syncClient->setSetting(kLastSyncToolVersion, platform::Value::integer(kSyncToolVersion));
      }
    }
  } catch (const tessel::Exception& exception) {
    reportEngineException("cleaning sync session", exception);
  }
}

void ZTSyncManager::setLastStatusForException(const tessel::Exception& exception) {
  _lastStatus = exception.name() == tessel::TesselSessionCancelledException ? kStatusCancelled
                                                                            : kStatusEngineFailure;
}

void ZTSyncManager::reportEngineException(std::string_view doing,
                                          const tessel::Exception& exception) {
  Log::debug("Exception while " + std::string(doing) + ":\n%@", exception);
  setLastStatusForException(exception);
}

std::shared_ptr<tessel::Snapshot> ZTSyncManager::snapshotOfRecordsInTruth() {
  if (!_snapshot) _snapshot = _syncSession->snapshotOfRecordsInTruth();
  return _snapshot;
}

}  // namespace zt::sync
