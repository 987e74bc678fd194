#include "tessel/record_json_values.h"

#include <array>
#include <cstdint>
#include <cstdio>
#include <initializer_list>
#include <utility>

#include "platform/base64.h"
#include "platform/iso_wall_clock.h"

namespace tessel::typed_json {

using zt::platform::CalendarDate;
using zt::platform::Data;
using zt::platform::TimeZone;
using zt::platform::Url;
using zt::platform::Value;

namespace {

// No zone is a day or more away from GMT; a larger number is a mistake (milliseconds for
// seconds, say) that would otherwise be stored as a zone.
constexpr std::int64_t kMaxZoneOffset = 24 * 3600;

// ----- base64 (RFC 4648, standard alphabet, padded; both ways the platform's) -------------

// Only the canonical text is accepted (padding present, unused bits zero), so that a byte
// string has exactly one written form and a damaged text is noticed rather than guessed at.
std::optional<Data> decodeBase64(std::string_view text, std::string& why) {
  using zt::platform::base64::DecodeFault;
  DecodeFault fault{};
  std::optional<Data> out =
      zt::platform::base64::decode(text, zt::platform::base64::Form::Canonical, &fault);
  if (out) return out;
  switch (fault.kind) {
    case DecodeFault::Kind::Length:
      why = "base64 text length " + std::to_string(text.size()) + " is not a multiple of 4";
      break;
    case DecodeFault::Kind::Character:
      why = "invalid base64 character " + jsonQuoted(text.substr(fault.offset, 1)) + " at offset " +
            std::to_string(fault.offset);
      break;
    case DecodeFault::Kind::StrayBits:
    case DecodeFault::Kind::Padding:
      why = "base64 text has stray bits before its padding";
      break;
  }
  return std::nullopt;
}

// ----- dates -------------------------------------------------------------------------------

struct WallClock {
  CalendarDate::Fields fields;
  std::uint32_t nanoseconds = 0;
};

// "YYYY-MM-DDTHH:MM[:SS[.fraction]]"; the year may have more than four digits and a sign, so
// that every date the store can hold has a written form. Says why in `why` when given: the
// quick scanner of JSON Lines reads dates by the thousand and needs no reason.
std::optional<WallClock> parseWallClock(std::string_view text, std::string* why) {
  namespace iso = zt::platform::iso;
  const auto refuse = [&](const std::string& reason) -> std::optional<WallClock> {
    if (why != nullptr) *why = "date " + jsonQuoted(text) + reason;
    return std::nullopt;
  };
  const char* const kForm = " is not of the form YYYY-MM-DDTHH:MM[:SS[.fraction]]";
  std::size_t pos = 0;
  iso::ReadFault fault = iso::ReadFault::Form;
  const std::optional<iso::WallClock> read =
      iso::readWallClock(text, pos, iso::YearForm::Extended, iso::SecondsForm::Optional, &fault);
  if (!read) {
    return refuse(fault == iso::ReadFault::LongFraction ? " has more than nine fractional digits"
                                                        : kForm);
  }
  if (pos != text.size()) return refuse(kForm);

  const iso::WallClock& f = *read;
  switch (iso::firstInvalidField(f)) {
    case iso::Field::Month:
      return refuse(" has month " + std::to_string(f.month));
    case iso::Field::Day:
      return refuse(" has day " + std::to_string(f.day) + ", not in that month");
    case iso::Field::Hour:
      return refuse(" has hour " + std::to_string(f.hour));
    case iso::Field::Minute:
      return refuse(" has minute " + std::to_string(f.minute));
    case iso::Field::Second:
      return refuse(" has second " + std::to_string(f.second));
    case iso::Field::None:
      break;
  }
  WallClock clock;
  clock.fields = {static_cast<int>(f.year), static_cast<int>(f.month),  static_cast<int>(f.day),
                  static_cast<int>(f.hour), static_cast<int>(f.minute), static_cast<int>(f.second)};
  clock.nanoseconds = f.nanoseconds;
  return clock;
}

// A wall-clock time shown twice (autumn fold) reads as its earlier instant; the typed form has
// no offset to say otherwise.
Value dateOf(const WallClock& clock, TimeZone zone) {
  const CalendarDate date = CalendarDate::fromFields(clock.fields, zone);
  return Value(CalendarDate(date.instant(), std::move(zone), clock.nanoseconds));
}

std::string formatWallClock(const CalendarDate& date) {
  const CalendarDate::Fields f = date.fields();
  std::string year = std::to_string(f.year < 0 ? -static_cast<std::int64_t>(f.year) : f.year);
  if (year.size() < 4) year.insert(0, 4 - year.size(), '0');
  if (f.year < 0) year.insert(0, 1, '-');

  std::array<char, 32> buffer{};
  std::snprintf(buffer.data(), buffer.size(), "-%02d-%02dT%02d:%02d:%02d", f.month, f.day, f.hour,
                f.minute, f.second);
  return year + buffer.data() + zt::platform::iso::fraction(date.nanoseconds());
}

// ----- zones -------------------------------------------------------------------------------

Json zoneToJson(const TimeZone& zone) {
  switch (zone.kind()) {
    case TimeZone::Kind::Local:
      return "local";
    case TimeZone::Kind::Named:
      return zone.name().value_or("UTC");
    case TimeZone::Kind::Unnamed:
      break;
  }
  Json out = Json::object();
  out["std"] = zone.standardOffset().value_or(0);
  if (auto dst = zone.daylightOffset()) out["dst"] = *dst;
  if (auto rule = zone.daylightRule(); rule && !rule->empty()) out["rule"] = *rule;
  return out;
}

TimeZone zoneFromJson(const Json& json, const Path& path) {
  if (json.is_string()) {
    const std::string name = json.get<std::string>();
    if (auto zone = zoneNamed(name)) return *zone;
    fail(path, "unknown time zone " + jsonQuoted(name));
  }
  if (!json.is_object()) {
    fail(path, "a time zone is a name or {\"std\": ..., \"dst\": ..., \"rule\": ...}, not " +
                   std::string(jsonKindName(json)));
  }
  auto offset = [&](const char* key) -> std::optional<std::int32_t> {
    auto it = json.find(key);
    if (it == json.end()) return std::nullopt;
    const Path here = path.child(key);
    if (!it->is_number_integer()) {
      fail(here,
           "an offset is an integer number of seconds, not " + std::string(jsonKindName(*it)));
    }
    const bool inRange =
        it->is_number_unsigned()
            ? it->get<std::uint64_t>() < std::uint64_t{kMaxZoneOffset}
            : it->get<std::int64_t>() > -kMaxZoneOffset && it->get<std::int64_t>() < kMaxZoneOffset;
    if (!inRange) fail(here, "offset " + it->dump() + " is a day or more");
    return static_cast<std::int32_t>(it->get<std::int64_t>());
  };
  for (const auto& [key, item] : json.items()) {
    if (key != "std" && key != "dst" && key != "rule") {
      fail(path.child(key), "unexpected key in a time zone (std, dst and rule are known)");
    }
  }
  const std::optional<std::int32_t> standard = offset("std");
  if (!standard) fail(path, "an unnamed time zone needs its standard offset \"std\"");
  const std::optional<std::int32_t> daylight = offset("dst");
  std::string rule;
  if (auto it = json.find("rule"); it != json.end()) {
    if (!it->is_string()) fail(path.child("rule"), "a daylight rule is a string");
    rule = it->get<std::string>();
    if (!daylight) fail(path.child("rule"), "a daylight rule needs a daylight offset \"dst\"");
  }
  auto zone = TimeZone::unnamed(*standard, daylight, rule);
  if (!zone) fail(path.child("rule"), "daylight rule " + jsonQuoted(rule) + " cannot be read");
  return *zone;
}

}  // namespace

std::optional<TimeZone> zoneNamed(std::string_view name) {
  if (name == "local") return TimeZone::local();
  if (name == "GMT") return TimeZone::gmt();
  if (name == "UTC") return TimeZone::utc();
  return TimeZone::named(name);
}

std::optional<Value> dateValue(std::string_view wallClock, TimeZone zone) {
  const std::optional<WallClock> clock = parseWallClock(wallClock, nullptr);
  if (!clock) return std::nullopt;
  return dateOf(*clock, std::move(zone));
}

Json dateToJson(const CalendarDate& date) {
  Json out = Json::object();
  out["$date"] = formatWallClock(date);
  out["tz"] = zoneToJson(date.timeZone());
  return out;
}

Value typedValueFromJson(const Json& json, const Path& path) {
  auto onlyKeys = [&](std::initializer_list<std::string_view> allowed, std::string_view kind) {
    for (const auto& [key, item] : json.items()) {
      bool known = false;
      for (std::string_view a : allowed) known = known || key == a;
      if (!known) {
        fail(path.child(key), "unexpected key beside " + std::string(kind));
      }
    }
  };
  auto stringAt = [&](const char* key) -> std::string {
    const Json& item = json.at(key);
    if (!item.is_string()) {
      fail(path.child(key),
           std::string(key) + " holds a string, not " + std::string(jsonKindName(item)));
    }
    return item.get<std::string>();
  };

  if (json.contains("$url")) {
    onlyKeys({"$url"}, "$url");
    return Value(Url{stringAt("$url")});
  }
  if (json.contains("$data")) {
    onlyKeys({"$data"}, "$data");
    std::string why;
    auto data = decodeBase64(stringAt("$data"), why);
    if (!data) fail(path.child("$data"), why);
    return Value(std::move(*data));
  }
  if (json.contains("$date")) {
    onlyKeys({"$date", "tz"}, "$date");
    std::string why;
    auto clock = parseWallClock(stringAt("$date"), &why);
    if (!clock) fail(path.child("$date"), why);
    if (!json.contains("tz")) fail(path, "a date needs its time zone \"tz\"");
    return dateOf(*clock, zoneFromJson(json.at("tz"), path.child("tz")));
  }
  for (const auto& [key, item] : json.items()) {
    if (!key.empty() && key.front() == '$') {
      fail(path.child(key), "unknown typed value (known: $url, $data, $date)");
    }
  }
  fail(path, "not a typed value");
}

}  // namespace tessel::typed_json
