// Fuzzes the iCalendar import over arbitrary bytes: the line checks, libical's parse, the
// time zones and every value read into records. A malformed input must end in ImportError,
// never in a crash, a leak or another exception.
#include <cstddef>
#include <cstdint>
#include <set>
#include <string>

#include "importers/ical_calendar_reader.h"
#include "importers/import_error.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  tessel::importers::ICalCalendarSource source;
  source.identifier = "fuzz";
  source.files.push_back({"fuzz.ics", std::string(reinterpret_cast<const char*>(data), size)});
  source.fallbackTitle = "Fuzz";
  tessel::importers::ICalCalendar calendar;
  try {
    calendar = tessel::importers::readICalCalendar(source);
  } catch (const tessel::importers::ImportError& e) {
    // Every fault inside a file names its line.
    if (!e.line()) __builtin_trap();
    return 0;
  }
  // The calendar comes first; every record is of it, names its entity, and no two share an
  // identifier (a UID must not be able to forge another record's).
  if (calendar.records.empty() || calendar.records.front().id != "fuzz") __builtin_trap();
  std::set<std::string> identifiers;
  for (const tessel::Record& record : calendar.records) {
    if (record.record.empty() || !identifiers.insert(record.id).second) __builtin_trap();
    if (record.id != "fuzz" && record.id.rfind("fuzz/", 0) != 0) __builtin_trap();
  }
  return 0;
}
