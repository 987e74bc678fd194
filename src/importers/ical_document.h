#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "importers/ical_document_visitor.h"
#include "importers/import_error.h"
#include "importers/import_warnings.h"

// libical's types, declared here so that only the importer's sources include libical.
struct icalcomponent_impl;
struct icalproperty_impl;

namespace tessel::importers {

// One iCalendar file read by libical one component at a time: each content line is checked
// on its own, so that a fault is reported with its line, and each property and component
// remembers the line it came from (lineOf), for the messages of later checks. Libical never
// holds more of the file than the properties and time zones of its calendars and one event
// or task.
class ICalDocument {
 public:
  // Reads `text` into `visitor`. Each fault goes through `warnings` (which outlives the
  // document), the faults of the text and libical's in file order once the whole file was
  // read: a property libical cannot read is left out, and so are the lines of
  // forEachICalContentLine's faults; text that is not UTF-8 is read as Windows-1252. Raises
  // ImportError naming `source` for a file that is not an iCalendar file or that libical
  // cannot read at all.
  static void read(std::string_view text, const std::string& source, ImportWarnings& warnings,
                   ICalDocumentVisitor& visitor);

  // Whether the properties libical read carry the line they came from (components and UIDs
  // always do). Most components are read without, which is faster; lineAt then asks for the
  // component to be read again with them.
  enum class PropertyLines { Tagged, Untagged };

  // A document of the file `source` whose later faults go through `warnings`.
  ICalDocument(std::string source, ImportWarnings& warnings,
               PropertyLines propertyLines = PropertyLines::Tagged)
      : source_(std::move(source)), warnings_(&warnings), propertyLines_(propertyLines) {}
  // The same document, whose later faults go through `warnings`.
  ICalDocument(const ICalDocument& document, ImportWarnings& warnings)
      : source_(document.source_), warnings_(&warnings), propertyLines_(document.propertyLines_) {}

  const std::string& source() const { return source_; }

  // The line a property or component starts on; none for what libical made up itself.
  static std::optional<std::size_t> lineOf(icalproperty_impl* property);
  static std::optional<std::size_t> lineOf(icalcomponent_impl* component);
  // Whether a parameter or property of this name is the line mark, not data.
  static bool isLineMark(std::string_view name);
  // The line of `property`, else of `component` (when the property is null or libical made
  // it up).
  std::optional<std::size_t> lineAt(icalproperty_impl* property,
                                    icalcomponent_impl* component) const;

  // An ImportError about this file at the line of `property` (or of `component` when the
  // property is null).
  ImportError errorAt(icalproperty_impl* property, icalcomponent_impl* component,
                      std::string reason) const;

  ImportWarnings& warnings() const { return *warnings_; }

  // A component as warnings name it: `the event "Lunch"`, `an alarm of the task "Pay"`,
  // `the time zone "Europe/Paris"`, or by its line when it has no name.
  static std::string describe(icalcomponent_impl* component);

 private:
  std::string source_;
  ImportWarnings* warnings_;
  PropertyLines propertyLines_;
};

}  // namespace tessel::importers
