#pragma once

#include <cstddef>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

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
// say, inside VCALENDAR objects. Lines that hold nothing (blank lines, properties with an
// empty value, libical's own X-LIC-ERROR remarks) are left out. Raises ImportError naming
// `source` and the line of the first fault.
std::vector<ICalContentLine> readICalContentLines(std::string_view text, const std::string& source);

// The same content lines, handed to `visit` one by one as they are read, so that no copy of
// the whole text is held. The faults are the same, raised when the reading reaches them:
// `visit` has then seen the lines before the fault.
void forEachICalContentLine(std::string_view text, const std::string& source,
                            const std::function<void(ICalContentLine&)>& visit);

}  // namespace tessel::importers
