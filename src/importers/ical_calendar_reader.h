#pragma once

#include <optional>
#include <string>
#include <vector>

#include "importers/import_warnings.h"
#include "tessel/record.h"

namespace tessel::importers {

// The text of one iCalendar file, under the name messages give it (the path as the user
// wrote it).
struct ICalFile {
  std::string name;
  std::string text;
};

// What becomes one calendar: one file, or every file of a vdir folder.
struct ICalCalendarSource {
  // The Calendar record's identifier; every record of the calendar gets an identifier that
  // starts with it and a "/".
  std::string identifier;
  std::vector<ICalFile> files;
  // A title the source fixes (a folder's); else the first X-WR-CALNAME of the files, else
  // `fallbackTitle`.
  std::optional<std::string> title;
  std::string fallbackTitle;
};

// One calendar read from its source, not yet written anywhere.
struct ICalCalendar {
  std::string identifier;
  std::string title;
  // The Calendar record first, then each event and task followed by its related records
  // (recurrences, alarms, organizer, attendees).
  std::vector<Record> records;
  std::size_t eventCount = 0;
  std::size_t taskCount = 0;
};

// Reads the VEVENT and VTODO components of the source's files into records of the calendars
// schema. Identifiers come from the calendar's identifier and each component's UID (and
// RECURRENCE-ID), so that reading the same source again gives the same identifiers. Each
// fault goes through `warnings`, naming its file and line: a value libical refuses or a date
// that does not exist drops its property, or its event or task when that is the start of an
// event or its RECURRENCE-ID; a time in a TZID that nothing defines is read as a floating
// time. The source is taken by value so that the text of each file is released once libical
// has read it.
ICalCalendar readICalCalendar(ICalCalendarSource source, ImportWarnings& warnings);
// The same, raising ImportError at the first fault.
ICalCalendar readICalCalendar(ICalCalendarSource source);

}  // namespace tessel::importers
