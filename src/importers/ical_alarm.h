#pragma once

#include <libical/ical.h>

#include <optional>

#include "importers/ical_component_reader.h"
#include "importers/ical_document.h"
#include "importers/ical_time_zones.h"
#include "platform/value.h"

namespace tessel::importers::ical {

// RFC 5545 section 3.6.6: one VALARM, by its ACTION (DISPLAY when it has none, with a
// warning). None, with a warning, for actions the schema has no alarm for (PROCEDURE, X-...)
// and for alarms without the TRIGGER they must have. The trigger becomes an offset from the
// event's `start`, also when given as a fixed time; `end` is what a TRIGGER related to the
// end counts from.
std::optional<zt::platform::Dictionary> alarmRecord(const ICalDocument& document,
                                                    ICalTimeZones& zones, icalcomponent* alarm,
                                                    const std::optional<ReadDate>& start,
                                                    const std::optional<ReadDate>& end);

}  // namespace tessel::importers::ical
