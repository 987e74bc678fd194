#include "importers/ical_document.h"

#include <libical/ical.h>

#include <charconv>
#include <cstdlib>
#include <memory>

#include "importers/ical_content_lines.h"
#include "platform/ascii.h"

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
  // libical says what it does with a property it cannot read; here the whole file is
  // refused instead.
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

// libical reads a property the same way wherever it stands, so a line it refuses inside the
// file it also refuses alone. Each line is parsed alone only once the whole file showed a
// fault, to name the first line at fault: most files have none and are parsed once.
void refuseFirstFaultyLine(const std::vector<ICalContentLine>& lines, const std::string& source) {
  for (const ICalContentLine& line : lines) {
    if (line.kind != ICalContentLine::Kind::Property || isLineTag(line.name)) continue;
    if (std::optional<std::string> complaint = complaintAbout(line.text)) {
      throw ImportError(source, line.line, line.name + ": " + *complaint);
    }
  }
}

}  // namespace

ICalDocument ICalDocument::parse(std::string_view text, std::string source) {
  // A libical built with ICAL_ERRORS_ARE_FATAL aborts on the first value it cannot read;
  // here such a value is a fault to report with its line.
  icalerror_set_errors_are_fatal(0);
  LineParser parser;
  // The lines go to libical as they are read, each checked one, so that neither the
  // unfolded text nor its lines are held beside libical's components.
  std::string tagged;
  forEachICalContentLine(text, source, [&](const ICalContentLine& line) {
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
        tagged = taggedLine(line);
        parser.add(tagged);
        break;
    }
  });

  OwnedComponent root = parser.root();
  icalcomponent* where = nullptr;
  icalproperty* error = root ? firstError(root.get(), &where) : nullptr;
  if (!root || error != nullptr) refuseFirstFaultyLine(readICalContentLines(text, source), source);
  if (!root) throw ImportError(source, 1, "libical cannot read this file");
  // Every line passed on its own; whatever libical still finds wrong is reported at the
  // component it concerns.
  if (error != nullptr) throw ImportError(source, lineOf(where), errorText(error));
  const icalcomponent_kind kind = icalcomponent_isa(root.get());
  if (kind != ICAL_VCALENDAR_COMPONENT && kind != ICAL_XROOT_COMPONENT) {
    throw ImportError(source, lineOf(root.get()), "no VCALENDAR in this file");
  }
  return ICalDocument(root.release(), std::move(source));
}

ICalDocument::ICalDocument(ICalDocument&& other) noexcept
    : root_(std::exchange(other.root_, nullptr)), source_(std::move(other.source_)) {}

ICalDocument& ICalDocument::operator=(ICalDocument&& other) noexcept {
  if (this != &other) {
    if (root_ != nullptr) icalcomponent_free(root_);
    root_ = std::exchange(other.root_, nullptr);
    source_ = std::move(other.source_);
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

ImportError ICalDocument::errorAt(icalproperty* property, icalcomponent* component,
                                  std::string reason) const {
  std::optional<std::size_t> line = lineOf(property);
  if (!line) line = lineOf(component);
  return ImportError(source_, line, std::move(reason));
}

}  // namespace tessel::importers
