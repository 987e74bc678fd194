#pragma once

// The dates of a component (RFC 5545 sections 3.3.4 to 3.3.6): checked, put in their zone,
// moved on by durations.

#include <libical/ical.h>

#include <optional>
#include <string>
#include <string_view>

#include "importers/ical_document.h"
#include "importers/ical_time_zones.h"
#include "importers/import_error.h"
#include "platform/calendar_date.h"
#include "platform/time_zone.h"

namespace tessel::importers::ical {

// A date as a component carries it: the date and whether it was a whole day (a DATE value).
struct ReadDate {
  zt::platform::CalendarDate date;
  bool wholeDay;
};

// Reads the values of one component, raising ImportError at the line of a faulty one.
class ComponentReader {
 public:
  ComponentReader(const ICalDocument& document, ICalTimeZones& zones, icalcomponent* component)
      : document_(document), zones_(zones), component_(component) {}

  ImportError error(icalproperty* property, std::string reason) const;
  // A warning at the line of `property`, or of the component when it is null.
  void warn(icalproperty* property, std::string_view text) const;

  // `fault` costs `property`: a warning that names it and the component, or with
  // OnFault::Refuse the fault raised.
  void drop(const ImportError& fault, icalproperty* property) const;

  // The property's name as messages give it.
  std::string name(icalproperty* property) const;

  // RFC 5545 section 3.3.4 and 3.3.5: DATE values are whole days (kept as 12:00 GMT, as
  // the schema wants), "Z" times are UTC, TZID times are in that zone and the others
  // floating, which the local zone stands for. A TZID that nothing defines is a fault; the
  // time is then read as floating.
  ReadDate date(icalproperty* property, const icaltimetype& t,
                const std::optional<zt::platform::TimeZone>& floatingZone = std::nullopt) const;

  // `start` moved on by a duration; days count on the wall clock of the start's zone, the
  // rest exactly (RFC 5545 section 3.3.6).
  ReadDate plus(icalproperty* property, const ReadDate& start, const icaldurationtype& d) const;

  // Raises ImportError unless `t` names a day and time that exist.
  void check(icalproperty* property, const icaltimetype& t) const;

 private:
  const ICalDocument& document_;
  ICalTimeZones& zones_;
  icalcomponent* component_;
};

// "07", "12": the fields of times in identifiers and messages.
std::string twoDigits(int n);

}  // namespace tessel::importers::ical
