#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "calendars/calendar_text_cache.h"
#include "filters/zeto_calendar_filter.h"
#include "sync/data_class_syncer.h"
#include "tessel/snapshot.h"

namespace zt::sync {
class ZTSyncManager;
}

namespace zt::calendars {

// The calendars half of one sync: accepts the calendar changes the engine offers, works out
// which calendars go to the player and in which order, empties the player's calendars
// folder, then flattens, exports and writes one file per calendar, and commits. Every sync
// rewrites every selected calendar. One calendar's records and text are released before the
// next calendar starts, so memory follows the largest calendar, not the total.
class ZTCalendarsSyncer final : public sync::CalendarsSyncing {
 public:
  // Finds the client's calendar filter; the manager must outlive the syncer.
  explicit ZTCalendarsSyncer(sync::ZTSyncManager& syncManager);
  ~ZTCalendarsSyncer() override;
  ZTCalendarsSyncer(const ZTCalendarsSyncer&) = delete;
  ZTCalendarsSyncer& operator=(const ZTCalendarsSyncer&) = delete;

  // The whole calendars sync, reporting progress 0, 34, two steps per written calendar and
  // 100. False when it failed; the manager's status then says why.
  bool doSync() override;

  // As the calendar filter's helper: whether the user selected this calendar.
  bool shouldApplyCalendarWithIdentifier(const std::string& identifier) override;

  // The session's truth, fetched on first use and shared by the filter, the selection and
  // the flattening.
  std::shared_ptr<tessel::Snapshot> calendarTruthSnapshot();
  // The calendars the filter selects, worked out once; none when every calendar goes.
  const std::optional<std::vector<std::string>>& filteredCalendarIDs();

  // The steps of doSync. getChanges accepts the calendar-order change (or, without a list,
  // every calendar change) and fixes allCalIDs(); cleanCalendarFolder removes everything
  // in the calendars folder, whoever wrote it.
  bool getChanges();
  bool cleanCalendarFolder();
  // The calendar's iCalendar text, or none when it cannot be read or has no title (the name
  // tells which); after a failure inside, the text as it stood (usually empty), with the
  // manager's status set.
  std::optional<std::vector<std::uint8_t>> disassembleDataForCalendarWithID(
      const std::string& calendarID, std::optional<std::string>& calendarName, std::size_t order);
  // Writes "Tessel-<name>.ics" (every "/" made "_") atomically into the calendars folder.
  bool uploadChangesForCalendarWithID(const std::string& calendarID,
                                      std::span<const std::uint8_t> data, const std::string& name);

  // The key of a calendar's text in the cache of kept texts: everything the text depends on.
  // None when the cache is off or something the text depends on cannot be told.
  std::optional<CalendarTextCache::Key> textKey(const std::string& calendarID,
                                                const std::string& title, std::size_t order);

  // The calendars to write, in the player's order.
  const std::vector<std::string>& allCalIDs() const { return _allCalIDs; }

 private:
  sync::ZTSyncManager& _syncManager;
  // Unused: the syncer's outcome lives in the manager's status.
  [[maybe_unused]] std::int32_t _lastStatus = 0;
  std::shared_ptr<filters::ZetoCalendarFilter> _calendarFilter;
  std::optional<std::vector<std::string>> _filteredCalendarIDs;
  bool _filteredCalendarIDsInited = false;
  std::vector<std::string> _allCalIDs;
  // Made empty by getChanges and never filled: calendars are written one at a time.
  std::map<std::string, std::vector<std::uint8_t>> _allCalsAsData;
  std::shared_ptr<tessel::Snapshot> _calendarTruthSnapshot;
  std::unique_ptr<CalendarTextCache> _textCache;
  // What every calendar's key shares, worked out at the first calendar; none when the
  // texts are not to be kept.
  std::optional<std::string> _textKeyContext;
  bool _textKeyContextInited = false;
};

// The maker the tool's entry gives the manager.
std::unique_ptr<sync::CalendarsSyncing> makeCalendarsSyncer(sync::ZTSyncManager& syncManager);

}  // namespace zt::calendars
