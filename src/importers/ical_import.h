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
// path becomes one calendar: a file, or every *.ics file of a folder. Reading and writing
// are separate steps, so that every source is read and checked before the store is touched.

// Reads every path into its calendar. A file's calendar is named by its X-WR-CALNAME, else
// `title`, else the file name without its extension; a folder's by its vdir "displayname"
// file, else `title`, else the folder's name. Faults go through `warnings`
// (readICalCalendar); a path that is neither a file nor a folder, or a file that cannot be
// read or is not an iCalendar file, raises ImportError.
std::vector<ICalCalendar> readICalendarPaths(const std::vector<std::filesystem::path>& paths,
                                             const std::optional<std::string>& title,
                                             ImportWarnings& warnings);
// The same, raising ImportError at the first fault of any file.
std::vector<ICalCalendar> readICalendarPaths(const std::vector<std::filesystem::path>& paths,
                                             const std::optional<std::string>& title);

// The identifier of the calendar a file or folder becomes; it depends on the path alone, so
// importing the same path again updates the same calendar.
std::string calendarIdentifierForPath(const std::filesystem::path& path);

struct ICalImportCounts {
  std::size_t written = 0;  // records added or changed
  std::size_t deleted = 0;
};

// Writes the calendars: their records replace the ones of the same identifiers, and the
// CalendarOrder record lists the new calendars after the ones it already holds (and drops
// calendars the store no longer has). Records a calendar had and its source no longer
// produces are deleted with SyncDeletes::On; with Off, events and tasks that left the
// source stay in their calendar, and only the related records (alarms, attendees, ...) that
// their re-imported events no longer list are deleted.
// This one moves the records out of `calendars` into the store's transaction, so that they
// are not held twice; the identifiers, titles and counts stay, for the report.
ICalImportCounts writeICalCalendars(Store& store, std::vector<ICalCalendar>& calendars,
                                    SyncDeletes syncDeletes);
// This one writes copies of the records.
ICalImportCounts writeICalCalendars(Store& store, const std::vector<ICalCalendar>& calendars,
                                    SyncDeletes syncDeletes);

}  // namespace tessel::importers
