#include "importers/ical_time_zones.h"

#include <libical/ical.h>

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <functional>
#include <tuple>
#include <utility>
#include <vector>

#include "importers/ical_windows_zone.h"

namespace tessel::importers {

namespace {

using zt::platform::TimeZone;

// An offset of a day or more is no offset (RFC 5545 section 3.3.14 allows hours 00-23).
bool isPlausibleOffset(int seconds) {
  return std::abs(seconds) < 86400;
}

// The key under which a database name is also found: lower case, and "/", "_", "-" and
// spaces alike ("Europe_Berlin", "europe/berlin", "US-Eastern").
std::string looseKey(std::string_view name) {
  std::string key;
  for (char c : name) {
    if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
    if (c == '/' || c == '-' || c == ' ') c = '_';
    key += c;
  }
  return key;
}

std::optional<TimeZone> databaseZone(std::string_view name) {
  if (auto zone = TimeZone::named(name)) return zone;
  // Of two names of the same key, the first in the database's order counts.
  static const std::map<std::string, std::string, std::less<>> index = [] {
    std::map<std::string, std::string, std::less<>> keys;
    for (const std::string& known : TimeZone::databaseZoneNames()) {
      keys.emplace(looseKey(known), known);
    }
    return keys;
  }();
  const auto found = index.find(looseKey(name));
  if (found == index.end()) return std::nullopt;
  return TimeZone::named(found->second);
}

std::optional<TimeZone> namedZone(std::string_view name) {
  if (auto zone = databaseZone(name)) return zone;
  // "/freeassociation.sourceforge.net/Tzfile/Europe/London", "/mozilla.org/20070129_1/
  // Europe/Berlin", "http://tzurl.org/zoneinfo-outlook/Europe/Berlin": the IANA name
  // ("Area/Location") follows a vendor prefix.
  for (std::size_t slash = name.find('/'); slash != std::string_view::npos;
       slash = name.find('/', slash + 1)) {
    const std::string_view rest = name.substr(slash + 1);
    if (rest.find('/') == std::string_view::npos) break;
    if (auto zone = databaseZone(rest)) return zone;
  }
  return std::nullopt;
}

// The zone a TZURL names: tzurl.org's addresses end with the IANA name, maybe with ".ics".
std::optional<TimeZone> zoneOfUrl(std::string_view url) {
  url = url.substr(0, url.find_first_of("?#"));
  if (url.size() > 4 && url.substr(url.size() - 4) == ".ics") url.remove_suffix(4);
  return namedZone(url);
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

// The observance of that kind that began last, up to the year `until`.
const Observance* latest(const std::vector<Observance>& observances, bool daylight,
                         int until = 9999) {
  const Observance* found = nullptr;
  for (const Observance& observance : observances) {
    if (observance.daylight != daylight || observance.start.year > until) continue;
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

// The unnamed zone of the observances in force in the year `year`: a VTIMEZONE of several
// eras often leaves the older rules without an UNTIL.
std::optional<TimeZone> unnamedZoneOfObservances(const std::vector<Observance>& observances,
                                                 int year) {
  const Observance* standard = latest(observances, false, year);
  const Observance* daylight = latest(observances, true, year);
  if (standard == nullptr && daylight == nullptr) return std::nullopt;
  if (standard == nullptr) return TimeZone::unnamed(daylight->offsetTo);
  // A daylight rule that ended (UNTIL) is history: the zone keeps standard time now.
  if (daylight == nullptr || !daylight->rule ||
      (!icaltime_is_null_time(daylight->rule->until) && daylight->rule->until.year < year)) {
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

// --- Zones known only by their rules -------------------------------------------------------

// The offsets a VTIMEZONE gives, hour by hour over whole years, as libical expands its
// observances (RRULE and RDATE alike).
class VTimezoneClock {
 public:
  explicit VTimezoneClock(icalcomponent* vtimezone) : zone_(icaltimezone_new()) {
    if (zone_ != nullptr &&
        icaltimezone_set_component(zone_, icalcomponent_new_clone(vtimezone)) == 0) {
      icaltimezone_free(zone_, 1);
      zone_ = nullptr;
    }
  }
  ~VTimezoneClock() {
    if (zone_ != nullptr) icaltimezone_free(zone_, 1);
  }
  VTimezoneClock(const VTimezoneClock&) = delete;
  VTimezoneClock& operator=(const VTimezoneClock&) = delete;

  bool valid() const { return zone_ != nullptr; }

  // The offset in force at an instant.
  int offsetAt(std::chrono::sys_seconds instant) const {
    icaltimetype t =
        icaltime_from_timet_with_zone(static_cast<time_t>(instant.time_since_epoch().count()), 0,
                                      icaltimezone_get_utc_timezone());
    int daylight = 0;
    return icaltimezone_get_utc_offset_of_utc_time(zone_, &t, &daylight);
  }

 private:
  icaltimezone* zone_;
};

std::chrono::sys_seconds startOfYear(int year) {
  using namespace std::chrono;
  return sys_seconds{sys_days{std::chrono::year{year} / January / 1}.time_since_epoch()};
}

// The zone of the database whose offsets are those of `offsetAt` at every hour of the
// years `first` to `last`. Of several, the one chosen has the VTIMEZONE's TZNAMEs as its
// abbreviations, then is a zone Windows names (the zones most people use, the most used
// first: America/New_York before America/Indianapolis), then not an "Etc/" zone, then keeps closest
// to the VTIMEZONE in the years before, then comes first in the database.
std::optional<TimeZone> zoneMatchingOffsets(
    const std::function<int(std::chrono::sys_seconds)>& offsetAt,
    const std::vector<std::string>& abbreviations, int first, int last) {
  using namespace std::chrono;
  std::vector<std::int32_t> offsets;
  for (int year = first; year <= last; ++year) {
    for (sys_seconds at = startOfYear(year); at < startOfYear(year + 1); at += hours{1}) {
      const int offset = offsetAt(at);
      if (!isPlausibleOffset(offset)) return std::nullopt;
      offsets.push_back(offset);
    }
  }
  if (offsets.empty()) return std::nullopt;
  const std::vector<std::string>& common = ianaZonesOfDisplayNames();

  const sys_seconds begin = startOfYear(first);
  // How close a zone keeps to the VTIMEZONE in the years before, day by day.
  std::vector<std::int32_t> before;
  const sys_seconds earlier = startOfYear(std::max(1970, first - 40));
  for (sys_seconds at = earlier + hours{12}; at < begin; at += days{1}) {
    before.push_back(offsetAt(at));
  }
  auto closeness = [&](const TimeZone& zone) {
    int same = 0;
    for (std::size_t i = 0; i < before.size(); ++i) {
      same += zone.secondsFromGMT(earlier + hours{12} + days{i}) == before[i] ? 1 : 0;
    }
    return same;
  };

  std::optional<TimeZone> best;
  int bestScore = -1;
  std::ptrdiff_t bestRank = 0;
  int bestCloseness = -1;
  for (const std::string& name : TimeZone::databaseZoneNames()) {
    std::optional<TimeZone> candidate = TimeZone::named(name);
    if (!candidate || candidate->kind() != TimeZone::Kind::Named) continue;
    // The offsets of January and July first weed out most zones.
    if (candidate->secondsFromGMT(begin + days{14}) != offsets[14 * 24] ||
        candidate->secondsFromGMT(begin + days{195}) != offsets[195 * 24]) {
      continue;
    }
    bool same = true;
    for (std::size_t hour = 0; same && hour < offsets.size(); ++hour) {
      same = candidate->secondsFromGMT(begin + hours{hour}) == offsets[hour];
    }
    if (!same) continue;
    int score = 0;
    if (!abbreviations.empty()) {
      const std::string winter = candidate->abbreviation(begin + days{14});
      const std::string summer = candidate->abbreviation(begin + days{195});
      auto known = [&](const std::string& abbreviation) {
        return std::find(abbreviations.begin(), abbreviations.end(), abbreviation) !=
               abbreviations.end();
      };
      if (known(winter) && known(summer)) score += 4;
    }
    const auto rank = std::find(common.begin(), common.end(), name) - common.begin();
    if (rank < static_cast<std::ptrdiff_t>(common.size())) score += 2;
    if (name.find('/') != std::string::npos && name.rfind("Etc/", 0) != 0) score += 1;
    if (score < bestScore || (score == bestScore && rank > bestRank)) continue;
    const int close = closeness(*candidate);
    if (score > bestScore || rank < bestRank || close > bestCloseness) {
      bestScore = score;
      bestRank = rank;
      bestCloseness = close;
      best = candidate;
    }
  }
  return best;
}

std::vector<std::string> abbreviationsOf(icalcomponent* vtimezone) {
  std::vector<std::string> abbreviations;
  for (icalcomponent* part = icalcomponent_get_first_component(vtimezone, ICAL_ANY_COMPONENT);
       part != nullptr; part = icalcomponent_get_next_component(vtimezone, ICAL_ANY_COMPONENT)) {
    for (icalproperty* name = icalcomponent_get_first_property(part, ICAL_TZNAME_PROPERTY);
         name != nullptr; name = icalcomponent_get_next_property(part, ICAL_TZNAME_PROPERTY)) {
      if (const char* text = icalproperty_get_tzname(name)) abbreviations.push_back(text);
    }
  }
  return abbreviations;
}

// The zone of the database that the VTIMEZONE describes: first read as libical expands it
// (RFC 5545 section 3.6.5), then, for the VTIMEZONEs of several eras whose older rules have
// no UNTIL, with the latest STANDARD and DAYLIGHT observances begun by each year.
std::optional<TimeZone> zoneMatchingRules(icalcomponent* vtimezone, int first, int last) {
  const std::vector<std::string> abbreviations = abbreviationsOf(vtimezone);
  {
    VTimezoneClock clock(vtimezone);
    if (clock.valid()) {
      auto offsetAt = [&](std::chrono::sys_seconds at) { return clock.offsetAt(at); };
      if (auto zone = zoneMatchingOffsets(offsetAt, abbreviations, first, last)) return zone;
    }
  }
  const std::vector<Observance> observances = observancesOf(vtimezone);
  std::map<int, std::optional<TimeZone>> byYear;
  auto offsetAt = [&](std::chrono::sys_seconds at) {
    using namespace std::chrono;
    const int year = static_cast<int>(year_month_day{floor<days>(at)}.year());
    auto found = byYear.find(year);
    if (found == byYear.end()) {
      found = byYear.emplace(year, unnamedZoneOfObservances(observances, year)).first;
    }
    return found->second ? found->second->secondsFromGMT(at) : 86400;
  };
  return zoneMatchingOffsets(offsetAt, abbreviations, first, last);
}

}  // namespace

std::optional<TimeZone> unnamedZoneOfVTimezone(icalcomponent* vtimezone) {
  return unnamedZoneOfObservances(observancesOf(vtimezone), 9999);
}

ICalTimeZones::ICalTimeZones(icalcomponent* calendar, ItemYears itemYears)
    : itemYears_(std::move(itemYears)) {
  for (icalcompiter it = icalcomponent_begin_component(calendar, ICAL_ANY_COMPONENT);
       icalcompiter_deref(&it) != nullptr; icalcompiter_next(&it)) {
    icalcomponent* component = icalcompiter_deref(&it);
    if (icalcomponent_isa(component) != ICAL_VTIMEZONE_COMPONENT) {
      // The years the calendar's items start in, over which zones are matched by their rules.
      icalproperty* start = icalcomponent_get_first_property(component, ICAL_DTSTART_PROPERTY);
      addYear(start != nullptr ? icalproperty_get_dtstart(start).year : 0);
      continue;
    }
    icalproperty* tzid = icalcomponent_get_first_property(component, ICAL_TZID_PROPERTY);
    const char* name = tzid != nullptr ? icalproperty_get_tzid(tzid) : nullptr;
    // The first definition of a TZID counts.
    if (name != nullptr) definitions_.emplace(name, component);
  }
}

void ICalTimeZones::addYear(int year) {
  if (year >= kFirstMatchedYear && year <= kLastMatchedYear) {
    firstYear_ = firstYear_ == 0 ? year : std::min(firstYear_, year);
    lastYear_ = std::max(lastYear_, year);
  }
}

void ICalTimeZones::settleYears() {
  if (yearsSettled_) return;
  yearsSettled_ = true;
  if (itemYears_) {
    for (int year : itemYears_()) addYear(year);
  }
  if (firstYear_ == 0) {
    using namespace std::chrono;
    firstYear_ = lastYear_ =
        static_cast<int>(year_month_day{floor<days>(system_clock::now())}.year());
  }
  // The latest years count most: a long history is matched over its last twenty years.
  firstYear_ = std::max(firstYear_, lastYear_ - 19);
}

std::optional<TimeZone> ICalTimeZones::zone(std::string_view tzid) {
  auto found = resolved_.find(tzid);
  if (found == resolved_.end()) found = resolved_.emplace(std::string(tzid), resolve(tzid)).first;
  return found->second;
}

std::optional<TimeZone> ICalTimeZones::resolve(std::string_view tzid) {
  // The IANA name, also in another case, with "_" for "/", or behind a vendor prefix.
  if (auto zone = namedZone(tzid)) return zone;
  const auto definition = definitions_.find(tzid);
  icalcomponent* vtimezone = definition != definitions_.end() ? definition->second : nullptr;
  if (vtimezone != nullptr) {
    // Evolution names the IANA zone of its VTIMEZONEs in X-LIC-LOCATION, others in a TZURL
    // (RFC 5545 section 3.8.3.5).
    for (icalproperty* property = icalcomponent_get_first_property(vtimezone, ICAL_ANY_PROPERTY);
         property != nullptr;
         property = icalcomponent_get_next_property(vtimezone, ICAL_ANY_PROPERTY)) {
      if (icalproperty_isa(property) == ICAL_TZURL_PROPERTY) {
        const char* url = icalproperty_get_tzurl(property);
        if (url == nullptr) continue;
        if (auto zone = zoneOfUrl(url)) return zone;
        continue;
      }
      if (icalproperty_isa(property) != ICAL_X_PROPERTY) continue;
      const char* name = icalproperty_get_x_name(property);
      const char* value = icalproperty_get_x(property);
      if (name == nullptr || value == nullptr || std::string_view(name) != "X-LIC-LOCATION") {
        continue;
      }
      if (auto zone = namedZone(value)) return zone;
    }
  }
  // Outlook's Windows zone names and display names.
  std::optional<std::string> iana = ianaZoneForWindowsZone(tzid);
  if (!iana) {
    if (std::optional<std::string_view> windows = windowsZoneForDisplayName(tzid)) {
      iana = ianaZoneForWindowsZone(*windows);
    }
  }
  if (iana) {
    if (auto zone = TimeZone::named(*iana)) return zone;
  }
  if (vtimezone == nullptr) return std::nullopt;
  settleYears();
  if (auto zone = zoneMatchingRules(vtimezone, firstYear_, lastYear_)) return zone;
  return unnamedZoneOfVTimezone(vtimezone);
}

}  // namespace tessel::importers
