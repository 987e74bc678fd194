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

// The files of one path: the file, or every *.ics file of a folder in name order (folder
// order is the file system's).
std::vector<ICalFile> filesOf(const fs::path& path, const std::string& name) {
  std::error_code error;
  const fs::file_status status = fs::status(path, error);
  if (fs::is_regular_file(status)) return {{name, readImportFile(path, name)}};
  if (!fs::is_directory(status)) throw ImportError(name, std::nullopt, "no such file or folder");
  std::vector<fs::path> paths;
  for (fs::directory_iterator it(path, error), end; !error && it != end; it.increment(error)) {
    if (!it->is_regular_file(error)) continue;
    if (zt::platform::lowerAscii(it->path().extension().string()) == ".ics")
      paths.push_back(it->path());
  }
  if (error) throw ImportError(name, std::nullopt, "cannot list the folder: " + error.message());
  // An empty calendar from a mistyped folder would hide the mistake, and with
  // --sync-deletes empty the calendar.
  if (paths.empty()) throw ImportError(name, std::nullopt, "no .ics file in this folder");
  std::sort(paths.begin(), paths.end());
  std::vector<ICalFile> files;
  for (const fs::path& file : paths) {
    const std::string fileName = (fs::path(name) / file.filename()).string();
    files.push_back({fileName, readImportFile(file, fileName)});
  }
  return files;
}

// Browsers and file managers save a file downloaded again as "work (1).ics": the calendar
// is still "work".
std::string withoutCopyNumber(std::string stem) {
  if (stem.size() < 4 || stem.back() != ')') return stem;
  std::size_t open = stem.size() - 2;
  while (open > 0 && stem[open] >= '0' && stem[open] <= '9') --open;
  if (open + 2 < stem.size() && open > 1 && stem[open] == '(' && stem[open - 1] == ' ')
    stem.erase(open - 1);
  return stem;
}

// The identifier that earlier versions gave the calendar of a file or folder, from its path
// alone: a file downloaded again or moved became another calendar.
std::string calendarIdentifierForPath(const fs::path& path) {
  std::error_code error;
  fs::path absolute = fs::canonical(path, error);
  if (error) absolute = fs::absolute(path, error).lexically_normal();
  return "ical-" + stableHash(absolute.string());
}

// The identifier a calendar gets from its writer's X-WR-RELCALID; no other calendar has
// identifiers of this form.
constexpr std::string_view kRelatedPrefix = "ical-rel-";

// Which calendar of `known` a path of this title and labels is, else the identifier of a new
// one. `pathIdentifier` is the identifier that earlier versions gave a path: of several
// calendars of one title, the one that this path made comes first, and without any of the
// title that one is still found.
std::string calendarIdentifier(const ICalCalendarLabels& labels, const std::string& title,
                               const std::string& pathIdentifier,
                               const std::vector<KnownCalendar>& known, const std::string& name) {
  const std::string related =
      labels.relationId ? std::string(kRelatedPrefix) + stableHash(*labels.relationId) : "";
  const std::string titled = "ical-" + stableHash("title:" + title);
  const auto isKnown = [&](const std::string& identifier) {
    return std::any_of(known.begin(), known.end(),
                       [&](const KnownCalendar& k) { return k.identifier == identifier; });
  };
  if (!related.empty() && isKnown(related)) return related;
  std::vector<std::string> matches;
  for (const KnownCalendar& calendar : known) {
    // A calendar that its writer identifies otherwise is another one of the same title.
    if (!related.empty() && calendar.identifier.starts_with(kRelatedPrefix)) continue;
    if (calendar.title == title) matches.push_back(calendar.identifier);
  }
  // A calendar that an earlier version made of this very path, whose title is no longer the
  // one the file gives (the file names of copies, " (1)", make no title now).
  if (matches.empty() && isKnown(pathIdentifier)) return pathIdentifier;
  if (matches.empty()) return related.empty() ? titled : related;
  for (const std::string& preferred : {pathIdentifier, related, titled}) {
    if (std::find(matches.begin(), matches.end(), preferred) != matches.end()) return preferred;
  }
  if (matches.size() == 1) return matches.front();
  std::string listed;
  for (const std::string& identifier : matches) listed += (listed.empty() ? "" : ", ") + identifier;
  throw ImportError(name, std::nullopt,
                    std::to_string(matches.size()) + " calendars of the store are titled \"" +
                        title + "\" (" + listed + "): name one with --calendar");
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

// Whether the importer made `id` as an event or task of `calendar`, or as a record that one
// of them lists.
bool madeByImport(std::string_view id, std::string_view calendar) {
  if (id.size() <= calendar.size() || !id.starts_with(calendar)) return false;
  id.remove_prefix(calendar.size());
  return id.starts_with("/event/") || id.starts_with("/task/");
}

// What the store holds now of the calendars an import writes.
struct StoredCalendars {
  // The records the importer made in each calendar.
  std::map<std::string, RecordMap, std::less<>> records;
  // The Calendar record of each calendar that exists.
  std::map<std::string, Dictionary> calendars;
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
    if (name != nullptr && *name == TesselEntity_Calendars_Calendar) {
      stored.live.insert(record.id);
      if (stored.records.count(record.id) != 0) stored.calendars.emplace(record.id, record.record);
    }
    if (name != nullptr && *name == TesselEntity_Calendars_CalendarOrder && stored.order.empty()) {
      appendStrings(record.record.find(TesselRelationship_Calendars_CalendarOrder_Calendars),
                    stored.order);
    }
    // The calendar is the part before "/event/" or "/task/", which a calendar identifier
    // may hold itself.
    for (std::size_t at = record.id.find('/'); at != std::string::npos;
         at = record.id.find('/', at + 1)) {
      const auto found = stored.records.find(std::string_view(record.id).substr(0, at));
      if (found != stored.records.end() && madeByImport(record.id, found->first)) {
        found->second.emplace(record.id, record.record);
        break;
      }
    }
  });
  return stored;
}

// Adds to `records` what one calendar puts, and to `stale` what it deletes of the records the
// store held of it (`before`, and its Calendar record `calendarBefore`).
// The calendar's records are moved into `records`.
void mergeCalendar(ICalCalendar& calendar, const RecordMap& before,
                   const Dictionary* calendarBefore, SyncDeletes syncDeletes,
                   std::vector<Record>& records, std::vector<std::string>& stale) {
  // Views of the records' identifiers, used before the records are moved out below.
  std::unordered_set<std::string_view> produced;
  produced.reserve(calendar.records.size());
  for (const Record& record : calendar.records) produced.insert(record.id);

  std::vector<Record>& written = calendar.records;
  Dictionary& calendarRecord = written.front().record;
  const auto extend = [&](std::string_view key, const std::vector<std::string>& ids) {
    if (ids.empty()) return;
    Array list = *calendarRecord.arrayAt(key);
    for (const std::string& id : ids) list.emplace_back(id);
    calendarRecord.set(key, Value(std::move(list)));
  };
  // Events and tasks that the calendar lists and the importer did not make (put there by
  // hand, or by another program) are not the import's to drop.
  if (calendarBefore != nullptr) {
    for (std::string_view key : {TesselRelationship_Calendars_Calendar_Events,
                                 TesselRelationship_Calendars_Calendar_Tasks}) {
      std::vector<std::string> others;
      for (std::string& id : zt::platform::stringsIn(calendarBefore->find(key))) {
        if (!madeByImport(id, calendar.identifier)) others.push_back(std::move(id));
      }
      extend(key, others);
    }
  }
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

std::vector<KnownCalendar> knownCalendars(const Store& store) {
  std::vector<KnownCalendar> known;
  store.forEachRecord(
      [&](const Record& record) {
        const std::string* title = record.record.stringAt(TesselAttribute_Calendars_Calendar_Title);
        known.push_back({record.id, title != nullptr ? *title : std::string()});
      },
      TesselEntity_Calendars_Calendar);
  return known;
}

std::vector<ICalPath> parseICalendarPaths(const std::vector<fs::path>& paths,
                                          ImportWarnings& warnings) {
  std::vector<ICalPath> parsed;
  std::set<std::string> seen;
  for (const fs::path& path : paths) {
    ICalPath one;
    one.name = path.string();
    // The same file or folder named twice is read once.
    one.pathIdentifier = calendarIdentifierForPath(path);
    if (!seen.insert(one.pathIdentifier).second) continue;
    one.files = parseICalFiles(filesOf(path, one.name), warnings);
    std::error_code error;
    if (fs::is_directory(path, error)) {
      one.sourceTitle = vdirDisplayName(path);
      fs::path named = fs::canonical(path, error);
      if (error) named = path;
      one.fallbackTitle = named.filename().string();
    } else {
      one.fallbackTitle = withoutCopyNumber(path.stem().string());
    }
    parsed.push_back(std::move(one));
  }
  return parsed;
}

std::vector<ICalCalendar> readICalendarPaths(std::vector<ICalPath> paths,
                                             const ICalImportTarget& target,
                                             std::vector<KnownCalendar> known,
                                             ImportWarnings& warnings) {
  struct Pending {
    std::string identifier;
    std::string title;
    ICalParsedFiles files;
  };
  std::vector<Pending> pending;
  for (ICalPath& path : paths) {
    std::optional<std::string> title = target.title;
    std::string identifier;
    if (target.calendar) {
      // The calendar named outright keeps its title unless --title changes it.
      identifier = *target.calendar;
      for (const KnownCalendar& calendar : known) {
        if (!title && calendar.identifier == identifier) title = calendar.title;
      }
    }
    if (!title) title = path.sourceTitle;
    if (!title) title = path.files.labels.name;
    if (!title) title = path.fallbackTitle;
    if (!target.calendar) {
      identifier =
          calendarIdentifier(path.files.labels, *title, path.pathIdentifier, known, path.name);
    }

    const auto same = std::find_if(pending.begin(), pending.end(),
                                   [&](const Pending& p) { return p.identifier == identifier; });
    if (same != pending.end()) {
      for (ICalReadItem& item : path.files.items) same->files.items.push_back(std::move(item));
      continue;
    }
    if (std::none_of(known.begin(), known.end(),
                     [&](const KnownCalendar& k) { return k.identifier == identifier; })) {
      known.push_back({identifier, *title});
    }
    pending.push_back({std::move(identifier), std::move(*title), std::move(path.files)});
  }
  paths.clear();
  std::vector<ICalCalendar> calendars;
  calendars.reserve(pending.size());
  for (Pending& calendar : pending) {
    calendars.push_back(readICalCalendar(std::move(calendar.files), std::move(calendar.identifier),
                                         std::move(calendar.title), warnings));
  }
  return calendars;
}

std::vector<ICalCalendar> readICalendarPaths(const std::vector<fs::path>& paths,
                                             const ICalImportTarget& target,
                                             std::vector<KnownCalendar> known) {
  ImportWarnings strict(OnFault::Refuse);
  return readICalendarPaths(parseICalendarPaths(paths, strict), target, std::move(known), strict);
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
    const auto before = stored.calendars.find(calendar.identifier);
    mergeCalendar(calendar, stored.records[calendar.identifier],
                  before != stored.calendars.end() ? &before->second : nullptr, syncDeletes,
                  changes.put, changes.remove);
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
