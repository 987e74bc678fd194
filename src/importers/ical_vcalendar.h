#pragma once

// vCalendar 1.0, the format iCalendar replaced, which phones and old organizers still write:
// its lines read as the iCalendar lines that say the same (RFC 5545 section A.1 lists the
// differences), so that libical and the reader see iCalendar only.

#include <string>
#include <vector>

#include "importers/ical_content_lines.h"

namespace tessel::importers {

// The unfolded iCalendar lines that stand for one property of a vCalendar 1.0 file: the line
// itself when it means the same in both; text in quoted-printable or in a named charset as
// escaped UTF-8; the status words of vCalendar as RFC 5545's; lists separated by ";" with ",";
// a recurrence rule of the vCalendar grammar ("W1 MO TH #10") as an RRULE; and an AALARM,
// DALARM or MALARM as a VALARM component (its BEGIN and END lines included). What has no
// iCalendar meaning is left as written, for libical to refuse.
std::vector<std::string> vCalendarAsICalendar(const ICalContentLine& line);

}  // namespace tessel::importers
