#pragma once

#include <libical/ical.h>

#include <string_view>

#include "platform/value.h"

namespace tessel::importers::ical {

// An ORGANIZER or ATTENDEE property (RFC 5545 sections 3.8.4.1 and 3.8.4.3) as a record of
// `entity`, Organizer or Attendee; only attendees keep their role, status and reply.
zt::platform::Dictionary participantRecord(icalproperty* property, std::string_view entity);

}  // namespace tessel::importers::ical
