#pragma once

// Time zones as iCalendar names them: the TZID identifier and the VTIMEZONE component
// (RFC 2445 section 4.6.5).
//
// A zone's standard and daylight offsets are learnt by sampling it at four instants of 2002
// (1 February, 1 May, 1 July, 1 November, midnight UTC), which cover both hemispheres; the
// first sample of each kind wins.

#include <string>

#include "platform/time_zone.h"

namespace zt::icalendar {

// The zone's name, or "UNKNOWN-<standard>-<daylight>" in seconds for an unnamed zone
// (UNKNOWN-3600-0 when no daylight time was seen).
std::string timezoneBlockID(const platform::TimeZone& zone);
// Appends the same text. The texts of the last few zones are kept, so that writing many
// dates in a few zones neither copies names nor samples zones again.
void appendTimezoneBlockID(const platform::TimeZone& zone, std::string& buffer);

// Appends BEGIN:VTIMEZONE, TZID, a STANDARD and/or a DAYLIGHT sub-component holding only
// TZOFFSETTO (unsigned when not negative: 0100, -0500), and END:VTIMEZONE.
void appendCalendarRepresentationTo(const platform::TimeZone& zone, std::string& buffer);

}  // namespace zt::icalendar
