#pragma once

#include <cstddef>
#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include "importers/ical_calendar_reader.h"
#include "importers/import_error.h"
#include "tessel/store.h"
// SyncDeletes, which both importers take, is declared with the vCard importer.
#include "importers/import_options.h"

namespace tessel::importers {

// `tessel import ical`: iCalendar files and vdir folders into the calendars schema. Each
// path is one calendar: a file, or every *.ics file of a folder. Reading and writing are
// separate steps, so that every source is read and checked before the store is touched.

// A calendar of the store, as an import looks for it.
struct KnownCalendar {
  std::string identifier;
  std::string title;
};

std::vector<KnownCalendar> knownCalendars(const Store& store);

// What the command line says about the calendars of an import.
struct ICalImportTarget {
  // The title of every calendar the import reads, over what its files say.
  std::optional<std::string> title;
  // The identifier of the calendar of the store that every path goes into.
  std::optional<std::string> calendar;
};

// One path of an import, parsed: its files, and what its calendar's title may come from.
struct ICalPath {
  std::string name;  // the path as the user wrote it
  // The identifier that earlier versions gave the calendar of this path.
  std::string pathIdentifier;
  std::optional<std::string> sourceTitle;  // a folder's vdir "displayname" file
  std::string fallbackTitle;
  ICalParsedFiles files;
};

// Parses every path: a file, or every *.ics file of a folder. Needs no store. Faults go
// through `warnings` (parseICalFiles), which outlives the result; a path that is
// neither a file nor a folder, a folder without any .ics file, or a file that cannot be read
// or is not an iCalendar file raises ImportError.
std::vector<ICalPath> parseICalendarPaths(const std::vector<std::filesystem::path>& paths,
                                          ImportWarnings& warnings);

// Reads every path into its calendar.
//
// A calendar's title is `target.title`, else a folder's vdir "displayname" file, else the
// first X-WR-CALNAME of its files, else the file name without its extension (and without
// the " (1)" of a copy saved again) or the folder's name. Which calendar of `known` it is,
// so that a file downloaded again under another name or moved updates the same calendar:
// `target.calendar` (whose title it keeps unless `target.title` is given); else the calendar
// of its X-WR-RELCALID (the writer's own identifier of it); else the one of the same title,
// unless that one is of another X-WR-RELCALID; else a new one. Paths that are the same
// calendar are read together as one.
//
// Faults go through `warnings` (readICalCalendar); a title that more than one calendar of
// `known` has raises ImportError.
std::vector<ICalCalendar> readICalendarPaths(std::vector<ICalPath> paths,
                                             const ICalImportTarget& target,
                                             std::vector<KnownCalendar> known,
                                             ImportWarnings& warnings);
// parseICalendarPaths, then readICalendarPaths, raising ImportError at the first fault.
std::vector<ICalCalendar> readICalendarPaths(const std::vector<std::filesystem::path>& paths,
                                             const ICalImportTarget& target = {},
                                             std::vector<KnownCalendar> known = {});

struct ICalImportCounts {
  std::size_t written = 0;  // records added or changed
  std::size_t deleted = 0;
};

// Writes the calendars: their records replace the ones of the same identifiers, and the
// CalendarOrder record lists the new calendars after the ones it already holds (and drops
// calendars the store no longer has). Records of a calendar's events and tasks that its
// source no longer produces are deleted with SyncDeletes::On; with Off, events and tasks
// that left the source stay in their calendar, and only the related records (alarms,
// attendees, ...) that their re-imported events no longer list are deleted. Either way only
// the records the importer made in that calendar are concerned: events and tasks that a
// calendar lists and that came otherwise stay listed.
// This one moves the records out of `calendars` into the store's transaction, so that they
// are not held twice; the identifiers, titles and counts stay, for the report.
ICalImportCounts writeICalCalendars(Store& store, std::vector<ICalCalendar>& calendars,
                                    SyncDeletes syncDeletes);
// This one writes copies of the records.
ICalImportCounts writeICalCalendars(Store& store, const std::vector<ICalCalendar>& calendars,
                                    SyncDeletes syncDeletes);

}  // namespace tessel::importers
