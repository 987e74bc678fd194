#pragma once

// Date-time forms of calendar dates and the recurrence words of RFC 2445 section 4.3.10.
//
// A whole-day value travels as 12:00:00 in GMT (or UTC); a date that carries the process's
// automatically tracking local zone is a floating time. The operations that write a zoned
// time in UTC switch the date they are given to GMT, and it stays switched.

#include <optional>
#include <string>
#include <string_view>

#include "platform/calendar_date.h"
#include "platform/value.h"

namespace zt::icalendar {

// --- Calendar dates -----------------------------------------------------------------------

// True for the GMT and the UTC zones: times in them are written in UTC with "Z" and need no
// VTIMEZONE.
bool isUniversalZone(const platform::TimeZone& zone);

// True for 12:00:00 exactly in the GMT or the UTC zone.
bool isDateOnly(const platform::CalendarDate& date);
// "20070315".
std::string dateOnly(const platform::CalendarDate& date);
// Floating "20070315T123000" in the local zone; otherwise the date is switched to GMT and
// written "20070315T113000Z".
std::string dateTime(platform::CalendarDate& date);
// dateOnly for a whole day, else dateTime.
std::string iCalendarRepresentation(platform::CalendarDate& date);
// ":20070315", with no VALUE=DATE parameter.
std::string dateOnlyPropertyValue(const platform::CalendarDate& date);
// ":20070315T123000" floating; ":20070315T113000Z" for GMT and UTC (the date is switched to
// GMT); ";TZID=Europe/Paris:20070315T123000" in the wall-clock time of any other zone.
std::string dateTimePropertyValue(platform::CalendarDate& date);
// dateOnlyPropertyValue for a whole day, else dateTimePropertyValue.
std::string iCalendarPropertyValueRepresentation(platform::CalendarDate& date);
// Appends the same text, leaving the date in its own zone (the switch to GMT changes no
// text).
void appendPropertyValueRepresentation(std::string& buffer, const platform::CalendarDate& date);

// --- Recurrence words ---------------------------------------------------------------------

// "daily" ... "yearly" in any letter case give DAILY ... YEARLY; anything else "ERROR".
std::string_view iCalendarRepresentationForFrequency(std::string_view word);
// "sunday" ... "saturday" in any letter case give SU ... SA; anything else "ERROR".
std::string_view iCalendarRepresentationForDay(std::string_view name);
// The BYDAY list: ordinals (0 = every) paired with weekday names, "MO,2TU,-1FR". Absent
// when there are no ordinals or the two arrays differ in length.
std::optional<std::string> iCalendarRepresentationForByDayFreq(const platform::Array& freqs,
                                                               const platform::Array& days);

}  // namespace zt::icalendar
