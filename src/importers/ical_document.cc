#include "importers/ical_document.h"

#include <libical/ical.h>

#include <algorithm>
#include <charconv>
#include <cstdlib>
#include <map>
#include <memory>
#include <set>
#include <tuple>
#include <vector>

#include "importers/ical_content_lines.h"
#include "importers/ical_time_zones.h"
#include "importers/ical_vcalendar.h"
#include "importers/import_kind.h"
#include "importers/physical_lines.h"
#include "importers/vcard_decoding.h"
#include "platform/ascii.h"
#include "platform/utf8.h"

namespace tessel::importers {

namespace {

// The parameter (on properties) and the property (first in each component) through which
// the importer hands line numbers through libical. Input that uses these names itself has
// them replaced: they are never data.
constexpr const char* kLineName = "X-TESSEL-IMPORT-LINE";

struct FreeText {
  void operator()(char* text) const { std::free(text); }
};
using OwnedText = std::unique_ptr<char, FreeText>;

struct FreeComponent {
  void operator()(icalcomponent* component) const { icalcomponent_free(component); }
};
using OwnedComponent = std::unique_ptr<icalcomponent, FreeComponent>;

std::optional<std::size_t> parseLineNumber(const char* text) {
  if (text == nullptr) return std::nullopt;
  const std::string_view digits(text);
  std::size_t number = 0;
  auto [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), number);
  if (error != std::errc() || end != digits.data() + digits.size()) return std::nullopt;
  return number;
}

// The text of the first X-LIC-ERROR that libical added to `component` or anything inside it,
// with the component it was found in.
icalproperty* firstError(icalcomponent* component, icalcomponent** where) {
  if (icalproperty* error = icalcomponent_get_first_property(component, ICAL_XLICERROR_PROPERTY)) {
    *where = component;
    return error;
  }
  for (icalcompiter it = icalcomponent_begin_component(component, ICAL_ANY_COMPONENT);
       icalcompiter_deref(&it) != nullptr; icalcompiter_next(&it)) {
    if (icalproperty* error = firstError(icalcompiter_deref(&it), where)) return error;
  }
  return nullptr;
}

std::string errorText(icalproperty* error) {
  const char* text = icalproperty_get_xlicerror(error);
  if (text == nullptr || *text == '\0') return "libical refused it";
  // libical says what it does with a property it cannot read; the import says it in its
  // own words.
  std::string message(text);
  constexpr std::string_view kRemoving = ". Removing entire property";
  if (const std::size_t at = message.find(kRemoving); at != std::string::npos) {
    message.erase(at, kRemoving.size());
  }
  return message;
}

// Parses one content line inside an empty VCALENDAR, the way libical reads it in the whole
// file, and answers libical's complaint about it, if any.
std::optional<std::string> complaintAbout(const std::string& line) {
  const std::string text = "BEGIN:VCALENDAR\r\n" + line + "\r\nEND:VCALENDAR\r\n";
  OwnedComponent calendar(icalparser_parse_string(text.c_str()));
  if (!calendar) return std::string("libical cannot read it");
  icalcomponent* where = nullptr;
  if (icalproperty* error = firstError(calendar.get(), &where)) return errorText(error);
  return std::nullopt;
}

// The line as libical gets it: with the line number as a parameter right after the name, so
// that it stays with the property (also when libical splits one line of several values, such
// as "EXDATE:a,b", into several properties).
std::string taggedLine(const ICalContentLine& line) {
  std::string tagged = line.name;
  tagged += ';';
  tagged += kLineName;
  tagged += '=';
  tagged += std::to_string(line.line);
  tagged.append(line.text, line.name.size());
  return tagged;
}

// Whether a VERSION line says vCalendar 1.0 (true) or another version (false); none for
// other lines.
std::optional<bool> isVCalendarVersion(const ICalContentLine& line) {
  if (zt::platform::upperAscii(line.name) != "VERSION") return std::nullopt;
  const std::size_t colon = line.text.find(':');
  if (colon == std::string::npos) return std::nullopt;
  return zt::platform::trimBlanks(std::string_view(line.text).substr(colon + 1)) == "1.0";
}

bool isLineTag(const std::string& name) {
  return zt::platform::upperAscii(name) == kLineName;
}

// libical's parser fed one unfolded line at a time, gathering what it completes as
// icalparser_parse_string does: one VCALENDAR, or several under an XROOT component.
class LineParser {
 public:
  LineParser()
      : parser_(icalparser_new()), malformed_(icalerror_get_error_state(ICAL_MALFORMEDDATA_ERROR)) {
    icalerror_set_error_state(ICAL_MALFORMEDDATA_ERROR, ICAL_ERROR_NONFATAL);
  }
  ~LineParser() {
    icalerror_set_error_state(ICAL_MALFORMEDDATA_ERROR, malformed_);
    icalparser_free(parser_);
  }
  LineParser(const LineParser&) = delete;
  LineParser& operator=(const LineParser&) = delete;

  void add(std::string& line) {
    OwnedComponent done(icalparser_add_line(parser_, line.data()));
    if (!done) return;
    if (!root_) {
      root_ = std::move(done);
    } else {
      if (icalcomponent_isa(root_.get()) != ICAL_XROOT_COMPONENT) {
        OwnedComponent xroot(icalcomponent_new(ICAL_XROOT_COMPONENT));
        icalcomponent_add_component(xroot.get(), root_.release());
        root_ = std::move(xroot);
      }
      icalcomponent_add_component(root_.get(), done.release());
    }
  }
  void add(std::string&& line) { add(line); }

  OwnedComponent root() { return std::move(root_); }

 private:
  icalparser* parser_;
  icalerrorstate malformed_;
  OwnedComponent root_;
};

// Every X-LIC-ERROR that libical added, with the component it stands in.
void collectErrors(icalcomponent* component,
                   std::vector<std::pair<icalcomponent*, icalproperty*>>& errors) {
  for (icalproperty* error = icalcomponent_get_first_property(component, ICAL_XLICERROR_PROPERTY);
       error != nullptr;
       error = icalcomponent_get_next_property(component, ICAL_XLICERROR_PROPERTY)) {
    errors.emplace_back(component, error);
  }
  for (icalcompiter it = icalcomponent_begin_component(component, ICAL_ANY_COMPONENT);
       icalcompiter_deref(&it) != nullptr; icalcompiter_next(&it)) {
    collectErrors(icalcompiter_deref(&it), errors);
  }
}

bool hasErrors(icalcomponent* component) {
  icalcomponent* where = nullptr;
  return firstError(component, &where) != nullptr;
}

// Every component by the line of its BEGIN. A VCALENDAR that the file left out shares its
// line with the first component it holds, which is the one meant.
void componentsByLine(icalcomponent* component, std::map<std::size_t, icalcomponent*>& byLine) {
  if (std::optional<std::size_t> line = ICalDocument::lineOf(component)) {
    byLine.insert_or_assign(*line, component);
  }
  for (icalcompiter it = icalcomponent_begin_component(component, ICAL_ANY_COMPONENT);
       icalcompiter_deref(&it) != nullptr; icalcompiter_next(&it)) {
    componentsByLine(icalcompiter_deref(&it), byLine);
  }
}

// A content line kept until the component it belongs to is complete, with whether it was read
// as vCalendar 1.0.
struct HeldLine {
  ICalContentLine line;
  bool vCalendar = false;
};

// The lines of one component (or of a calendar's properties and time zones), in buffers that
// are reused from one component to the next.
class HeldLines {
 public:
  void clear() { size_ = 0; }
  // Takes the text out of `line`.
  const HeldLine& add(ICalContentLine& line, bool vCalendar) {
    if (size_ == lines_.size()) lines_.emplace_back();
    HeldLine& held = lines_[size_++];
    held.line.kind = line.kind;
    held.line.line = line.line;
    held.line.name.assign(line.name);
    held.line.text.swap(line.text);
    held.vCalendar = vCalendar;
    return held;
  }
  const HeldLine* begin() const { return lines_.data(); }
  const HeldLine* end() const { return lines_.data() + size_; }

 private:
  std::vector<HeldLine> lines_;
  std::size_t size_ = 0;
};

using PropertyLines = ICalDocument::PropertyLines;

// Raised by lineAt about a property read without its line: the component is read again
// with the lines, and its reading starts over.
struct PropertyLinesNeeded {};

bool isUid(std::string_view name) {
  return name.size() == 3 && (name[0] == 'U' || name[0] == 'u') &&
         (name[1] == 'I' || name[1] == 'i') && (name[2] == 'D' || name[2] == 'd');
}

// Hands one content line to libical as the whole file's reading did, the line of each
// property as a parameter or not. The UID always keeps its line: a UID given twice is
// only known once its component is gone.
void feed(LineParser& parser, const HeldLine& held, PropertyLines propertyLines,
          std::string& scratch) {
  const ICalContentLine& line = held.line;
  const auto property = [&](const ICalContentLine& each) {
    if (propertyLines == PropertyLines::Tagged || isUid(each.name)) {
      parser.add(taggedLine(each));
    } else {
      scratch.assign(each.text);
      parser.add(scratch);
    }
  };
  switch (line.kind) {
    case ICalContentLine::Kind::Begin:
      parser.add("BEGIN:" + line.name);
      parser.add(std::string(kLineName) + ':' + std::to_string(line.line));
      break;
    case ICalContentLine::Kind::End:
      parser.add("END:" + line.name);
      break;
    case ICalContentLine::Kind::Property:
      if (isLineTag(line.name)) break;
      if (!held.vCalendar) {
        property(line);
        break;
      }
      for (std::string& asICal : vCalendarAsICalendar(line)) {
        const std::string name = asICal.substr(0, asICal.find_first_of(";:"));
        if (name == "BEGIN" || name == "END") {
          parser.add(asICal);
          if (name == "BEGIN") {
            parser.add(std::string(kLineName) + ':' + std::to_string(line.line));
          }
          continue;
        }
        property({ICalContentLine::Kind::Property, line.line, name, asICal});
      }
      break;
  }
}

OwnedComponent parseLines(const HeldLines& lines, PropertyLines propertyLines) {
  LineParser parser;
  std::string scratch;
  for (const HeldLine& held : lines) feed(parser, held, propertyLines, scratch);
  return parser.root();
}

// A fault of libical's reading, kept until the whole file was read: the reading of the whole
// file at once reported the lines libical refuses in line order, then what libical still found
// wrong in the order of the components (their lines, the calendar before what it holds).
struct DeferredFault {
  std::size_t line;
  std::size_t depth;
  ImportError fault;
  std::string consequence;
};

struct DeferredFaults {
  std::vector<DeferredFault> lines;
  std::vector<DeferredFault> components;

  void passOn(ImportWarnings& warnings) {
    const auto byPlace = [](const DeferredFault& a, const DeferredFault& b) {
      return std::tie(a.line, a.depth) < std::tie(b.line, b.depth);
    };
    std::stable_sort(lines.begin(), lines.end(), byPlace);
    std::stable_sort(components.begin(), components.end(), byPlace);
    for (const DeferredFault& each : lines) warnings.fault(each.fault, each.consequence);
    for (const DeferredFault& each : components) warnings.fault(each.fault, each.consequence);
    lines.clear();
    components.clear();
  }
};

std::size_t depthOf(icalcomponent* component) {
  std::size_t depth = 0;
  for (icalcomponent* parent = icalcomponent_get_parent(component); parent != nullptr;
       parent = icalcomponent_get_parent(parent)) {
    ++depth;
  }
  return depth;
}

// libical leaves out each property it cannot read, and puts an X-LIC-ERROR in its place
// that names neither its line nor its component. libical reads a property the same way
// wherever it stands, so a line it refuses inside the file it also refuses alone: each line
// of `root` (read from `lines`, `depth` components deep in its calendar) is parsed alone once
// libical's reading of it showed a fault (most components have none and are parsed once),
// and each it refuses is a fault at its line, in the component it stands in. Whatever
// libical still found wrong is a fault at the component it concerns. Answers whether `root`
// itself is dropped: an event without its start.
bool reportUnreadLines(const HeldLines& lines, const std::string& source, icalcomponent* root,
                       std::size_t depth, DeferredFaults& faults) {
  std::vector<std::pair<icalcomponent*, icalproperty*>> errors;
  collectErrors(root, errors);
  if (errors.empty()) return false;
  std::map<std::size_t, icalcomponent*> byLine;
  componentsByLine(root, byLine);
  std::map<icalcomponent*, std::size_t> explained;
  std::vector<std::size_t> begins;
  std::set<icalcomponent*> startless, triggerless;
  const auto fault = [&](std::size_t line, ImportError error, std::string consequence) {
    faults.lines.push_back({line, 0, std::move(error), std::move(consequence)});
  };
  for (const HeldLine& held : lines) {
    const ICalContentLine& line = held.line;
    if (line.kind == ICalContentLine::Kind::Begin) {
      begins.push_back(line.line);
      continue;
    }
    if (line.kind == ICalContentLine::Kind::End) {
      begins.pop_back();
      continue;
    }
    if (isLineTag(line.name)) continue;
    std::optional<std::string> complaint;
    for (const std::string& asICal :
         held.vCalendar ? vCalendarAsICalendar(line) : std::vector<std::string>{line.text}) {
      if (!asICal.starts_with("BEGIN:") && !asICal.starts_with("END:") && !complaint) {
        complaint = complaintAbout(asICal);
      }
    }
    if (!complaint) continue;
    icalcomponent* component = nullptr;
    if (!begins.empty()) {
      auto found = byLine.find(begins.back());
      if (found != byLine.end()) component = found->second;
    }
    if (component != nullptr) ++explained[component];
    const std::string name = zt::platform::upperAscii(line.name);
    // An event is where and when it starts: without its start it is dropped as a whole.
    if (component != nullptr && name == "DTSTART" &&
        icalcomponent_isa(component) == ICAL_VEVENT_COMPONENT) {
      fault(line.line, ImportError(source, line.line, name + ": " + *complaint),
            "dropped " + ICalDocument::describe(component));
      startless.insert(component);
      continue;
    }
    // An alarm is when it rings: without its trigger the reader has nothing of it.
    if (component != nullptr && name == "TRIGGER" &&
        icalcomponent_isa(component) == ICAL_VALARM_COMPONENT) {
      fault(line.line, ImportError(source, line.line, name + ": " + *complaint),
            "dropped " + ICalDocument::describe(component));
      triggerless.insert(component);
      continue;
    }
    fault(line.line, ImportError(source, line.line, name + ": " + *complaint),
          "dropped the " + name +
              (component != nullptr ? " of " + ICalDocument::describe(component) : std::string()));
  }
  for (const auto& [component, error] : errors) {
    if (explained[component] > 0) {
      --explained[component];
    } else {
      const std::optional<std::size_t> line = ICalDocument::lineOf(component);
      faults.components.push_back({line.value_or(0), depth + depthOf(component),
                                   ImportError(source, line, errorText(error)),
                                   "libical left it out of " + ICalDocument::describe(component)});
    }
    icalcomponent_remove_property(component, error);
    icalproperty_free(error);
  }
  // An event without its start and an alarm without its trigger were said dropped; they go
  // now, so that nothing reads them as what they are not. Each is freed once: one inside
  // another dropped one goes with it. Which ones those are is known before any is freed.
  std::set<icalcomponent*> dropped = startless;
  dropped.insert(triggerless.begin(), triggerless.end());
  std::vector<icalcomponent*> outermost;
  for (icalcomponent* component : dropped) {
    bool inDropped = false;
    for (icalcomponent* parent = icalcomponent_get_parent(component); parent != nullptr;
         parent = icalcomponent_get_parent(parent)) {
      inDropped = inDropped || dropped.count(parent) != 0;
    }
    if (!inDropped) outermost.push_back(component);
  }
  bool rootDropped = false;
  for (icalcomponent* component : outermost) {
    if (component == root) {
      rootDropped = true;
      continue;
    }
    icalcomponent_remove_component(icalcomponent_get_parent(component), component);
    icalcomponent_free(component);
  }
  return rootDropped;
}

// The text in UTF-8. RFC 5545 section 3.1.4 wants UTF-8, but some programs write their
// system's code page; most often that is Windows-1252 (Latin-1 with the curly quotes), which
// is how such text is read, with a warning at its first line that is not UTF-8. A fold may
// fall inside a character (section 3.1), so the text is judged with its folds taken out.
std::optional<std::string> windows1252Text(std::string_view text, const std::string& source,
                                           ImportWarnings& warnings) {
  if (zt::platform::utf8::isValid(text)) return std::nullopt;
  std::string unfolded;
  std::optional<std::size_t> firstFault;
  forEachPhysicalLine(text, [&](const PhysicalLine& line) {
    if (!line.text.empty() && (line.text.front() == ' ' || line.text.front() == '\t')) {
      unfolded.append(line.text.substr(1));
    } else {
      unfolded += '\n';
      unfolded.append(line.text);
    }
    if (!firstFault && !zt::platform::utf8::isValid(line.text)) firstFault = line.number;
  });
  if (zt::platform::utf8::isValid(unfolded)) return std::nullopt;
  // With --strict, the reading refuses the text at its line, as it always did.
  if (warnings.onFault() == OnFault::Refuse) return std::nullopt;
  warnings.fault(ImportError(source, firstFault, "the text is not UTF-8"),
                 "read the file as Windows-1252");
  return toUtf8(text, std::nullopt);
}

}  // namespace

namespace {

// The reading of one file: first the properties and time zones of each calendar (the time
// zones that its items name may come after them, RFC 5545 section 3.6 does not order
// components), then each top-level component of each calendar alone, freed before the next.
class FileReader {
 public:
  FileReader(std::string_view text, const std::string& source, ImportWarnings& warnings)
      : text_(text), document_(source, warnings), warnings_(warnings) {}

  // The calendars' properties and time zones; the faults of the text go through the
  // warnings as they are met.
  void readCalendars(ImportWarnings& warnings) {
    HeldLines held;
    std::string scratch;
    std::unique_ptr<LineParser> parser;
    std::size_t depth = 0;
    bool inZone = false;
    bool vCalendar = false;
    forEachICalContentLine(
        text_, document_.source(),
        [&](ICalContentLine& line) {
          const bool property = line.kind == ICalContentLine::Kind::Property;
          if (property && !isLineTag(line.name)) {
            // VERSION:1.0 says the calendar is a vCalendar; it comes before the components.
            if (std::optional<bool> version = isVCalendarVersion(line)) vCalendar = *version;
          }
          if (line.kind == ICalContentLine::Kind::Begin) {
            if (depth == 0) {
              held.clear();
              parser = std::make_unique<LineParser>();
            }
            if (depth == 1) inZone = line.name == "VTIMEZONE";
            ++depth;
            if (depth > 1 && !inZone) return;
          } else if (line.kind == ICalContentLine::Kind::End) {
            --depth;
            if (depth > 0 && !inZone) return;
            if (depth == 1) inZone = false;
          } else if (depth > 1 && !inZone) {
            return;
          }
          feed(*parser, held.add(line, vCalendar), PropertyLines::Tagged, scratch);
          if (depth > 0) return;
          OwnedComponent calendar = parser->root();
          parser.reset();
          if (!calendar) throw ImportError(document_.source(), 1, "libical cannot read this file");
          reportUnreadLines(held, document_.source(), calendar.get(), 0, faults_);
          calendars_.push_back(std::move(calendar));
        },
        warnings);
    for (std::size_t i = 0; i < calendars_.size(); ++i) {
      zones_.push_back(
          std::make_unique<ICalTimeZones>(calendars_[i].get(), [this, i] { return itemYears(i); }));
    }
  }

  // Each calendar, then its events and tasks, into `visitor`.
  void readItems(ICalDocumentVisitor& visitor) {
    forEachTopComponent(
        std::nullopt,
        [&](std::size_t calendar) {
          visitor.calendar(document_, calendars_[calendar].get(), *zones_[calendar]);
        },
        [&](icalcomponent* component, PropertyLines propertyLines) {
          const icalcomponent_kind kind = icalcomponent_isa(component);
          if (kind == ICAL_VEVENT_COMPONENT || kind == ICAL_VTODO_COMPONENT) {
            visitor.item(ICalDocument(document_.source(), warnings_, propertyLines), component);
          }
        },
        faults_);
  }

  // libical's faults, in the order the reading of the whole file reported them.
  void passOnFaults(ImportWarnings& warnings) { faults_.passOn(warnings); }

 private:
  // The years the top-level components of one calendar start in, read again (only a zone
  // known by its rules alone asks).
  std::vector<int> itemYears(std::size_t calendar) {
    std::vector<int> years;
    DeferredFaults ignored;
    forEachTopComponent(
        calendar, [](std::size_t) {},
        [&](icalcomponent* component, PropertyLines) {
          icalproperty* start = icalcomponent_get_first_property(component, ICAL_DTSTART_PROPERTY);
          years.push_back(start != nullptr ? icalproperty_get_dtstart(start).year : 0);
        },
        ignored);
    return years;
  }

  // Each top-level component of the calendars but their time zones (of the one calendar
  // `only` when given), parsed alone.
  template <typename OnCalendar, typename OnComponent>
  void forEachTopComponent(std::optional<std::size_t> only, OnCalendar&& onCalendar,
                           OnComponent&& onComponent, DeferredFaults& faults) {
    // The faults of the text were reported by readCalendars.
    ImportWarnings again(OnFault::Skip);
    HeldLines held;
    std::size_t depth = 0;
    std::size_t calendar = 0;
    bool wanted = false;
    bool inComponent = false;
    bool vCalendar = false;
    forEachICalContentLine(
        text_, document_.source(),
        [&](ICalContentLine& line) {
          if (line.kind == ICalContentLine::Kind::Property && !isLineTag(line.name)) {
            if (std::optional<bool> version = isVCalendarVersion(line)) vCalendar = *version;
          }
          if (line.kind == ICalContentLine::Kind::Begin) {
            ++depth;
            if (depth == 1) {
              wanted = !only || *only == calendar;
              if (wanted) onCalendar(calendar);
              ++calendar;
              return;
            }
            if (depth == 2) {
              inComponent = wanted && line.name != "VTIMEZONE";
              if (inComponent) held.clear();
            }
          } else if (line.kind == ICalContentLine::Kind::End) {
            --depth;
          }
          if (!inComponent || depth == 0) return;
          held.add(line, vCalendar);
          if (depth > 1) return;
          inComponent = false;
          // Most components hold nothing libical refuses, and their faults, if any, need
          // no line of a property: they are read without, and read again when they do.
          OwnedComponent component = parseLines(held, PropertyLines::Untagged);
          if (!component) return;
          PropertyLines propertyLines = PropertyLines::Untagged;
          if (hasErrors(component.get())) {
            component = parseLines(held, PropertyLines::Tagged);
            propertyLines = PropertyLines::Tagged;
          }
          if (reportUnreadLines(held, document_.source(), component.get(), 1, faults)) return;
          try {
            onComponent(component.get(), propertyLines);
          } catch (const PropertyLinesNeeded&) {
            component = parseLines(held, PropertyLines::Tagged);
            onComponent(component.get(), PropertyLines::Tagged);
          }
        },
        again);
  }

  std::string_view text_;
  ICalDocument document_;
  ImportWarnings& warnings_;
  std::vector<OwnedComponent> calendars_;
  std::vector<std::unique_ptr<ICalTimeZones>> zones_;
  DeferredFaults faults_;
};

}  // namespace

void ICalDocument::read(std::string_view input, const std::string& source, ImportWarnings& warnings,
                        ICalDocumentVisitor& visitor) {
  checkImportKind(input, ImportKind::ICalendar, source);
  const std::optional<std::string> converted = windows1252Text(input, source, warnings);
  const std::string_view text = converted ? std::string_view(*converted) : input;
  // A libical built with ICAL_ERRORS_ARE_FATAL aborts on the first value it cannot read;
  // here such a value is a fault to report with its line.
  icalerror_set_errors_are_fatal(0);
  FileReader reader(text, source, warnings);
  reader.readCalendars(warnings);
  reader.readItems(visitor);
  reader.passOnFaults(warnings);
}

std::optional<std::size_t> ICalDocument::lineOf(icalproperty* property) {
  if (property == nullptr) return std::nullopt;
  for (icalparameter* parameter = icalproperty_get_first_parameter(property, ICAL_X_PARAMETER);
       parameter != nullptr;
       parameter = icalproperty_get_next_parameter(property, ICAL_X_PARAMETER)) {
    const char* name = icalparameter_get_xname(parameter);
    if (name != nullptr && std::string_view(name) == kLineName) {
      return parseLineNumber(icalparameter_get_xvalue(parameter));
    }
  }
  return std::nullopt;
}

std::optional<std::size_t> ICalDocument::lineOf(icalcomponent* component) {
  if (component == nullptr) return std::nullopt;
  for (icalproperty* property = icalcomponent_get_first_property(component, ICAL_X_PROPERTY);
       property != nullptr;
       property = icalcomponent_get_next_property(component, ICAL_X_PROPERTY)) {
    const char* name = icalproperty_get_x_name(property);
    if (name != nullptr && std::string_view(name) == kLineName) {
      return parseLineNumber(icalproperty_get_x(property));
    }
  }
  return std::nullopt;
}

std::string ICalDocument::describe(icalcomponent* component) {
  const auto textOf = [&](icalproperty_kind kind) -> std::string {
    icalproperty* property = icalcomponent_get_first_property(component, kind);
    icalvalue* value = property != nullptr ? icalproperty_get_value(property) : nullptr;
    const char* text = value != nullptr ? icalvalue_get_text(value) : nullptr;
    return text != nullptr ? std::string(text) : std::string();
  };
  const auto named = [&](const std::string& what, const std::string& name) {
    if (!name.empty()) return what + " \"" + name + "\"";
    const std::optional<std::size_t> line = lineOf(component);
    return line ? what + " of line " + std::to_string(*line) : what;
  };
  switch (icalcomponent_isa(component)) {
    case ICAL_VEVENT_COMPONENT:
      return named("the event", textOf(ICAL_SUMMARY_PROPERTY).empty()
                                    ? textOf(ICAL_UID_PROPERTY)
                                    : textOf(ICAL_SUMMARY_PROPERTY));
    case ICAL_VTODO_COMPONENT:
      return named("the task", textOf(ICAL_SUMMARY_PROPERTY).empty()
                                   ? textOf(ICAL_UID_PROPERTY)
                                   : textOf(ICAL_SUMMARY_PROPERTY));
    case ICAL_VALARM_COMPONENT: {
      icalcomponent* parent = icalcomponent_get_parent(component);
      return parent != nullptr ? "an alarm of " + describe(parent) : named("the alarm", "");
    }
    case ICAL_VTIMEZONE_COMPONENT:
      return named("the time zone", textOf(ICAL_TZID_PROPERTY));
    case ICAL_XSTANDARD_COMPONENT:
    case ICAL_XDAYLIGHT_COMPONENT: {
      icalcomponent* parent = icalcomponent_get_parent(component);
      return parent != nullptr ? "a rule of " + describe(parent) : named("the zone rule", "");
    }
    case ICAL_VCALENDAR_COMPONENT:
      return "the calendar";
    default: {
      const char* kind = icalcomponent_kind_to_string(icalcomponent_isa(component));
      return named(std::string("the ") + (kind != nullptr ? kind : "component"), "");
    }
  }
}

std::optional<std::size_t> ICalDocument::lineAt(icalproperty* property,
                                                icalcomponent* component) const {
  std::optional<std::size_t> line = lineOf(property);
  if (!line && property != nullptr && propertyLines_ == PropertyLines::Untagged) {
    throw PropertyLinesNeeded();
  }
  if (!line) line = lineOf(component);
  return line;
}

ImportError ICalDocument::errorAt(icalproperty* property, icalcomponent* component,
                                  std::string reason) const {
  return ImportError(source_, lineAt(property, component), std::move(reason));
}

bool ICalDocument::isLineMark(std::string_view name) {
  return name == kLineName;
}

}  // namespace tessel::importers
