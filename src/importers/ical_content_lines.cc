#include "importers/ical_content_lines.h"

#include <optional>
#include <utility>

#include "importers/import_error.h"
#include "importers/physical_lines.h"
#include "platform/ascii.h"
#include "platform/utf8.h"

namespace tessel::importers {

namespace {

using zt::platform::trimBlanks;
using zt::platform::upperAscii;

// Deeper nesting than any real calendar uses (VCALENDAR > VEVENT > VALARM, or VTIMEZONE >
// STANDARD) is refused before libical, whose parser and destructor recurse, ever sees it.
constexpr std::size_t kMaximumDepth = 8;

bool isNameCharacter(char c) {
  return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '-';
}

// Where the value starts: after the first colon that is not inside a quoted parameter value
// (RFC 5545 section 3.2 lets quoted values hold ":" and ";").
std::optional<std::size_t> valueStart(std::string_view line, std::size_t nameEnd) {
  bool quoted = false;
  for (std::size_t i = nameEnd; i < line.size(); ++i) {
    if (line[i] == '"') {
      quoted = !quoted;
    } else if (line[i] == ':' && !quoted) {
      return i + 1;
    }
  }
  return std::nullopt;
}

// A content line whose value is in quoted-printable and ends with a soft break.
bool endsWithQuotedPrintableSoftBreak(std::string_view line) {
  if (!line.ends_with('=')) return false;
  const std::string head = upperAscii(line.substr(0, line.find(':')));
  return head.find("QUOTED-PRINTABLE") != std::string::npos;
}

}  // namespace

std::vector<ICalContentLine> readICalContentLines(std::string_view text, const std::string& source,
                                                  ImportWarnings& warnings) {
  std::vector<ICalContentLine> lines;
  forEachICalContentLine(
      text, source, [&](ICalContentLine& line) { lines.push_back(std::move(line)); }, warnings);
  return lines;
}

void forEachICalContentLine(std::string_view text, const std::string& source,
                            const std::function<void(ICalContentLine&)>& visit,
                            ImportWarnings& warnings) {
  const auto fail = [&](std::size_t line, std::string reason) -> ImportError {
    return ImportError(source, line, std::move(reason));
  };
  const auto dropLine = [&](std::size_t line, std::string reason) {
    warnings.fault(fail(line, std::move(reason)), "dropped this line");
  };

  // A byte order mark is not part of the text (some Windows programs write one).
  if (text.substr(0, 3) == "\xEF\xBB\xBF") text.remove_prefix(3);

  struct Open {
    std::string name;
    std::size_t line;
    // A VCALENDAR that the file left out around its components.
    bool implied;
  };
  std::vector<Open> open;
  bool sawCalendar = false;
  std::optional<std::size_t> firstLine;
  // Inside a component that no calendar holds (a vCard pasted into a calendar file): its
  // depth, and the line of its BEGIN.
  std::size_t foreignDepth = 0;
  ICalContentLine out;

  const auto mark = [&](ICalContentLine::Kind kind, std::size_t number, const std::string& name) {
    out.kind = kind;
    out.line = number;
    out.name = name;
    out.text.clear();
    visit(out);
  };
  // Closes the innermost open component where the file did not: a fault, unless the file
  // only left out a VCALENDAR around its components.
  const auto closeInnermost = [&](const ImportError& fault, std::size_t number,
                                  std::string_view where = "here") {
    if (!open.back().implied) {
      warnings.fault(fault, "closed BEGIN:" + open.back().name + " " + std::string(where));
    }
    mark(ICalContentLine::Kind::End, number, open.back().name);
    open.pop_back();
  };

  // One line after unfolding, `number` being the line of the file on which it starts.
  const auto logical = [&](std::size_t number, std::string& unfolded) {
    if (!firstLine) firstLine = number;
    const std::string_view content = unfolded;
    // RFC 5545 section 3.1.4: the text is UTF-8. It is checked after unfolding, because
    // section 3.1 lets a fold fall inside a multi-octet character.
    for (std::size_t i = 0; i < content.size();) {
      if (content[i] == '\0') return dropLine(number, "a NUL byte is not iCalendar text");
      const std::size_t length = zt::platform::utf8::sequenceLength(content, i);
      if (length == 0) throw fail(number, "the text is not UTF-8");
      i += length;
    }
    if (trimBlanks(content).empty()) return;
    std::size_t nameEnd = 0;
    while (nameEnd < content.size() && isNameCharacter(content[nameEnd])) ++nameEnd;
    if (nameEnd == 0 || nameEnd == content.size() ||
        (content[nameEnd] != ':' && content[nameEnd] != ';')) {
      return dropLine(number, "not an iCalendar content line (NAME:value)");
    }
    const std::optional<std::size_t> value = valueStart(content, nameEnd);
    if (!value) return dropLine(number, "no ':' before the value");
    const std::string name = upperAscii(content.substr(0, nameEnd));

    if (name == "BEGIN" || name == "END") {
      const std::string component = upperAscii(trimBlanks(content.substr(*value)));
      if (component.empty()) return dropLine(number, name + " names no component");
      if (foreignDepth > 0) {
        foreignDepth += name == "BEGIN" ? 1 : -1;
        return;
      }
      if (name == "BEGIN") {
        if (open.empty() && component != "VCALENDAR") {
          // Some programs export events or tasks alone, as RFC 5545 section 3.6 shows them.
          if (component == "VEVENT" || component == "VTODO" || component == "VJOURNAL" ||
              component == "VTIMEZONE" || component == "VFREEBUSY") {
            sawCalendar = true;
            open.push_back({"VCALENDAR", number, true});
            mark(ICalContentLine::Kind::Begin, number, "VCALENDAR");
          } else {
            warnings.fault(fail(number, "BEGIN:" + component + " outside BEGIN:VCALENDAR"),
                           "dropped BEGIN:" + component + " and what it holds");
            foreignDepth = 1;
            return;
          }
        }
        if (!open.empty() && component == "VCALENDAR") {
          if (open.size() == 1 && open.back().implied) {
            closeInnermost(fail(number, ""), number);
          } else {
            const ImportError fault =
                fail(number, "BEGIN:VCALENDAR inside BEGIN:" + open.back().name);
            while (!open.empty()) closeInnermost(fault, number);
          }
        }
        if (open.size() == kMaximumDepth) throw fail(number, "components nest too deeply");
        sawCalendar = true;
        open.push_back({component, number, false});
        return mark(ICalContentLine::Kind::Begin, number, component);
      }
      if (open.empty()) return dropLine(number, "END:" + component + " without its BEGIN");
      if (open.back().name != component) {
        const ImportError fault =
            fail(number, "END:" + component + " where BEGIN:" + open.back().name + " of line " +
                             std::to_string(open.back().line) + " is still open");
        bool opened = false;
        for (const Open& each : open) opened = opened || each.name == component;
        if (!opened) return warnings.fault(fault, "dropped this line");
        while (open.back().name != component) closeInnermost(fault, number);
      }
      open.pop_back();
      return mark(ICalContentLine::Kind::End, number, component);
    }

    if (foreignDepth > 0) return;
    if (open.empty()) return dropLine(number, name + " outside BEGIN:VCALENDAR");
    // Diagnostics that libical wrote into a file it exported once are not data.
    if (name == "X-LIC-ERROR") return;
    // Exporters write empty values ("DESCRIPTION:") for fields the user left blank; they
    // say nothing, and libical would refuse them.
    if (trimBlanks(content.substr(*value)).empty()) return;
    out.kind = ICalContentLine::Kind::Property;
    out.line = number;
    out.name.assign(content.substr(0, nameEnd));
    out.text.swap(unfolded);
    visit(out);
  };

  // Unfold: a line that starts with a space or a tab continues the one before, without that
  // first character. vCalendar 1.0 values in quoted-printable also go on after a "=" that
  // ends a line (RFC 2045 section 6.7), on the next line as it is.
  std::string unfolded;
  std::optional<std::size_t> unfoldedLine;
  forEachPhysicalLine(text, [&](const PhysicalLine& line) {
    if (unfoldedLine && endsWithQuotedPrintableSoftBreak(unfolded)) {
      unfolded.pop_back();
      unfolded.append(line.text);
      return;
    }
    if (!line.text.empty() && (line.text.front() == ' ' || line.text.front() == '\t')) {
      if (!unfoldedLine) return dropLine(line.number, "a folded line continues nothing");
      unfolded.append(line.text.substr(1));
      return;
    }
    if (unfoldedLine) logical(*unfoldedLine, unfolded);
    unfoldedLine = line.number;
    unfolded.assign(line.text);
  });
  if (unfoldedLine) logical(*unfoldedLine, unfolded);

  while (!open.empty()) {
    const Open& last = open.back();
    closeInnermost(fail(last.line, "BEGIN:" + last.name + " is never closed by END:" + last.name),
                   unfoldedLine ? *unfoldedLine : 1, "at the end of the file");
  }
  if (!sawCalendar) {
    throw fail(firstLine ? *firstLine : 1, "no BEGIN:VCALENDAR: this is not an iCalendar file");
  }
}

}  // namespace tessel::importers
