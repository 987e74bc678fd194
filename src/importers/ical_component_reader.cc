#include "importers/ical_component_reader.h"

#include <chrono>
#include <cstdint>
#include <utility>

#include "importers/ical_properties.h"
#include "platform/calendar_day.h"

namespace tessel::importers::ical {

using zt::platform::CalendarDate;
using zt::platform::TimeZone;

ImportError ComponentReader::error(icalproperty* property, std::string reason) const {
  return document_.errorAt(property, component_, std::move(reason));
}

void ComponentReader::warn(icalproperty* property, std::string_view text) const {
  document_.warnings().note(document_.source(), document_.lineAt(property, component_),
                            std::string(text));
}

void ComponentReader::drop(const ImportError& fault, icalproperty* property) const {
  document_.warnings().fault(
      fault, "dropped the " + name(property) + " of " + ICalDocument::describe(component_));
}

std::string ComponentReader::name(icalproperty* property) const {
  const char* name = icalproperty_get_property_name(property);
  return name != nullptr ? std::string(name) : std::string("property");
}

namespace {

// The engine carries whole days as 12:00:00 in the GMT zone, and the calendar writer writes
// any noon in the GMT or UTC zone as a DATE. A time at noon UTC (Google writes timed events
// in UTC: 13:00 in Paris in winter) is kept in "Etc/UTC", the same offset under another name,
// so that it stays a time (RFC 5545 section 3.3.5).
TimeZone zoneOfUtcTime(const TimeZone& zone, const CalendarDate::Fields& f) {
  if (f.hour != 12 || f.minute != 0 || f.second != 0) return zone;
  if (zone != TimeZone::gmt() && zone != TimeZone::utc()) return zone;
  static const TimeZone timed = TimeZone::named("Etc/UTC").value_or(TimeZone::utc());
  return timed;
}

}  // namespace

ReadDate ComponentReader::date(icalproperty* property, const icaltimetype& t,
                               const std::optional<TimeZone>& floatingZone) const {
  check(property, t);
  const int second = t.second == 60 ? 59 : t.second;  // a leap second reads as :59
  if (t.is_date) {
    return {CalendarDate::fromFields({t.year, t.month, t.day, 12, 0, 0}, TimeZone::gmt()), true};
  }
  const CalendarDate::Fields fields{t.year, t.month, t.day, t.hour, t.minute, second};
  if (icaltime_is_utc(t)) {
    return {CalendarDate::fromFields(fields, zoneOfUtcTime(TimeZone::utc(), fields)), false};
  }
  if (std::optional<std::string> tzid = parameter(property, "TZID")) {
    std::optional<TimeZone> zone = zones_.zone(*tzid);
    if (zone) return {CalendarDate::fromFields(fields, zoneOfUtcTime(*zone, fields)), false};
    document_.warnings().fault(
        error(property, name(property) + ": no VTIMEZONE defines the time zone \"" + *tzid +
                            "\", and it is no IANA or Windows zone name"),
        "read the " + name(property) + " of " + ICalDocument::describe(component_) +
            " as a floating time");
  }
  return {CalendarDate::fromFields(fields, floatingZone ? *floatingZone : TimeZone::local()),
          false};
}

ReadDate ComponentReader::plus(icalproperty* property, const ReadDate& start,
                               const icaldurationtype& d) const {
  const std::int64_t days = std::int64_t{d.weeks} * 7 + d.days;
  const std::int64_t exact =
      std::int64_t{d.hours} * 3600 + std::int64_t{d.minutes} * 60 + d.seconds;
  if (days * 86400 + exact > kLongestDuration) {
    throw error(property, name(property) + ": a duration of more than 1000 years");
  }
  const std::int64_t sign = d.is_neg ? -1 : 1;
  const TimeZone& zone = start.date.timeZone();
  CalendarDate::Fields f = start.date.fields();
  using namespace std::chrono;
  const year_month_day day{local_days{year{f.year} / f.month / f.day} +
                           std::chrono::days{sign * days}};
  f.year = static_cast<int>(day.year());
  f.month = static_cast<int>(static_cast<unsigned>(day.month()));
  f.day = static_cast<int>(static_cast<unsigned>(day.day()));
  const CalendarDate moved = CalendarDate::fromFields(f, zone);
  return {CalendarDate(moved.instant() + seconds{sign * exact}, zone), start.wholeDay};
}

void ComponentReader::check(icalproperty* property, const icaltimetype& t) const {
  if (icaltime_is_null_time(t)) throw error(property, name(property) + ": no date");
  if (t.year < 1 || t.year > 9999) {
    throw error(property, name(property) + ": the year " + std::to_string(t.year));
  }
  if (t.month < 1 || t.month > 12) {
    throw error(property, name(property) + ": there is no month " + std::to_string(t.month));
  }
  if (!zt::platform::isCalendarDay(t.year, t.month, t.day)) {
    throw error(property, name(property) + ": month " + std::to_string(t.month) + " of " +
                              std::to_string(t.year) + " has no day " + std::to_string(t.day));
  }
  if (!t.is_date && (t.hour < 0 || t.hour > 23 || t.minute < 0 || t.minute > 59 || t.second < 0 ||
                     t.second > 60)) {
    throw error(property, name(property) + ": there is no time " + twoDigits(t.hour) + ":" +
                              twoDigits(t.minute) + ":" + twoDigits(t.second));
  }
}

std::string twoDigits(int n) {
  return (n < 10 ? "0" : "") + std::to_string(n);
}

}  // namespace tessel::importers::ical
