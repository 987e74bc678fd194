#pragma once

// Reading libical's components and properties: the lists, parameters and values the readers
// of events, tasks, alarms and recurrences share.

#include <libical/ical.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace tessel::importers::ical {

// Durations beyond this are typing mistakes, and would carry dates out of any calendar.
constexpr std::int64_t kLongestDuration = std::int64_t{1000} * 366 * 86400;

std::vector<icalproperty*> propertiesOf(icalcomponent* component);
std::vector<icalcomponent*> componentsOf(icalcomponent* component, icalcomponent_kind kind);

// A parameter's value as written, without the quotes RFC 5545 section 3.2 puts around
// values holding ":", ";" or ",". None when the property lacks it.
std::optional<std::string> parameter(icalproperty* property, const char* name);

// The value as libical writes it.
std::string valueText(icalproperty* property);

// A text value; none when it is empty.
std::optional<std::string> text(const char* value);

std::int64_t durationSeconds(const icaldurationtype& d);

}  // namespace tessel::importers::ical
