#pragma once

#include <libical/ical.h>

#include <optional>

#include "importers/ical_component_reader.h"
#include "platform/value.h"

namespace tessel::importers::ical {

// RFC 5545 section 3.3.10 rule parts as the Recurrence record holds them; none for the
// frequencies below a day, which the schema cannot say. `start` is the DTSTART of the
// component, whose zone a local UNTIL is read in.
std::optional<zt::platform::Dictionary> recurrenceRecord(const ComponentReader& reader,
                                                         icalproperty* property,
                                                         const std::optional<ReadDate>& start);

}  // namespace tessel::importers::ical
