// The syncer's work on one calendar: flatten and export it, then write its file.
#include <algorithm>
#include <exception>
#include <filesystem>

#include "calendars/calendar_flattener.h"
#include "calendars/zt_calendars_syncer.h"
#include "icalendar/zeto_calendar_exporter.h"
#include "platform/log.h"
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

}  // namespace

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

    std::optional<platform::Dictionary> flattened =
        CalendarFlattener(*snapshot).flattenCalendar(*calendar, *title, order);
    if (!flattened) return std::nullopt;
    calendar.reset();
    icalendar::ZetoCalendarExporter::setupData(data, *flattened);
    flattened.reset();

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
  if (!calendars || !calendars->atomicWrite(fileName, data)) {
    Log::debug("Can't write calendar at path %@", path.string());
    _syncManager.setLastStatus(sync::kStatusWriteFailed);
    return false;
  }
  return true;
}

}  // namespace zt::calendars
