#pragma once

// RFC 2445 text primitives: operations that append iCalendar text to an output buffer and
// that turn single values into iCalendar value text.
//
// The output buffer is UTF-8; every length and fold position counts UTF-16 code units, as
// the device's reader does. Every line ended here is ended with CR LF (RFC 2445 section 4.1).
// Nothing in this layer fails: unsupported values are written through a logged fallback.

#include <cstddef>
#include <string>
#include <string_view>

#include "platform/value.h"

namespace zt::icalendar {

// Content lines are folded after this many UTF-16 code units. The device reads lines
// folded at 72, not at the 75 octets RFC 2445 section 4.1 allows.
inline constexpr std::size_t kFoldLimit = 72;

// --- Operations on the output buffer ------------------------------------------------------

// "BEGIN:" name CR LF.
void appendRFC2445ComponentStart(std::string& buffer, std::string_view name);
// "END:" name CR LF.
void appendRFC2445ComponentEnd(std::string& buffer, std::string_view name);
// The folded text, then CR LF.
void appendRFC2445Line(std::string& buffer, std::string_view text);
// Folds the buffer in place: "\r\n " before units 72, 144, ... of the unfolded text, and
// also at the very end when the length is an exact multiple of 72. Returns the buffer.
std::string& fold(std::string& buffer);
// Folds in place the text from `start` to the end of the buffer, as fold() folds a copy of
// it; the text before `start` is left alone.
void foldRFC2445From(std::string& buffer, std::size_t start);
// Appends the text escaped as escapeRFC2445Value escapes it.
void appendEscapedRFC2445Value(std::string& buffer, std::string_view text);
// Appends the text unchanged when it both begins and ends with a double quote, else quoted.
void appendQuotedString(std::string& buffer, std::string_view text);
// The same test on the buffer itself: quotes it in place unless already quoted.
void quoteRFC2445Value(std::string& buffer);
// Escapes the buffer in place as a property value: \ ; , LF CR and double quote.
void escapeRFC2445Value(std::string& buffer);
// Escapes the buffer in place as a parameter value: as a property value, plus ":".
void escapeRFC2445ParameterValue(std::string& buffer);
// ";" name "=".
void appendRFC2445ParameterName(std::string& buffer, std::string_view name);
// ";" name "=" value, the value neither quoted nor escaped.
void appendRFC2445Parameter(std::string& buffer, std::string_view name, std::string_view value);
// name, then the date's property value (":..." or ";TZID=...:...") or ":" and the escaped
// representation of any other value, then CR LF. Never folded. The date overload may switch
// the date to GMT; the Value overload writes a copy and leaves the value as it is.
void appendDatePropertyLine(std::string& buffer, std::string_view name,
                            platform::CalendarDate& date);
void appendDatePropertyLine(std::string& buffer, std::string_view name,
                            const platform::Value& value);

// --- Operations on a string ---------------------------------------------------------------

std::string iCalendarRepresentation(std::string_view text);
std::string iCalendarRepresentation(const std::string& text);
void appendRFC2445RepresentationTo(std::string_view text, std::string& buffer);
void appendRFC2445RepresentationTo(const std::string& text, std::string& buffer);
// A folded copy of the text (the buffer overload above folds in place).
std::string fold(std::string_view text);
// The text if it both begins and ends with a double quote, else the text between two.
std::string iCalendarQuoted(std::string_view text);
// The text unchanged: parameter values are written neither quoted nor escaped.
std::string iCalendarParameterValue(std::string_view text);
std::string iCalendarEscapeValue(std::string_view text);
std::string iCalendarEscapeParameterValue(std::string_view text);
// Participation status word (RFC 2445 section 4.2.12): "needsaction" gives NEEDS-ACTION,
// "inprocess" gives IN-PROCESS, anything else is upper-cased.
std::string iCalendarRepresentationPartStat(std::string_view word);

// --- Operations on a number ---------------------------------------------------------------

// "TRUE" for a non-zero value, else "FALSE".
void appendRFC2445BoolRepresentationTo(const platform::Number& number, std::string& buffer);
// Seconds east of UTC as a signed UTC offset, +hhmm or +hhmmss (RFC 2445 section 4.3.14).
void appendRFC2445UTCOffsetRepresentationTo(const platform::Number& number, std::string& buffer);
// The 32-bit value in decimal.
void appendRFC2445RepresentationTo(const platform::Number& number, std::string& buffer);
std::string iCalendarRepresentation(const platform::Number& number);
// Signed 64-bit seconds as a duration (RFC 2445 section 4.3.6), never in weeks: -PT15M.
std::string iCalendarDurationRepresentation(const platform::Number& number);

// --- Operations on URLs and arrays --------------------------------------------------------

void appendRFC2445RepresentationTo(const platform::Url& url, std::string& buffer);
// Each element's own form, joined by ",".
void appendRFC2445RepresentationTo(const platform::Array& array, std::string& buffer);
// Each element's description, escaped as a parameter value, joined by ",".
void appendRFC2445ParameterArrayRepresentationTo(const platform::Array& array, std::string& buffer);

// --- Any value ----------------------------------------------------------------------------

// The form of the value's own kind. Kinds without one (dates, data, dictionaries) get the
// fallback: a logged warning and the value's description text.
void appendRFC2445RepresentationTo(const platform::Value& value, std::string& buffer);
// The form of the value's own kind: strings as they are, numbers in decimal, dates in their
// bare form (written from a copy), everything else through appendRFC2445RepresentationTo.
std::string iCalendarRepresentation(const platform::Value& value);

}  // namespace zt::icalendar
