#include "importers/ical_document.h"

#include <libical/ical.h>

#include <charconv>
#include <cstdlib>
#include <map>
#include <memory>
#include <set>
#include <vector>

#include "importers/ical_content_lines.h"
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

// libical leaves out each property it cannot read, and puts an X-LIC-ERROR in its place
// that names neither its line nor its component. libical reads a property the same way
// wherever it stands, so a line it refuses inside the file it also refuses alone: each line
// is parsed alone once the whole file showed a fault (most files have none and are parsed
// once), and each it refuses is a fault at its line, in the component it stands in.
// Whatever libical still found wrong is a fault at the component it concerns.
void reportUnreadLines(std::string_view text, const std::string& source, icalcomponent* root,
                       ImportWarnings& warnings) {
  std::vector<std::pair<icalcomponent*, icalproperty*>> errors;
  collectErrors(root, errors);
  if (errors.empty()) return;
  std::map<std::size_t, icalcomponent*> byLine;
  componentsByLine(root, byLine);
  std::map<icalcomponent*, std::size_t> explained;
  // The faults of the text itself were reported when libical was fed; this reading only
  // looks for the lines libical refuses.
  ImportWarnings again(OnFault::Skip);
  std::vector<std::size_t> begins;
  std::set<icalcomponent*> startless, triggerless;
  bool vCalendar = false;
  forEachICalContentLine(
      text, source,
      [&](const ICalContentLine& line) {
        if (line.kind == ICalContentLine::Kind::Begin) return begins.push_back(line.line);
        if (line.kind == ICalContentLine::Kind::End) return begins.pop_back();
        if (isLineTag(line.name)) return;
        if (std::optional<bool> version = isVCalendarVersion(line)) vCalendar = *version;
        std::optional<std::string> complaint;
        for (const std::string& asICal :
             vCalendar ? vCalendarAsICalendar(line) : std::vector<std::string>{line.text}) {
          if (!asICal.starts_with("BEGIN:") && !asICal.starts_with("END:") && !complaint) {
            complaint = complaintAbout(asICal);
          }
        }
        if (!complaint) return;
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
          warnings.fault(ImportError(source, line.line, name + ": " + *complaint),
                         "dropped " + ICalDocument::describe(component));
          startless.insert(component);
          return;
        }
        // An alarm is when it rings: without its trigger the reader has nothing of it.
        if (component != nullptr && name == "TRIGGER" &&
            icalcomponent_isa(component) == ICAL_VALARM_COMPONENT) {
          warnings.fault(ImportError(source, line.line, name + ": " + *complaint),
                         "dropped " + ICalDocument::describe(component));
          triggerless.insert(component);
          return;
        }
        warnings.fault(ImportError(source, line.line, name + ": " + *complaint),
                       "dropped the " + name +
                           (component != nullptr ? " of " + ICalDocument::describe(component)
                                                 : std::string()));
      },
      again);
  for (const auto& [component, error] : errors) {
    if (explained[component] > 0) {
      --explained[component];
    } else {
      warnings.fault(ImportError(source, ICalDocument::lineOf(component), errorText(error)),
                     "libical left it out of " + ICalDocument::describe(component));
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
  for (icalcomponent* component : outermost) {
    icalcomponent_remove_component(icalcomponent_get_parent(component), component);
    icalcomponent_free(component);
  }
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

ICalDocument ICalDocument::parse(std::string_view input, std::string source,
                                 ImportWarnings& warnings) {
  checkImportKind(input, ImportKind::ICalendar, source);
  const std::optional<std::string> converted = windows1252Text(input, source, warnings);
  const std::string_view text = converted ? std::string_view(*converted) : input;
  // A libical built with ICAL_ERRORS_ARE_FATAL aborts on the first value it cannot read;
  // here such a value is a fault to report with its line.
  icalerror_set_errors_are_fatal(0);
  LineParser parser;
  // The lines go to libical as they are read, each checked one, so that neither the
  // unfolded text nor its lines are held beside libical's components.
  std::string tagged;
  // VERSION:1.0 says the calendar is a vCalendar; it comes before the components.
  bool vCalendar = false;
  forEachICalContentLine(
      text, source,
      [&](const ICalContentLine& line) {
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
            if (std::optional<bool> version = isVCalendarVersion(line)) vCalendar = *version;
            if (!vCalendar) {
              tagged = taggedLine(line);
              parser.add(tagged);
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
              tagged = taggedLine({ICalContentLine::Kind::Property, line.line, name, asICal});
              parser.add(tagged);
            }
            break;
        }
      },
      warnings);

  OwnedComponent root = parser.root();
  if (!root) throw ImportError(source, 1, "libical cannot read this file");
  reportUnreadLines(text, source, root.get(), warnings);
  const icalcomponent_kind kind = icalcomponent_isa(root.get());
  if (kind != ICAL_VCALENDAR_COMPONENT && kind != ICAL_XROOT_COMPONENT) {
    throw ImportError(source, lineOf(root.get()), "no VCALENDAR in this file");
  }
  return ICalDocument(root.release(), std::move(source), warnings);
}

ICalDocument::ICalDocument(ICalDocument&& other) noexcept
    : root_(std::exchange(other.root_, nullptr)),
      source_(std::move(other.source_)),
      warnings_(other.warnings_) {}

ICalDocument& ICalDocument::operator=(ICalDocument&& other) noexcept {
  if (this != &other) {
    if (root_ != nullptr) icalcomponent_free(root_);
    root_ = std::exchange(other.root_, nullptr);
    source_ = std::move(other.source_);
    warnings_ = other.warnings_;
  }
  return *this;
}

ICalDocument::~ICalDocument() {
  if (root_ != nullptr) icalcomponent_free(root_);
}

std::vector<icalcomponent*> ICalDocument::calendars() const {
  std::vector<icalcomponent*> calendars;
  if (icalcomponent_isa(root_) == ICAL_VCALENDAR_COMPONENT) {
    calendars.push_back(root_);
    return calendars;
  }
  for (icalcompiter it = icalcomponent_begin_component(root_, ICAL_VCALENDAR_COMPONENT);
       icalcompiter_deref(&it) != nullptr; icalcompiter_next(&it)) {
    calendars.push_back(icalcompiter_deref(&it));
  }
  return calendars;
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

bool ICalDocument::isLineMark(std::string_view name) {
  return name == kLineName;
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

ImportError ICalDocument::errorAt(icalproperty* property, icalcomponent* component,
                                  std::string reason) const {
  std::optional<std::size_t> line = lineOf(property);
  if (!line) line = lineOf(component);
  return ImportError(source_, line, std::move(reason));
}

}  // namespace tessel::importers
