#include "contacts/zt_contacts_syncer.h"

#include <deque>

#include "platform/log.h"
#include "platform/sync_progress.h"
#include "sync/sync_status.h"
#include "sync/zt_sync_manager.h"
#include "tessel/exception.h"
#include "tessel/schema.h"

namespace zt::contacts {

using platform::Log;

namespace {

using platform::sync_progress::kUploadingPhase;

// A set as log lines print it: "{(a, b)}".
std::string describe(const std::set<std::string>& identifiers) {
  std::string text = "{(";
  for (const std::string& identifier : identifiers) {
    if (text.size() > 2) text += ", ";
    text += identifier;
  }
  return text + ")}";
}

}  // namespace

ZTContactsSyncer::ZTContactsSyncer(sync::ZTSyncManager& syncManager) : _syncManager(syncManager) {
  if (tessel::Client* client = _syncManager.syncClient()) {
    for (const std::shared_ptr<tessel::Filtering>& filter : client->filters()) {
      _contactFilter = std::dynamic_pointer_cast<filters::ZetoContactFilter>(filter);
      if (_contactFilter) break;
    }
  }
  if (_contactFilter) {
    Log::debug("Contact filter is %@", _contactFilter->description());
  } else {
    Log::debug("Contact filter is %@", "(null)");
  }
}

ZTContactsSyncer::~ZTContactsSyncer() = default;

std::shared_ptr<tessel::Snapshot> ZTContactsSyncer::contactTruthSnapshot() {
  if (!_contactTruthSnapshot) _contactTruthSnapshot = _syncManager.snapshotOfRecordsInTruth();
  return _contactTruthSnapshot;
}

bool ZTContactsSyncer::doSync() {
  const std::string dataClass(tessel::TesselDataClass_Contacts);
  _syncManager.notifyTesselWithPhase(kUploadingPhase, 0.0f, dataClass);
  bool result = false;
  if (getChanges()) {
    if (!_shouldPushFile) {
      result = true;
    } else {
      _syncManager.notifyTesselWithPhase(kUploadingPhase, 34.0f, dataClass);
      if (disassembleData()) {
        _syncManager.notifyTesselWithPhase(kUploadingPhase, 68.0f, dataClass);
        result = uploadChanges();
      }
    }
  }
  _syncManager.notifyTesselWithPhase(kUploadingPhase, 100.0f, dataClass);
  return result;
}

bool ZTContactsSyncer::getChanges() {
  Log::debug("Getting changes");
  try {
    tessel::Session& session = *_syncManager.syncSession();
    // The file is rebuilt whole from truth, so the changes only tell that something changed:
    // their records are not even read. Every change is accepted, in batches, and becomes final
    // when the upload commits.
    _contactChangeEnumerator = session.changeEnumerator(sync::ZTSyncManager::entitiesForContacts(),
                                                        tessel::ChangeRecords::Omitted);
    _shouldPushFile = false;
    constexpr std::size_t kAcceptBatch = 1024;
    std::vector<std::string> accepted;
    while (std::optional<tessel::Change> change = _contactChangeEnumerator->next()) {
      _shouldPushFile = true;
      accepted.push_back(std::move(change->recordIdentifier));
      if (accepted.size() == kAcceptBatch) {
        session.clientAcceptedChangesOf(accepted);
        accepted.clear();
      }
    }
    if (!accepted.empty()) session.clientAcceptedChangesOf(accepted);

    // The first check that asks for a push ends the chain.
    if (_shouldPushFile) {
      Log::debug("List of contacts to push has changed");
    } else if (fileOnZetoNeedsPush() || photoSettingNeedsPush()) {
      _shouldPushFile = true;
    } else if (_syncManager.services().defaults.boolForKey("AlwaysPushVCard").value_or(false)) {
      Log::debug("Force pushing per AlwaysPushVCard defaults");
      _shouldPushFile = true;
    } else {
      Log::debug("Nothing to push for contacts...");
      return true;
    }

    if (session.isCancelled()) {
      Log::debug("Sync session is cancelled");
      _syncManager.setLastStatus(sync::kStatusCancelled);
      return false;
    }
    return true;
  } catch (const tessel::Exception& exception) {
    _syncManager.reportEngineException("getting changes", exception);
    return false;
  }
}

// Whether the player may hold something other than the file this tool wrote last time.
bool ZTContactsSyncer::fileOnZetoNeedsPush() {
  std::optional<platform::Value> saved = _syncManager.syncClient()->setting(kLastModDateForVCF);
  if (!saved) {
    Log::debug("Force pushing VCF file as we never noted last modification date");
    return true;
  }
  std::optional<platform::CalendarDate> date;
  if (const platform::FolderHandle* contacts = _syncManager.zetoContactsFolder()) {
    platform::Result<platform::FileAttributes> attributes =
        contacts->attributes(std::string(kFileName));
    if (attributes) date = std::move(attributes->modificationDate);
  }
  if (!date) {
    Log::debug("Can't get VCF attributes on Zeto, force pushing VCF");
    return true;
  }
  // The stored date and the file's are compared as instants: a date that names the same
  // instant at another UTC offset (set by hand, say) is the same date.
  const platform::CalendarDate* savedDate = saved->asDate();
  if (!savedDate || !savedDate->isSameInstant(*date)) {
    Log::debug("Last mod date of VCF on Zeto is not the one we saved, force pushing VCF");
    return true;
  }
  if (_syncManager.lastUsedSyncToolWasDifferent()) {
    Log::debug("Force pushing VCF to be sure we are up to date with current sync tool version");
    return true;
  }
  return false;
}

// Whether the file on the player was written with the other photo setting.
bool ZTContactsSyncer::photoSettingNeedsPush() {
  std::optional<platform::Value> saved = _syncManager.syncClient()->setting(kDidSyncContactImages);
  if (!saved) {
    Log::debug("Force pushing VCF to be sure we are to date with current sync tool version");
    return true;
  }
  const platform::Number* flag = saved->asNumber();
  const bool did = flag && flag->boolValue();
  const bool now = _syncManager.shouldSyncContactImages();
  if (did != now) {
    Log::debug(
        "Force pushing VCF because previous sync %@ sync contact images and we %@ to sync "
        "contact images now",
        did ? "did" : "did not", now ? "have" : "don't have");
    return true;
  }
  Log::debug("Previous sync %@ sync contact images. Nothing has changed on this point",
             did ? "did" : "did not");
  return false;
}

const std::set<std::string>& ZTContactsSyncer::expandedFilteredGroupsIDs() {
  if (_filteredGroups) return *_filteredGroups;
  _filteredGroups.emplace();
  std::vector<std::string> chosen;
  std::shared_ptr<tessel::Snapshot> snapshot = contactTruthSnapshot();
  if (_contactFilter) chosen = _contactFilter->usedContactGroupIDsForSnapshot(*snapshot);
  if (!chosen.empty()) {
    std::set<std::string>& result = *_filteredGroups;
    result.insert(chosen.begin(), chosen.end());
    const tessel::RecordMap groups = snapshot->recordsMatchingAttributes(
        {{tessel::TesselRecordEntityNameKey, std::string(tessel::TesselEntity_Contacts_Group)}});
    std::deque<std::string> work(chosen.begin(), chosen.end());
    while (!work.empty()) {
      auto group = groups.find(work.front());
      const platform::Value* members =
          group == groups.end()
              ? nullptr
              : group->second.find(tessel::TesselRelationship_Contacts_Group_Members);
      for (const std::string& identifier : platform::stringsIn(members)) {
        if (!groups.contains(identifier) || result.contains(identifier)) continue;
        Log::debug("Adding sub-group with ID %@ to filter", identifier);
        result.insert(identifier);
        work.push_back(identifier);
      }
      work.pop_front();
    }
  }
  Log::debug("List of filtered groups IDs: %@", describe(*_filteredGroups));
  return *_filteredGroups;
}

bool ZTContactsSyncer::shouldApplyContactGroupWithIdentifier(const std::string& identifier) {
  return expandedFilteredGroupsIDs().contains(identifier);
}

std::unique_ptr<sync::ContactsSyncing> makeContactsSyncer(sync::ZTSyncManager& syncManager) {
  return std::make_unique<ZTContactsSyncer>(syncManager);
}

}  // namespace zt::contacts
