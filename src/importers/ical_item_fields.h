#pragma once

#include <libical/ical.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "importers/ical_component_reader.h"
#include "platform/value.h"

namespace tessel::importers::ical {

// What a VEVENT or VTODO says, read once.
struct ItemFields {
  std::optional<std::string> summary, description, location, status, classification, url;
  std::optional<std::int64_t> priority;
  std::optional<ReadDate> start, end, due, completed;
  icalproperty* startProperty = nullptr;
  zt::platform::Array exceptionDates;
  std::vector<icalproperty*> rules, attendees;
  icalproperty* organizer = nullptr;
};

// Reads the properties of a VEVENT or VTODO. An end that is not written follows from the
// DURATION, or for events from the start (RFC 5545 section 3.6.1).
ItemFields readFields(const ComponentReader& reader, icalcomponent* component);

}  // namespace tessel::importers::ical
