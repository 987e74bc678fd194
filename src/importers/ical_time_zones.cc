#include "importers/ical_time_zones.h"

#include <libical/ical.h>

#include <cstdint>
#include <cstdlib>
#include <tuple>
#include <vector>

#include "importers/ical_windows_zone.h"

namespace tessel::importers {

namespace {

using zt::platform::TimeZone;

// An offset of a day or more is no offset (RFC 5545 section 3.3.14 allows hours 00-23).
bool isPlausibleOffset(int seconds) {
  return std::abs(seconds) < 86400;
}

std::optional<TimeZone> namedZone(std::string_view name) {
  if (auto zone = TimeZone::named(name)) return zone;
  // "/freeassociation.sourceforge.net/Tzfile/Europe/London", "/mozilla.org/20070129_1/
  // Europe/Berlin": the IANA name follows a vendor prefix.
  for (std::size_t slash = name.find('/'); slash != std::string_view::npos;
       slash = name.find('/', slash + 1)) {
    const std::string_view rest = name.substr(slash + 1);
    if (rest.find('/') == std::string_view::npos) break;
    if (auto zone = TimeZone::named(rest)) return zone;
  }
  return std::nullopt;
}

struct Observance {
  bool daylight = false;
  icaltimetype start{};
  int offsetTo = 0;
  std::optional<icalrecurrencetype> rule;
};

auto startKey(const icaltimetype& t) {
  return std::make_tuple(t.year, t.month, t.day, t.hour, t.minute, t.second);
}

std::vector<Observance> observancesOf(icalcomponent* vtimezone) {
  std::vector<icalcomponent*> parts;
  for (icalcompiter it = icalcomponent_begin_component(vtimezone, ICAL_ANY_COMPONENT);
       icalcompiter_deref(&it) != nullptr; icalcompiter_next(&it)) {
    parts.push_back(icalcompiter_deref(&it));
  }
  std::vector<Observance> observances;
  for (icalcomponent* part : parts) {
    const icalcomponent_kind kind = icalcomponent_isa(part);
    if (kind != ICAL_XSTANDARD_COMPONENT && kind != ICAL_XDAYLIGHT_COMPONENT) continue;
    Observance observance;
    observance.daylight = kind == ICAL_XDAYLIGHT_COMPONENT;
    icalproperty* offset = icalcomponent_get_first_property(part, ICAL_TZOFFSETTO_PROPERTY);
    if (offset == nullptr) continue;
    observance.offsetTo = icalproperty_get_tzoffsetto(offset);
    if (!isPlausibleOffset(observance.offsetTo)) continue;
    if (icalproperty* start = icalcomponent_get_first_property(part, ICAL_DTSTART_PROPERTY)) {
      observance.start = icalproperty_get_dtstart(start);
    }
    if (icalproperty* rule = icalcomponent_get_first_property(part, ICAL_RRULE_PROPERTY)) {
      observance.rule = icalproperty_get_rrule(rule);
    }
    observances.push_back(observance);
  }
  return observances;
}

const Observance* latest(const std::vector<Observance>& observances, bool daylight) {
  const Observance* found = nullptr;
  for (const Observance& observance : observances) {
    if (observance.daylight != daylight) continue;
    if (found == nullptr || startKey(observance.start) >= startKey(found->start)) {
      found = &observance;
    }
  }
  return found;
}

// One yearly transition in the POSIX form "Mm.w.d[/time]", from an RRULE such as
// "FREQ=YEARLY;BYMONTH=3;BYDAY=-1SU" (or "BYDAY=SU;BYMONTHDAY=8,9,10,11,12,13,14") and the
// wall-clock time of the observance's DTSTART, which RFC 5545 section 3.6.5 gives in the
// offset in force before the change, as POSIX wants it.
std::optional<std::string> posixTransition(const Observance& observance) {
  if (!observance.rule) return std::nullopt;
  const icalrecurrencetype& rule = *observance.rule;
  if (rule.freq != ICAL_YEARLY_RECURRENCE || rule.interval > 1) return std::nullopt;
  if (rule.by_month[0] == ICAL_RECURRENCE_ARRAY_MAX ||
      rule.by_month[1] != ICAL_RECURRENCE_ARRAY_MAX) {
    return std::nullopt;
  }
  if (rule.by_day[0] == ICAL_RECURRENCE_ARRAY_MAX || rule.by_day[1] != ICAL_RECURRENCE_ARRAY_MAX) {
    return std::nullopt;
  }
  const int month = icalrecurrencetype_month_month(rule.by_month[0]);
  const int weekday = static_cast<int>(icalrecurrencetype_day_day_of_week(rule.by_day[0])) - 1;
  int week = icalrecurrencetype_day_position(rule.by_day[0]);
  if (week == 0 && rule.by_month_day[0] != ICAL_RECURRENCE_ARRAY_MAX) {
    // A run of seven month days picks one weekday: 8-14 is the second, -7..-1 the last.
    const int first = rule.by_month_day[0];
    week = first < 0 ? 5 : (first - 1) / 7 + 1;
  }
  if (week == -1) week = 5;
  if (month < 1 || month > 12 || weekday < 0 || weekday > 6 || week < 1 || week > 5) {
    return std::nullopt;
  }
  std::string text =
      "M" + std::to_string(month) + "." + std::to_string(week) + "." + std::to_string(weekday);
  const icaltimetype& at = observance.start;
  if (at.hour < 0 || at.hour > 23 || at.minute < 0 || at.minute > 59 || at.second < 0 ||
      at.second > 59) {
    return std::nullopt;
  }
  // 02:00 is what POSIX assumes when no time is given.
  if (at.hour != 2 || at.minute != 0 || at.second != 0) {
    text += "/" + std::to_string(at.hour);
    if (at.minute != 0 || at.second != 0) {
      text += (at.minute < 10 ? ":0" : ":") + std::to_string(at.minute);
      text += (at.second < 10 ? ":0" : ":") + std::to_string(at.second);
    }
  }
  return text;
}

}  // namespace

std::optional<TimeZone> unnamedZoneOfVTimezone(icalcomponent* vtimezone) {
  const std::vector<Observance> observances = observancesOf(vtimezone);
  const Observance* standard = latest(observances, false);
  const Observance* daylight = latest(observances, true);
  if (standard == nullptr && daylight == nullptr) return std::nullopt;
  if (standard == nullptr) return TimeZone::unnamed(daylight->offsetTo);
  // A daylight rule that ended (UNTIL) is history: the zone keeps standard time now.
  if (daylight == nullptr || !daylight->rule || !icaltime_is_null_time(daylight->rule->until)) {
    return TimeZone::unnamed(standard->offsetTo);
  }
  const std::optional<std::string> begins = posixTransition(*daylight);
  const std::optional<std::string> ends = posixTransition(*standard);
  if (!begins || !ends) return TimeZone::unnamed(standard->offsetTo);
  if (auto zone =
          TimeZone::unnamed(standard->offsetTo, daylight->offsetTo, *begins + "," + *ends)) {
    return zone;
  }
  return TimeZone::unnamed(standard->offsetTo);
}

ICalTimeZones::ICalTimeZones(icalcomponent* calendar) {
  for (icalcompiter it = icalcomponent_begin_component(calendar, ICAL_VTIMEZONE_COMPONENT);
       icalcompiter_deref(&it) != nullptr; icalcompiter_next(&it)) {
    icalcomponent* vtimezone = icalcompiter_deref(&it);
    icalproperty* tzid = icalcomponent_get_first_property(vtimezone, ICAL_TZID_PROPERTY);
    const char* name = tzid != nullptr ? icalproperty_get_tzid(tzid) : nullptr;
    // The first definition of a TZID counts.
    if (name != nullptr) definitions_.emplace(name, vtimezone);
  }
}

std::optional<TimeZone> ICalTimeZones::zone(std::string_view tzid) {
  auto found = resolved_.find(tzid);
  if (found == resolved_.end()) found = resolved_.emplace(std::string(tzid), resolve(tzid)).first;
  return found->second;
}

std::optional<TimeZone> ICalTimeZones::resolve(std::string_view tzid) const {
  if (auto zone = namedZone(tzid)) return zone;
  const auto definition = definitions_.find(tzid);
  icalcomponent* vtimezone = definition != definitions_.end() ? definition->second : nullptr;
  if (vtimezone != nullptr) {
    // Evolution names the IANA zone of its VTIMEZONEs in X-LIC-LOCATION.
    for (icalproperty* property = icalcomponent_get_first_property(vtimezone, ICAL_X_PROPERTY);
         property != nullptr;
         property = icalcomponent_get_next_property(vtimezone, ICAL_X_PROPERTY)) {
      const char* name = icalproperty_get_x_name(property);
      const char* value = icalproperty_get_x(property);
      if (name == nullptr || value == nullptr || std::string_view(name) != "X-LIC-LOCATION") {
        continue;
      }
      if (auto zone = namedZone(value)) return zone;
    }
  }
  if (auto iana = ianaZoneForWindowsZone(tzid)) {
    if (auto zone = TimeZone::named(*iana)) return zone;
  }
  if (vtimezone != nullptr) return unnamedZoneOfVTimezone(vtimezone);
  return std::nullopt;
}

}  // namespace tessel::importers
