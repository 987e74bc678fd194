#include "importers/ical_import.h"

#include <algorithm>
#include <cstdint>
#include <fstream>
#include <map>
#include <set>
#include <string_view>
#include <system_error>
#include <unordered_set>

#include "importers/import_file.h"
#include "importers/stable_hash.h"
#include "platform/ascii.h"
#include "platform/value.h"
#include "tessel/schema.h"

namespace tessel::importers {

namespace fs = std::filesystem;

namespace {

using zt::platform::Array;
using zt::platform::Dictionary;
using zt::platform::Value;

// The vdir format keeps a collection's name in a file "displayname" inside the folder.
std::optional<std::string> vdirDisplayName(const fs::path& folder) {
  std::error_code error;
  const fs::path file = folder / "displayname";
  if (!fs::is_regular_file(file, error)) return std::nullopt;
  std::ifstream in(file, std::ios::binary);
  std::string line;
  if (!std::getline(in, line)) return std::nullopt;
  while (!line.empty() && (line.back() == '\r' || line.back() == ' ')) line.pop_back();
  if (line.empty()) return std::nullopt;
  return line;
}

ICalCalendarSource folderSource(const fs::path& folder, const std::string& name,
                                const std::optional<std::string>& title) {
  ICalCalendarSource source;
  source.identifier = calendarIdentifierForPath(folder);
  std::vector<fs::path> files;
  std::error_code error;
  for (fs::directory_iterator it(folder, error), end; !error && it != end; it.increment(error)) {
    if (!it->is_regular_file(error)) continue;
    if (zt::platform::lowerAscii(it->path().extension().string()) == ".ics")
      files.push_back(it->path());
  }
  if (error) throw ImportError(name, std::nullopt, "cannot list the folder: " + error.message());
  // Folder order is the file system's; file names give a stable one.
  std::sort(files.begin(), files.end());
  for (const fs::path& file : files) {
    const std::string fileName = (fs::path(name) / file.filename()).string();
    source.files.push_back({fileName, readImportFile(file, fileName)});
  }
  fs::path named = fs::canonical(folder, error);
  if (error) named = folder;
  source.title = vdirDisplayName(folder);
  if (!source.title) source.title = title ? *title : named.filename().string();
  return source;
}

ICalCalendarSource fileSource(const fs::path& file, const std::string& name,
                              const std::optional<std::string>& title) {
  ICalCalendarSource source;
  source.identifier = calendarIdentifierForPath(file);
  source.files.push_back({name, readImportFile(file, name)});
  source.fallbackTitle = title ? *title : file.stem().string();
  return source;
}

std::string calendarOf(const std::string& identifier) {
  return identifier.substr(0, identifier.find('/'));
}

void appendStrings(const Value* list, std::vector<std::string>& out) {
  for (std::string& text : zt::platform::stringsIn(list)) out.push_back(std::move(text));
}

// The relationships through which an event or task lists records of its own.
constexpr std::string_view kOwnedRelationships[] = {
    TesselRelationship_Calendars_Event_Recurrences,
    TesselRelationship_Calendars_Event_AudioAlarms,
    TesselRelationship_Calendars_Event_MailAlarms,
    TesselRelationship_Calendars_Event_DisplayAlarms,
    TesselRelationship_Calendars_Event_Organizer,
    TesselRelationship_Calendars_Event_Attendees,
    TesselRelationship_Calendars_Event_DetachedEvents,
};

// What the store holds now of the calendars an import writes.
struct StoredCalendars {
  // The records of each calendar, but for the Calendar record itself.
  std::map<std::string, RecordMap> records;
  // The identifiers of every Calendar record.
  std::set<std::string> live;
  // The calendars the CalendarOrder record lists.
  std::vector<std::string> order;
};

StoredCalendars storedCalendars(const Store& store, const std::vector<ICalCalendar>& calendars) {
  StoredCalendars stored;
  for (const ICalCalendar& calendar : calendars) stored.records[calendar.identifier];
  store.forEachRecord([&](const Record& record) {
    const std::string* name = record.record.stringAt(TesselRecordEntityNameKey);
    if (name != nullptr && *name == TesselEntity_Calendars_Calendar) stored.live.insert(record.id);
    if (name != nullptr && *name == TesselEntity_Calendars_CalendarOrder && stored.order.empty()) {
      appendStrings(record.record.find(TesselRelationship_Calendars_CalendarOrder_Calendars),
                    stored.order);
    }
    const auto found = stored.records.find(calendarOf(record.id));
    if (found != stored.records.end() && record.id.size() > found->first.size()) {
      found->second.emplace(record.id, record.record);
    }
  });
  return stored;
}

// Adds to `records` what one calendar puts, and to `stale` what it deletes of the records the
// store held of it (`before`).
// The calendar's records are moved into `records`.
void mergeCalendar(ICalCalendar& calendar, const RecordMap& before, SyncDeletes syncDeletes,
                   std::vector<Record>& records, std::vector<std::string>& stale) {
  // Views of the records' identifiers, used before the records are moved out below.
  std::unordered_set<std::string_view> produced;
  produced.reserve(calendar.records.size());
  for (const Record& record : calendar.records) produced.insert(record.id);

  std::vector<Record>& written = calendar.records;
  std::set<std::string> kept;
  if (syncDeletes == SyncDeletes::Off) {
    // Events and tasks that left the source stay, listed in their calendar as before, and
    // so do the records they list.
    std::vector<std::string> keptEvents, keptTasks;
    for (const auto& [id, record] : before) {
      const std::string* name = record.stringAt(TesselRecordEntityNameKey);
      if (name == nullptr || produced.count(id) != 0) continue;
      const bool event = *name == TesselEntity_Calendars_Event;
      if (!event && *name != TesselEntity_Calendars_Task) continue;
      (event ? keptEvents : keptTasks).push_back(id);
      kept.insert(id);
      std::vector<std::string> owned;
      for (std::string_view key : kOwnedRelationships) appendStrings(record.find(key), owned);
      kept.insert(owned.begin(), owned.end());
    }
    Dictionary& calendarRecord = written.front().record;
    const auto extend = [&](std::string_view key, const std::vector<std::string>& ids) {
      if (ids.empty()) return;
      Array list = *calendarRecord.arrayAt(key);
      for (const std::string& id : ids) list.emplace_back(id);
      calendarRecord.set(key, Value(std::move(list)));
    };
    extend(TesselRelationship_Calendars_Calendar_Events, keptEvents);
    extend(TesselRelationship_Calendars_Calendar_Tasks, keptTasks);
  }
  for (const auto& [id, record] : before) {
    if (produced.count(id) == 0 && kept.count(id) == 0) stale.push_back(id);
  }
  for (Record& record : written) records.push_back(std::move(record));
  written.clear();
  written.shrink_to_fit();
}

// The order keeps the calendars it lists that still exist, then the new ones, then any other.
std::vector<std::string> calendarOrder(const std::vector<std::string>& order,
                                       const std::set<std::string>& liveCalendars,
                                       const std::vector<ICalCalendar>& calendars) {
  std::vector<std::string> newOrder;
  for (const std::string& id : order) {
    if (liveCalendars.count(id) != 0 &&
        std::find(newOrder.begin(), newOrder.end(), id) == newOrder.end()) {
      newOrder.push_back(id);
    }
  }
  for (const ICalCalendar& calendar : calendars) {
    if (std::find(newOrder.begin(), newOrder.end(), calendar.identifier) == newOrder.end()) {
      newOrder.push_back(calendar.identifier);
    }
  }
  // Every calendar of truth is listed: those the order left out come last.
  for (const std::string& id : liveCalendars) {
    if (std::find(newOrder.begin(), newOrder.end(), id) == newOrder.end()) newOrder.push_back(id);
  }
  return newOrder;
}

}  // namespace

std::string calendarIdentifierForPath(const fs::path& path) {
  std::error_code error;
  fs::path absolute = fs::canonical(path, error);
  if (error) absolute = fs::absolute(path, error).lexically_normal();
  return "ical-" + stableHash(absolute.string());
}

std::vector<ICalCalendar> readICalendarPaths(const std::vector<fs::path>& paths,
                                             const std::optional<std::string>& title) {
  ImportWarnings strict(OnFault::Refuse);
  return readICalendarPaths(paths, title, strict);
}

std::vector<ICalCalendar> readICalendarPaths(const std::vector<fs::path>& paths,
                                             const std::optional<std::string>& title,
                                             ImportWarnings& warnings) {
  std::vector<ICalCalendar> calendars;
  std::set<std::string> seen;
  for (const fs::path& path : paths) {
    const std::string name = path.string();
    std::error_code error;
    const fs::file_status status = fs::status(path, error);
    ICalCalendarSource source;
    if (fs::is_directory(status)) {
      source = folderSource(path, name, title);
    } else if (fs::is_regular_file(status)) {
      source = fileSource(path, name, title);
    } else {
      throw ImportError(name, std::nullopt, "no such file or folder");
    }
    // The same calendar named twice is imported once.
    if (!seen.insert(source.identifier).second) continue;
    calendars.push_back(readICalCalendar(std::move(source), warnings));
  }
  return calendars;
}

ICalImportCounts writeICalCalendars(Store& store, const std::vector<ICalCalendar>& calendars,
                                    SyncDeletes syncDeletes) {
  std::vector<ICalCalendar> copies = calendars;
  return writeICalCalendars(store, copies, syncDeletes);
}

ICalImportCounts writeICalCalendars(Store& store, std::vector<ICalCalendar>& calendars,
                                    SyncDeletes syncDeletes) {
  StoredCalendars stored = storedCalendars(store, calendars);
  StoreChanges changes;
  std::size_t count = 0;
  for (const ICalCalendar& calendar : calendars) count += calendar.records.size();
  changes.put.reserve(count);
  for (ICalCalendar& calendar : calendars) {
    mergeCalendar(calendar, stored.records[calendar.identifier], syncDeletes, changes.put,
                  changes.remove);
  }
  for (const ICalCalendar& calendar : calendars) stored.live.insert(calendar.identifier);
  changes.calendarOrder = calendarOrder(stored.order, stored.live, calendars);

  // One transaction: an interrupted import leaves the store as it was.
  AppliedChanges applied = store.applyChanges(changes);
  ICalImportCounts counts;
  counts.written = applied.written;
  counts.deleted = applied.deleted;
  return counts;
}

}  // namespace tessel::importers
