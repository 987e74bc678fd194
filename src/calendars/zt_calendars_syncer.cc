// The syncer's run: the changes, the choice and order of calendars, the folder clean-up,
// the progress and the commit.
#include "calendars/zt_calendars_syncer.h"

#include <algorithm>
#include <string_view>
#include <utility>
#include <variant>

#include "calendars/record_description.h"
#include "platform/log.h"
#include "platform/sync_progress.h"
#include "sync/sync_status.h"
#include "sync/zt_sync_manager.h"
#include "tessel/change.h"
#include "tessel/change_enumerator.h"
#include "tessel/exception.h"
#include "tessel/schema.h"
#include "tessel/session.h"

namespace zt::calendars {

using platform::Log;

namespace {

using platform::sync_progress::kUploadingPhase;
constexpr float kProgressAfterCleaning = 34.0f;

// Raised when the engine offers something other than an add: calendars are replaced
// wholesale, so anything else means the engine and the tool disagree.
constexpr std::string_view kInternalInconsistencyException = "ZTInternalInconsistencyException";

void fail(std::string_view reason) {
  Log::debug(reason);
  throw tessel::Exception(kInternalInconsistencyException, std::string(reason));
}

void checkIsAdd(const tessel::Change& change) {
  if (change.type != tessel::ChangeType::Add) fail("Change type is not Add for Zeto !?!?!!");
  if (!change.record) fail("Record of change is NULL!");
}

// A list of identifiers as log lines print it.
platform::Value describedList(const std::vector<std::string>& identifiers) {
  platform::Array list;
  list.reserve(identifiers.size());
  for (const std::string& identifier : identifiers) list.emplace_back(identifier);
  return platform::Value(std::move(list));
}

// The identifier strings of a relationship; none when the value is not a list.
std::optional<std::vector<std::string>> identifiersOf(const platform::Value* relationship) {
  if (!relationship || !relationship->asArray()) return std::nullopt;
  return platform::stringsIn(relationship);
}

}  // namespace

ZTCalendarsSyncer::ZTCalendarsSyncer(sync::ZTSyncManager& syncManager) : _syncManager(syncManager) {
  if (tessel::Client* client = _syncManager.syncClient()) {
    for (const std::shared_ptr<tessel::Filtering>& filter : client->filters()) {
      if (auto calendarFilter = std::dynamic_pointer_cast<filters::ZetoCalendarFilter>(filter)) {
        _calendarFilter = std::move(calendarFilter);
        break;
      }
    }
  }
  if (_calendarFilter) {
    Log::debug("Calendar filter is %@", *_calendarFilter);
  } else {
    Log::debug("Calendar filter is %@", "(null)");
  }
}

ZTCalendarsSyncer::~ZTCalendarsSyncer() = default;

std::unique_ptr<sync::CalendarsSyncing> makeCalendarsSyncer(sync::ZTSyncManager& syncManager) {
  return std::make_unique<ZTCalendarsSyncer>(syncManager);
}

std::shared_ptr<tessel::Snapshot> ZTCalendarsSyncer::calendarTruthSnapshot() {
  if (!_calendarTruthSnapshot) {
    _calendarTruthSnapshot = _syncManager.syncSession()->snapshotOfRecordsInTruth();
  }
  return _calendarTruthSnapshot;
}

const std::optional<std::vector<std::string>>& ZTCalendarsSyncer::filteredCalendarIDs() {
  if (!_filteredCalendarIDsInited) {
    if (_calendarFilter && !_calendarFilter->useAllCalendars()) {
      _filteredCalendarIDs =
          _calendarFilter->usedCalendarGroupIDsForSnapshot(*calendarTruthSnapshot());
    }
    _filteredCalendarIDsInited = true;
  }
  return _filteredCalendarIDs;
}

bool ZTCalendarsSyncer::shouldApplyCalendarWithIdentifier(const std::string& identifier) {
  const std::optional<std::vector<std::string>>& selected = filteredCalendarIDs();
  if (!selected) return true;
  return std::find(selected->begin(), selected->end(), identifier) != selected->end();
}

bool ZTCalendarsSyncer::getChanges() {
  Log::debug("Getting changes");
  try {
    tessel::Session& session = *_syncManager.syncSession();
    std::optional<tessel::Change> orderChange =
        session.changeEnumerator({std::string(tessel::TesselEntity_Calendars_CalendarOrder)})
            .next();

    std::optional<std::vector<std::string>> ordered;
    if (orderChange) {
      checkIsAdd(*orderChange);
      Log::debug("Base change record for calendars: %@", RecordDescription{*orderChange->record});
      ordered = identifiersOf(
          orderChange->record->find(tessel::TesselRelationship_Calendars_CalendarOrder_Calendars));
      session.clientAcceptedChanges(orderChange->recordIdentifier);
      if (!ordered) Log::always("*** Can't get list order of calendars!");
    }

    if (!ordered) {
      // Without the user's order, calendars go in the order the engine offers them.
      ordered.emplace();
      tessel::ChangeEnumerator calendarChanges =
          session.changeEnumerator({std::string(tessel::TesselEntity_Calendars_Calendar)});
      while (std::optional<tessel::Change> change = calendarChanges.next()) {
        checkIsAdd(*change);
        ordered->push_back(change->recordIdentifier);
        session.clientAcceptedChanges(change->recordIdentifier);
      }
    }

    if (_calendarFilter && !_calendarFilter->useAllCalendars()) {
      const std::optional<std::vector<std::string>>& selected = filteredCalendarIDs();
      std::vector<std::string> chosen;
      for (std::string& identifier : *ordered) {
        if (selected &&
            std::find(selected->begin(), selected->end(), identifier) != selected->end()) {
          chosen.push_back(std::move(identifier));
        }
      }
      _allCalIDs = std::move(chosen);
      Log::debug("Filtered calendar IDs are:\n%@", describedList(_allCalIDs));
    } else {
      Log::debug("Use all calendars");
      _allCalIDs = std::move(*ordered);
    }
    _allCalsAsData.clear();
    return true;
  } catch (const tessel::Exception& exception) {
    _syncManager.reportEngineException("getting changes", exception);
    return false;
  }
}

bool ZTCalendarsSyncer::cleanCalendarFolder() {
  const platform::FolderHandle* folder = _syncManager.zetoCalendarsFolder();
  platform::Result<std::vector<std::string>> listing =
      folder ? folder->entries()
             : platform::Result<std::vector<std::string>>(
                   platform::Error{"the player has no calendars folder"});
  if (!listing) {
    Log::debug("Can't clean calendars folder. Reason: %@", listing.error());
    _syncManager.setLastStatus(sync::kStatusWriteFailed);
    return false;
  }
  // Every entry goes, the temporary files of an interrupted write included. A link is removed
  // as a link: what it leads to is not on the player.
  for (const std::string& name : *listing) {
    Log::debug("Removing %@", name);
    if (platform::Result<void> removed = folder->remove(name); !removed) {
      Log::debug("The calendar '%@' could not be removed. Reason: %@", name, removed.error());
    }
  }
  return true;
}

bool ZTCalendarsSyncer::doSync() {
  const std::string dataClass(tessel::TesselDataClass_Calendars);
  _syncManager.notifyTesselWithPhase(kUploadingPhase, 0.0f, dataClass);
  bool result = [&] {
    if (!getChanges() || !cleanCalendarFolder()) return false;
    _syncManager.notifyTesselWithPhase(kUploadingPhase, kProgressAfterCleaning, dataClass);
    const std::size_t count = _allCalIDs.size();
    const float step = count ? 66.0f / static_cast<float>(2 * count) : 0.0f;
    float progress = kProgressAfterCleaning;
    for (std::size_t position = 0; position < count; ++position) {
      // Everything of one calendar dies at the end of this block, before the next starts.
      const std::string& calendarID = _allCalIDs[position];
      std::optional<std::string> name;
      std::optional<std::vector<std::uint8_t>> data =
          disassembleDataForCalendarWithID(calendarID, name, position);
      if (!data || !name) {
        if (_syncManager.lastStatus() != sync::kStatusSuccess) return false;
        continue;
      }
      progress += step;
      _syncManager.notifyTesselWithPhase(kUploadingPhase, progress, dataClass);
      if (!uploadChangesForCalendarWithID(calendarID, *data, *name)) return false;
      progress += step;
      _syncManager.notifyTesselWithPhase(kUploadingPhase, progress, dataClass);
    }
    // One sync of the folder makes the removals and every file's rename durable, before the
    // changes are committed.
    if (count > 0) {
      if (platform::Result<void> synced = _syncManager.zetoCalendarsFolder()->sync(); !synced) {
        Log::debug("Can't write calendar at path %@", synced.error());
        _syncManager.setLastStatus(sync::kStatusWriteFailed);
        return false;
      }
    }
    // The texts of this run are all the cache keeps.
    if (_textCache) _textCache->prune();
    return _syncManager.commitAcceptedChanges();
  }();
  _syncManager.notifyTesselWithPhase(kUploadingPhase, 100.0f, dataClass);
  return result;
}

}  // namespace zt::calendars
