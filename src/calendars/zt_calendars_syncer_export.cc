// The syncer's work on one calendar: flatten and export it, then write its file.
#include <algorithm>
#include <exception>
#include <filesystem>
#include <set>
#include <string_view>

#include "calendars/calendar_flattener.h"
#include "calendars/zt_calendars_syncer.h"
#include "icalendar/zeto_calendar_exporter.h"
#include "platform/identity.h"
#include "platform/log.h"
#include "platform/sha256.h"
#include "sync/sync_status.h"
#include "sync/zt_sync_manager.h"
#include "tessel/exception.h"
#include "tessel/schema.h"
#include "tessel/session.h"

namespace zt::calendars {

using platform::Log;

namespace {

// The name under which failures from outside the engine (the exporter's index failure on an
// empty organizer list) reach the manager, which reports them as errors.
constexpr std::string_view kForeignException = "std::exception";

bool isCalendarEntity(const std::string& entity) {
  const std::vector<std::string>& entities = sync::ZTSyncManager::entitiesForCalendars();
  return std::find(entities.begin(), entities.end(), entity) != entities.end();
}

// A field of a key: its length, then its bytes, so that no two lists of fields run together
// into the same text.
void appendField(std::string& text, std::string_view field) {
  text += std::to_string(field.size());
  text += ':';
  text += field;
}

}  // namespace

std::optional<CalendarTextCache::Key> ZTCalendarsSyncer::textKey(const std::string& calendarID,
                                                                 const std::string& title,
                                                                 std::size_t order) {
  if (!_textKeyContextInited) {
    _textKeyContextInited = true;
    // Everything every calendar's text depends on besides its own records: the version of
    // all calendar records of the store (any write of one changes it), the store file itself
    // (another store may reach the same version), this very program, and the time-zone rules
    // and local zone that dates are written with.
    platform::Result<std::string> program = platform::programBuildIdentity();
    platform::Result<std::string> store = platform::fileIdentity(_syncManager.services().storePath);
    platform::Result<std::string> zones = platform::timeZoneDatabaseIdentity();
    platform::Result<std::string> localZone = platform::localTimeZoneSettingIdentity();
    if (program && store && zones && localZone) {
      const tessel::RecordsVersion version =
          calendarTruthSnapshot()->versionOfEntities(sync::ZTSyncManager::entitiesForCalendars());
      std::string context = "zetosynctool calendar text 1\n";
      for (std::string_view field : {std::string_view(*program), std::string_view(*store),
                                     std::string_view(*zones), std::string_view(*localZone)}) {
        appendField(context, field);
      }
      appendField(context, std::to_string(version.latestGeneration));
      appendField(context, std::to_string(version.records));
      _textCache = CalendarTextCache::openUserCache();
      if (_textCache) _textKeyContext = std::move(context);
    }
  }
  if (!_textKeyContext) return std::nullopt;
  std::string text = *_textKeyContext;
  appendField(text, calendarID);
  appendField(text, title);
  appendField(text, std::to_string(order));
  platform::Sha256 digest;
  digest.update(text);
  return digest.finish();
}

std::optional<std::vector<std::uint8_t>> ZTCalendarsSyncer::disassembleDataForCalendarWithID(
    const std::string& calendarID, std::optional<std::string>& calendarName, std::size_t order) {
  Log::debug("Disassembling data for calendar with ID %@", calendarID);
  std::vector<std::uint8_t> data;
  try {
    std::shared_ptr<tessel::Snapshot> snapshot = calendarTruthSnapshot();
    std::optional<platform::Dictionary> calendar = snapshot->recordWithIdentifier(calendarID);
    if (!calendar) {
      Log::debug("Can't get calendar record in truth");
      _syncManager.setLastStatus(sync::kStatusEngineFailure);
      return std::nullopt;
    }
    const std::string* title = calendar->stringAt(tessel::TesselAttribute_Calendars_Calendar_Title);
    if (!title) {
      Log::debug("Calendar has no name - ignoring this calendar");
      return std::nullopt;
    }
    calendarName = *title;

    // A calendar whose records have not changed since a run kept its text is written from
    // that text: the same bytes, without reading its events again.
    const std::string* entity = calendar->stringAt(tessel::TesselRecordEntityNameKey);
    std::optional<CalendarTextCache::Key> key;
    if (entity && isCalendarEntity(*entity)) key = textKey(calendarID, *title, order);
    std::optional<std::vector<std::uint8_t>> kept;
    if (key) kept = _textCache->find(*key);
    if (kept) {
      data = std::move(*kept);
    } else {
      const std::uint64_t linesBefore = platform::Log::messageCount();
      CalendarFlattener flattener(*snapshot);
      std::optional<platform::Dictionary> flattened =
          flattener.flattenCalendar(*calendar, *title, order);
      if (!flattened) return std::nullopt;
      calendar.reset();
      icalendar::ZetoCalendarExporter::setupData(data, *flattened);
      flattened.reset();
      // Kept only when the text depends on nothing but the calendar's records (every record
      // looked up was found among them) and making it logged nothing, so that a run writing
      // it from the cache logs exactly what an export would.
      const std::set<std::string>& read = flattener.entitiesRead();
      if (key && !flattener.missedRecord() && linesBefore == platform::Log::messageCount() &&
          std::all_of(read.begin(), read.end(), isCalendarEntity)) {
        _textCache->store(*key, data);
      }
    }

    if (_syncManager.syncSession()->isCancelled()) {
      _syncManager.setLastStatus(sync::kStatusCancelled);
    }
    return data;
  } catch (const tessel::Exception& exception) {
    _syncManager.reportEngineException("disassembling data", exception);
    return data;
  } catch (const std::exception& exception) {
    _syncManager.reportEngineException("disassembling data",
                                       tessel::Exception(kForeignException, exception.what()));
    return data;
  }
}

bool ZTCalendarsSyncer::uploadChangesForCalendarWithID(const std::string& /*calendarID*/,
                                                       std::span<const std::uint8_t> data,
                                                       const std::string& name) {
  Log::debug("Uploading changes for calendar '%@' to Zeto (%ul bytes)", name, data.size());
  // Only "/" would change the file's folder; every other character is the title's own.
  std::string fileName = "Tessel-" + name + ".ics";
  std::replace(fileName.begin(), fileName.end(), '/', '_');
  const std::optional<std::string>& folder = _syncManager.pathToZetoCalendarsFolder();
  std::filesystem::path path =
      folder ? std::filesystem::path(*folder) / fileName : std::filesystem::path(fileName);
  const platform::FolderHandle* calendars = _syncManager.zetoCalendarsFolder();
  // Each file's content is on the disk before its rename; the folder is synced once, after
  // the last calendar (doSync).
  if (!calendars || !calendars->atomicWrite(fileName, data, platform::Durability::FolderLater)) {
    Log::debug("Can't write calendar at path %@", path.string());
    _syncManager.setLastStatus(sync::kStatusWriteFailed);
    return false;
  }
  return true;
}

}  // namespace zt::calendars
