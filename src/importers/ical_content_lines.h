#pragma once

#include <cstddef>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "importers/import_warnings.h"

namespace tessel::importers {

// One content line of an iCalendar file after unfolding, with the 1-based line of the file on
// which it starts, so that every later message can point at the line the user sees.
struct ICalContentLine {
  enum class Kind { Begin, End, Property };

  Kind kind = Kind::Property;
  std::size_t line = 0;
  // Begin and End: the component name in upper case ("VEVENT"). Property: the property
  // name as written.
  std::string name;
  // Property: the whole unfolded line as written. Begin and End: empty.
  std::string text;
};

// Reads the text of one iCalendar file into its content lines: checks that it is UTF-8,
// unfolds it (RFC 5545 section 3.1), and checks that its components nest as BEGIN and END
// say, inside VCALENDAR objects. Events, tasks and zones that a file holds without a
// VCALENDAR around them are read as if it were there. Lines that hold nothing (blank lines,
// properties with an empty value, libical's own X-LIC-ERROR remarks) are left out.
// Each fault goes through `warnings` when the reading reaches it (`visit` has then seen the
// lines before it): a line that is no content line, or that stands outside any component,
// is left out; an END that closes nothing is left out, and components that the file leaves
// open are closed where their parent or the file ends. Text that is not UTF-8, too deep a
// nesting and a file without any component raise ImportError naming `source` and the line.
void forEachICalContentLine(std::string_view text, const std::string& source,
                            const std::function<void(ICalContentLine&)>& visit,
                            ImportWarnings& warnings);

// The content lines of forEachICalContentLine in one list.
std::vector<ICalContentLine> readICalContentLines(std::string_view text, const std::string& source,
                                                  ImportWarnings& warnings);

}  // namespace tessel::importers
