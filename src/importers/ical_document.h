#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "importers/import_error.h"
#include "importers/import_warnings.h"

// libical's types, declared here so that only the importer's sources include libical.
struct icalcomponent_impl;
struct icalproperty_impl;

namespace tessel::importers {

// One iCalendar file parsed by libical, after every content line was checked on its own so
// that a fault is reported with its line. Each property and component remembers the line it
// came from (lineOf), for the messages of later checks, and the faults of those checks go
// through the document's warnings.
class ICalDocument {
 public:
  // Each fault goes through `warnings` (which outlives the document): a property libical
  // cannot read is left out, and so are the lines of forEachICalContentLine's faults; text
  // that is not UTF-8 is read as Windows-1252. Raises ImportError naming `source` for a file
  // that is not an iCalendar file or that libical cannot read at all.
  static ICalDocument parse(std::string_view text, std::string source, ImportWarnings& warnings);

  ICalDocument(ICalDocument&& other) noexcept;
  ICalDocument& operator=(ICalDocument&& other) noexcept;
  ICalDocument(const ICalDocument&) = delete;
  ICalDocument& operator=(const ICalDocument&) = delete;
  ~ICalDocument();

  const std::string& source() const { return source_; }
  // The VCALENDAR objects of the file, in file order (a file may hold more than one).
  std::vector<icalcomponent_impl*> calendars() const;

  // The line a property or component starts on; none for what libical made up itself.
  static std::optional<std::size_t> lineOf(icalproperty_impl* property);
  static std::optional<std::size_t> lineOf(icalcomponent_impl* component);
  // Whether a parameter or property of this name is the line mark, not data.
  static bool isLineMark(std::string_view name);

  // An ImportError about this file at the line of `property` (or of `component` when the
  // property is null).
  ImportError errorAt(icalproperty_impl* property, icalcomponent_impl* component,
                      std::string reason) const;

  ImportWarnings& warnings() const { return *warnings_; }

  // A component as warnings name it: `the event "Lunch"`, `an alarm of the task "Pay"`,
  // `the time zone "Europe/Paris"`, or by its line when it has no name.
  static std::string describe(icalcomponent_impl* component);

 private:
  ICalDocument(icalcomponent_impl* root, std::string source, ImportWarnings& warnings)
      : root_(root), source_(std::move(source)), warnings_(&warnings) {}

  icalcomponent_impl* root_ = nullptr;
  std::string source_;
  ImportWarnings* warnings_;
};

}  // namespace tessel::importers
