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

}  // namespace

std::vector<ICalContentLine> readICalContentLines(std::string_view text,
                                                  const std::string& source) {
  std::vector<ICalContentLine> lines;
  forEachICalContentLine(text, source,
                         [&](ICalContentLine& line) { lines.push_back(std::move(line)); });
  return lines;
}

void forEachICalContentLine(std::string_view text, const std::string& source,
                            const std::function<void(ICalContentLine&)>& visit) {
  const auto fail = [&](std::size_t line, std::string reason) -> ImportError {
    return ImportError(source, line, std::move(reason));
  };

  // A byte order mark is not part of the text (some Windows programs write one).
  if (text.substr(0, 3) == "\xEF\xBB\xBF") text.remove_prefix(3);

  struct Open {
    std::string name;
    std::size_t line;
  };
  std::vector<Open> open;
  bool sawCalendar = false;
  std::optional<std::size_t> firstLine;
  ICalContentLine out;

  // One line after unfolding, `number` being the line of the file on which it starts.
  const auto logical = [&](std::size_t number, std::string& unfolded) {
    if (!firstLine) firstLine = number;
    const std::string_view content = unfolded;
    // RFC 5545 section 3.1.4: the text is UTF-8. It is checked after unfolding, because
    // section 3.1 lets a fold fall inside a multi-octet character.
    for (std::size_t i = 0; i < content.size();) {
      if (content[i] == '\0') throw fail(number, "a NUL byte is not iCalendar text");
      const std::size_t length = zt::platform::utf8::sequenceLength(content, i);
      if (length == 0) throw fail(number, "the text is not UTF-8");
      i += length;
    }
    if (trimBlanks(content).empty()) return;
    std::size_t nameEnd = 0;
    while (nameEnd < content.size() && isNameCharacter(content[nameEnd])) ++nameEnd;
    if (nameEnd == 0 || nameEnd == content.size() ||
        (content[nameEnd] != ':' && content[nameEnd] != ';')) {
      throw fail(number, "not an iCalendar content line (NAME:value)");
    }
    const std::optional<std::size_t> value = valueStart(content, nameEnd);
    if (!value) throw fail(number, "no ':' before the value");
    const std::string name = upperAscii(content.substr(0, nameEnd));

    if (name == "BEGIN" || name == "END") {
      const std::string component = upperAscii(trimBlanks(content.substr(*value)));
      if (component.empty()) throw fail(number, name + " names no component");
      if (name == "BEGIN") {
        if (open.empty() && component != "VCALENDAR") {
          throw fail(number, "BEGIN:" + component + " outside BEGIN:VCALENDAR");
        }
        if (!open.empty() && component == "VCALENDAR") {
          throw fail(number, "BEGIN:VCALENDAR inside BEGIN:" + open.back().name);
        }
        if (open.size() == kMaximumDepth) throw fail(number, "components nest too deeply");
        sawCalendar = true;
        open.push_back({component, number});
        out.kind = ICalContentLine::Kind::Begin;
      } else {
        if (open.empty()) throw fail(number, "END:" + component + " without its BEGIN");
        if (open.back().name != component) {
          throw fail(number, "END:" + component + " where BEGIN:" + open.back().name + " of line " +
                                 std::to_string(open.back().line) + " is still open");
        }
        open.pop_back();
        out.kind = ICalContentLine::Kind::End;
      }
      out.line = number;
      out.name = component;
      out.text.clear();
      visit(out);
      return;
    }

    if (open.empty()) throw fail(number, name + " outside BEGIN:VCALENDAR");
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
  // first character.
  std::string unfolded;
  std::optional<std::size_t> unfoldedLine;
  forEachPhysicalLine(text, [&](const PhysicalLine& line) {
    if (!line.text.empty() && (line.text.front() == ' ' || line.text.front() == '\t')) {
      if (!unfoldedLine) throw fail(line.number, "a folded line continues nothing");
      unfolded.append(line.text.substr(1));
      return;
    }
    if (unfoldedLine) logical(*unfoldedLine, unfolded);
    unfoldedLine = line.number;
    unfolded.assign(line.text);
  });
  if (unfoldedLine) logical(*unfoldedLine, unfolded);

  if (!open.empty()) {
    throw fail(open.back().line,
               "BEGIN:" + open.back().name + " is never closed by END:" + open.back().name);
  }
  if (!sawCalendar) {
    throw fail(firstLine ? *firstLine : 1, "no BEGIN:VCALENDAR: this is not an iCalendar file");
  }
}

}  // namespace tessel::importers
