// Fuzzes the iCalendar import over arbitrary bytes: the line checks, libical's parse, the
// time zones and every value read into records, both refusing faults and stepping over them
// with warnings. A malformed input must end in ImportError or warnings, never in a crash, a
// leak or another exception.
#include <cstddef>
#include <cstdint>
#include <set>
#include <string>

#include "importers/ical_calendar_reader.h"
#include "importers/import_error.h"
#include "importers/import_kind.h"

namespace {

using tessel::importers::OnFault;

void readAndCheck(const std::string& text, OnFault onFault) {
  tessel::importers::ICalCalendarSource source;
  source.identifier = "fuzz";
  source.files.push_back({"fuzz.ics", text});
  source.fallbackTitle = "Fuzz";
  tessel::importers::ImportWarnings warnings(onFault);
  tessel::importers::ICalCalendar calendar;
  try {
    calendar = tessel::importers::readICalCalendar(source, warnings);
  } catch (const tessel::importers::ImportError& e) {
    // Every fault inside a file names its line; only a file of another kind has none.
    const tessel::importers::ImportKind kind = tessel::importers::importKindOf(text);
    if (!e.line() && (kind == tessel::importers::ImportKind::ICalendar ||
                      kind == tessel::importers::ImportKind::Unknown)) {
      __builtin_trap();
    }
    return;
  }
  // The calendar comes first; every record is of it, names its entity, and no two share an
  // identifier (a UID must not be able to forge another record's).
  if (calendar.records.empty() || calendar.records.front().id != "fuzz") __builtin_trap();
  std::set<std::string> identifiers;
  for (const tessel::Record& record : calendar.records) {
    if (record.record.empty() || !identifiers.insert(record.id).second) __builtin_trap();
    if (record.id != "fuzz" && record.id.rfind("fuzz/", 0) != 0) __builtin_trap();
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string text(reinterpret_cast<const char*>(data), size);
  readAndCheck(text, OnFault::Refuse);
  readAndCheck(text, OnFault::Skip);
  return 0;
}
