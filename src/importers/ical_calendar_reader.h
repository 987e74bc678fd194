#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "importers/ical_document.h"
#include "importers/import_warnings.h"
#include "platform/value.h"
#include "tessel/record.h"

namespace tessel::importers {

// The text of one iCalendar file, under the name messages give it (the path as the user
// wrote it).
struct ICalFile {
  std::string name;
  std::string text;
};

// What a calendar's files say about the calendar itself, in the X-WR- properties that
// Apple, Google and Outlook write into the VCALENDAR: the first of each.
struct ICalCalendarLabels {
  std::optional<std::string> name;        // X-WR-CALNAME
  std::optional<std::string> relationId;  // X-WR-RELCALID, the writer's identifier of it
};

// One VEVENT or VTODO of a calendar's files, read into records before the calendar's
// identifier is known: the identifiers it holds are what follows the calendar's.
struct ICalReadItem {
  bool event = true;
  std::string uid;
  bool overrides = false;  // it has a RECURRENCE-ID
  // Its identifier after the calendar's; none for one whose RECURRENCE-ID is unreadable,
  // which is dropped.
  std::optional<std::string> key;
  // What it says, for telling a second component with its UID from a copy of it.
  std::string contentHash;
  std::string source;
  std::optional<std::size_t> uidLine;
  // The faults and notes met while it was identified, then while it became records.
  ImportWarnings identifying{OnFault::Skip};
  ImportWarnings reading{OnFault::Skip};
  bool dropped = false;
  // Its record without the relationships, and its sub-records, each after the item's
  // identifier and listed in the relationship of its kind.
  zt::platform::Dictionary record;
  std::vector<std::pair<std::string, zt::platform::Dictionary>> related;
  std::vector<std::string> recurrences, audioAlarms, mailAlarms, displayAlarms, organizer,
      attendees;
};

// The files of one calendar read into records, kept until the calendar's identifier is
// known.
struct ICalParsedFiles {
  std::vector<ICalReadItem> items;
  ICalCalendarLabels labels;
};

// Reads the files, releasing the text of each once it is read. The faults of the text and
// of libical's reading go through `warnings` (ICalDocument::read) file by file; those of
// each item are reported by readICalCalendar.
ICalParsedFiles parseICalFiles(std::vector<ICalFile> files, ImportWarnings& warnings);

// One calendar read from its files, not yet written anywhere.
struct ICalCalendar {
  std::string identifier;
  std::string title;
  // The Calendar record first, then each event and task followed by its related records
  // (recurrences, alarms, organizer, attendees).
  std::vector<Record> records;
  std::size_t eventCount = 0;
  std::size_t taskCount = 0;
};

// Reads the VEVENT and VTODO components of the files into records of the calendars schema,
// for the Calendar record `identifier` titled `title`. Every record of the calendar gets an
// identifier that starts with the calendar's and a "/", then comes from the component's UID
// (and RECURRENCE-ID), so that reading the same files again gives the same identifiers. A
// component without UID is known by what it says; a second component with the UID of
// another (and no RECURRENCE-ID) is kept as a copy of its own, with a warning. Each fault
// goes through `warnings`, naming its file and line: a value libical refuses
// or a date that does not exist drops its property, or its event or task when that is the
// start of an event or its RECURRENCE-ID; a time in a TZID that nothing defines is read as
// a floating time.
ICalCalendar readICalCalendar(ICalParsedFiles files, std::string identifier, std::string title,
                              ImportWarnings& warnings);

// What becomes one calendar, for readers without a store: its identifier and files, and a
// title the source fixes, else the files' X-WR-CALNAME, else `fallbackTitle`.
struct ICalCalendarSource {
  std::string identifier;
  std::vector<ICalFile> files;
  std::optional<std::string> title;
  std::string fallbackTitle;
};

// parseICalFiles and readICalCalendar in one step, each fault through `warnings`.
ICalCalendar readICalCalendar(ICalCalendarSource source, ImportWarnings& warnings);
// The same, raising ImportError at the first fault.
ICalCalendar readICalCalendar(ICalCalendarSource source);

}  // namespace tessel::importers
