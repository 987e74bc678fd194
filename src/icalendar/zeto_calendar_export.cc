#include "icalendar/zeto_calendar_export.h"

#include <charconv>
#include <cstdint>

#include "icalendar/calendar_sync_extension.h"
#include "platform/ascii.h"

namespace zt::icalendar {

namespace {

using platform::CalendarDate;
using platform::equalsIgnoringAsciiCase;
using platform::TimeZone;

// The two zones that stand for "no zone": looked up once by abbreviation, compared by zone
// equality.
const TimeZone& gmtZone() {
  static const TimeZone zone = TimeZone::withAbbreviation("GMT").value_or(TimeZone::gmt());
  return zone;
}

const TimeZone& utcZone() {
  static const TimeZone zone = TimeZone::withAbbreviation("UTC").value_or(TimeZone::utc());
  return zone;
}

bool isNoon(const CalendarDate::Fields& f) {
  return f.hour == 12 && f.minute == 0 && f.second == 0;
}

// printf's "%.<width>d": at least `width` digits, zero-padded, never cut.
void appendPadded(std::string& out, int value, int width) {
  std::int64_t magnitude = value;
  if (magnitude < 0) {
    out += '-';
    magnitude = -magnitude;
  }
  char digits[24];
  auto [end, ec] = std::to_chars(digits, digits + sizeof digits, magnitude);
  (void)ec;
  for (auto n = end - digits; n < width; ++n) out += '0';
  out.append(digits, end);
}

// "%.4d%.2d%.2d"
void appendDate(std::string& out, const CalendarDate::Fields& f) {
  appendPadded(out, f.year, 4);
  appendPadded(out, f.month, 2);
  appendPadded(out, f.day, 2);
}

// "%.4d%.2d%.2dT%.2d%.2d%.2d"
void appendDateTime(std::string& out, const CalendarDate::Fields& f) {
  appendDate(out, f);
  out += 'T';
  appendPadded(out, f.hour, 2);
  appendPadded(out, f.minute, 2);
  appendPadded(out, f.second, 2);
}

// GMT and UTC never differ, so the fields read in either stand for the date switched to GMT.
std::string switchedToGmt(CalendarDate& date, const CalendarDate::Fields& fields,
                          std::string prefix) {
  date.setTimeZone(gmtZone());
  appendDateTime(prefix, fields);
  prefix += 'Z';
  return prefix;
}

}  // namespace

// --- Calendar dates -----------------------------------------------------------------------

bool isUniversalZone(const TimeZone& zone) {
  return zone == gmtZone() || zone == utcZone();
}

bool isDateOnly(const CalendarDate& date) {
  return isUniversalZone(date.timeZone()) && isNoon(date.fields());
}

std::string dateOnly(const CalendarDate& date) {
  std::string text;
  appendDate(text, date.fields());
  return text;
}

std::string dateTime(CalendarDate& date) {
  std::string text;
  if (date.timeZone().isLocal()) {
    appendDateTime(text, date.fields());
    return text;
  }
  date.setTimeZone(gmtZone());
  appendDateTime(text, date.fields());
  text += 'Z';
  return text;
}

std::string iCalendarRepresentation(CalendarDate& date) {
  if (isUniversalZone(date.timeZone())) {
    const CalendarDate::Fields fields = date.fields();
    if (isNoon(fields)) {
      std::string text;
      appendDate(text, fields);
      return text;
    }
    return switchedToGmt(date, fields, {});
  }
  return dateTime(date);
}

std::string dateOnlyPropertyValue(const CalendarDate& date) {
  std::string text(1, ':');
  appendDate(text, date.fields());
  return text;
}

std::string dateTimePropertyValue(CalendarDate& date) {
  const TimeZone& zone = date.timeZone();
  std::string text;
  if (zone.isLocal()) {
    text += ':';
    appendDateTime(text, date.fields());
    return text;
  }
  if (isUniversalZone(zone)) return switchedToGmt(date, date.fields(), ":");
  // RFC 2445 section 4.2.19: the wall-clock time of the zone that TZID names.
  text += ";TZID=";
  text += timezoneBlockID(zone);
  text += ':';
  appendDateTime(text, date.fields());
  return text;
}

std::string iCalendarPropertyValueRepresentation(CalendarDate& date) {
  if (isUniversalZone(date.timeZone())) {
    // Read the fields once for both the whole-day test and the text.
    const CalendarDate::Fields fields = date.fields();
    if (isNoon(fields)) {
      std::string text(1, ':');
      appendDate(text, fields);
      return text;
    }
    return switchedToGmt(date, fields, ":");
  }
  return dateTimePropertyValue(date);
}

void appendPropertyValueRepresentation(std::string& buffer, const CalendarDate& date) {
  const TimeZone& zone = date.timeZone();
  const CalendarDate::Fields fields = date.fields();
  if (isUniversalZone(zone)) {
    buffer += ':';
    if (isNoon(fields)) {
      appendDate(buffer, fields);
    } else {
      appendDateTime(buffer, fields);
      buffer += 'Z';
    }
    return;
  }
  if (zone.isLocal()) {
    buffer += ':';
  } else {
    buffer += ";TZID=";
    appendTimezoneBlockID(zone, buffer);
    buffer += ':';
  }
  appendDateTime(buffer, fields);
}

// --- Recurrence words ---------------------------------------------------------------------

std::string_view iCalendarRepresentationForFrequency(std::string_view word) {
  if (equalsIgnoringAsciiCase(word, "daily")) return "DAILY";
  if (equalsIgnoringAsciiCase(word, "weekly")) return "WEEKLY";
  if (equalsIgnoringAsciiCase(word, "monthly")) return "MONTHLY";
  if (equalsIgnoringAsciiCase(word, "yearly")) return "YEARLY";
  return "ERROR";
}

std::string_view iCalendarRepresentationForDay(std::string_view name) {
  if (equalsIgnoringAsciiCase(name, "sunday")) return "SU";
  if (equalsIgnoringAsciiCase(name, "monday")) return "MO";
  if (equalsIgnoringAsciiCase(name, "tuesday")) return "TU";
  if (equalsIgnoringAsciiCase(name, "wednesday")) return "WE";
  if (equalsIgnoringAsciiCase(name, "thursday")) return "TH";
  if (equalsIgnoringAsciiCase(name, "friday")) return "FR";
  if (equalsIgnoringAsciiCase(name, "saturday")) return "SA";
  return "ERROR";
}

std::optional<std::string> iCalendarRepresentationForByDayFreq(const platform::Array& freqs,
                                                               const platform::Array& days) {
  if (freqs.empty() || freqs.size() != days.size()) return std::nullopt;
  std::string text;
  for (std::size_t i = 0; i < freqs.size(); ++i) {
    if (i > 0) text += ',';
    const platform::Number* ordinal = freqs[i].asNumber();
    const std::int32_t n = ordinal ? ordinal->int32Value() : 0;
    // RFC 2445 section 4.3.10: an ordinal before the day picks one occurrence in the period;
    // none means every one.
    if (n != 0) {
      char digits[16];
      auto [end, ec] = std::to_chars(digits, digits + sizeof digits, n);
      (void)ec;
      text.append(digits, end);
    }
    const std::string* day = days[i].asString();
    text += day ? iCalendarRepresentationForDay(*day) : std::string_view("ERROR");
  }
  return text;
}

}  // namespace zt::icalendar
