#include "platform/time_zone.h"

#include <date/tz.h>

#include <cstdlib>
#include <exception>
#include <map>
#include <mutex>

namespace zt::platform {

namespace {

// One transition of a POSIX TZ rule, "Mm.w.d[/time]": day d (0 = Sunday) of week w (5 =
// last) of month m, at `time` local wall-clock seconds (02:00 when not given).
struct Transition {
  unsigned month = 0;
  unsigned week = 0;
  unsigned weekday = 0;
  std::int32_t time = 7200;
};

std::optional<Transition> parseTransition(std::string_view text) {
  Transition t;
  unsigned values[3] = {0, 0, 0};
  std::size_t pos = 0;
  if (text.empty() || text[pos++] != 'M') return std::nullopt;
  for (int i = 0; i < 3; ++i) {
    if (i > 0 && (pos >= text.size() || text[pos++] != '.')) return std::nullopt;
    std::size_t start = pos;
    while (pos < text.size() && text[pos] >= '0' && text[pos] <= '9' && pos - start < 3) {
      values[i] = values[i] * 10 + static_cast<unsigned>(text[pos++] - '0');
    }
    if (pos == start) return std::nullopt;
  }
  t.month = values[0];
  t.week = values[1];
  t.weekday = values[2];
  if (t.month < 1 || t.month > 12 || t.week < 1 || t.week > 5 || t.weekday > 6) {
    return std::nullopt;
  }
  if (pos < text.size()) {
    if (text[pos++] != '/') return std::nullopt;
    bool negative = pos < text.size() && text[pos] == '-';
    if (negative || (pos < text.size() && text[pos] == '+')) ++pos;
    std::int32_t parts[3] = {0, 0, 0};
    int part = 0;
    std::size_t start = pos;
    for (; pos < text.size(); ++pos) {
      char c = text[pos];
      if (c == ':') {
        if (++part > 2) return std::nullopt;
      } else if (c >= '0' && c <= '9') {
        parts[part] = parts[part] * 10 + (c - '0');
        if (parts[part] > 167) return std::nullopt;
      } else {
        return std::nullopt;
      }
    }
    if (pos == start) return std::nullopt;
    t.time = (parts[0] * 3600 + parts[1] * 60 + parts[2]) * (negative ? -1 : 1);
  }
  return t;
}

}  // namespace

// The daylight rule of an unnamed zone: when daylight time starts and ends each year.
struct DaylightRule {
  Transition start;
  Transition end;

  static std::optional<DaylightRule> parse(std::string_view rule) {
    std::size_t comma = rule.find(',');
    if (comma == std::string_view::npos) return std::nullopt;
    auto start = parseTransition(rule.substr(0, comma));
    auto end = parseTransition(rule.substr(comma + 1));
    if (!start || !end) return std::nullopt;
    return DaylightRule{*start, *end};
  }

  // The local wall-clock second of a transition in a given year.
  static std::chrono::local_seconds at(const Transition& t, int year) {
    using namespace std::chrono;
    year_month_weekday_last last{std::chrono::year{year} / month{t.month} /
                                 weekday_last{weekday{t.weekday}}};
    local_days day;
    if (t.week == 5) {
      day = local_days{last};
    } else {
      day = local_days{year_month_weekday{std::chrono::year{year} / month{t.month} /
                                          weekday_indexed{weekday{t.weekday}, t.week}}};
    }
    return day + seconds{t.time};
  }

  bool isDaylight(std::chrono::sys_seconds instant, std::int32_t standard,
                  std::int32_t daylight) const {
    using namespace std::chrono;
    int year = static_cast<int>(year_month_day{floor<days>(instant)}.year());
    // The start is given in standard time, the end in daylight time (POSIX TZ).
    sys_seconds begins{at(start, year).time_since_epoch() - seconds{standard}};
    sys_seconds ends{at(end, year).time_since_epoch() - seconds{daylight}};
    if (begins < ends) return instant >= begins && instant < ends;
    // Southern hemisphere: daylight time spans the turn of the year.
    return instant < ends || instant >= begins;
  }
};

struct TimeZone::Impl {
  Kind kind = Kind::Named;
  std::string name;
  // Null for "GMT" and "UTC", which are fixed at offset zero and need no database.
  const date::time_zone* zone = nullptr;
  std::int32_t standardOffset = 0;
  std::optional<std::int32_t> daylightOffset;
  std::string rule;
  std::optional<DaylightRule> posix;
};

namespace {

// The local zone follows $TZ when it names a zone of the database, else the machine's
// setting. It is looked up again whenever $TZ changes, so the zone "tracks" like the
// desktop's automatically updating local zone.
const date::time_zone* currentLocalZone() {
  static std::mutex mutex;
  static std::string lastTz;
  static bool resolved = false;
  static const date::time_zone* cached = nullptr;

  const char* env = std::getenv("TZ");
  std::string tz = env ? env : "";
  if (!tz.empty() && tz.front() == ':') tz.erase(0, 1);

  std::lock_guard lock(mutex);
  if (resolved && tz == lastTz) return cached;
  cached = nullptr;
  if (!tz.empty()) {
    try {
      cached = date::locate_zone(tz);
    } catch (const std::exception&) {
    }
  }
  if (!cached) {
    try {
      cached = date::current_zone();
    } catch (const std::exception&) {
    }
  }
  if (!cached) {
    try {
      cached = date::locate_zone("Etc/UTC");
    } catch (const std::exception&) {
    }
  }
  lastTz = tz;
  resolved = true;
  return cached;
}

struct Info {
  std::int32_t offset = 0;
  bool daylight = false;
};

Info infoAt(const TimeZone::Impl& impl, std::chrono::sys_seconds instant) {
  date::sys_seconds t{instant.time_since_epoch()};
  auto fromSys = [](const date::sys_info& i) {
    return Info{static_cast<std::int32_t>(i.offset.count()), i.save != std::chrono::minutes{0}};
  };
  switch (impl.kind) {
    case TimeZone::Kind::Named:
      if (!impl.zone) return {};
      return fromSys(impl.zone->get_info(t));
    case TimeZone::Kind::Local: {
      const date::time_zone* zone = currentLocalZone();
      return zone ? fromSys(zone->get_info(t)) : Info{};
    }
    case TimeZone::Kind::Unnamed:
      if (impl.posix &&
          impl.posix->isDaylight(instant, impl.standardOffset, *impl.daylightOffset)) {
        return Info{*impl.daylightOffset, true};
      }
      return Info{impl.standardOffset, false};
  }
  return {};
}

std::chrono::sys_seconds instantFromLocal(const date::local_info& info,
                                          std::chrono::local_seconds wallClock) {
  // Unique and ambiguous times take the first (earlier) offset; a skipped time is read with
  // the offset in force before the gap.
  return std::chrono::sys_seconds{wallClock.time_since_epoch() - info.first.offset};
}

}  // namespace

TimeZone TimeZone::gmt() {
  static const TimeZone zone(
      std::make_shared<Impl>(Impl{Kind::Named, "GMT", nullptr, 0, std::nullopt, {}, std::nullopt}));
  return zone;
}

TimeZone TimeZone::utc() {
  static const TimeZone zone(
      std::make_shared<Impl>(Impl{Kind::Named, "UTC", nullptr, 0, std::nullopt, {}, std::nullopt}));
  return zone;
}

TimeZone TimeZone::local() {
  static const TimeZone zone(
      std::make_shared<Impl>(Impl{Kind::Local, {}, nullptr, 0, std::nullopt, {}, std::nullopt}));
  return zone;
}

std::optional<TimeZone> TimeZone::named(std::string_view name) {
  if (name == "GMT") return gmt();
  if (name == "UTC") return utc();
  if (name.empty()) return std::nullopt;
  // Zones are immutable, so every date decoded in the same zone shares one: a run meets a
  // handful of names, and decoding a date then allocates nothing for its zone.
  static std::mutex mutex;
  static std::map<std::string, TimeZone, std::less<>> known;
  std::lock_guard lock(mutex);
  if (auto found = known.find(name); found != known.end()) return found->second;
  try {
    const date::time_zone* zone = date::locate_zone(name);
    auto impl = std::make_shared<Impl>();
    impl->kind = Kind::Named;
    impl->name = std::string(name);
    impl->zone = zone;
    return known.emplace(std::string(name), TimeZone(std::move(impl))).first->second;
  } catch (const std::exception&) {
    return std::nullopt;
  }
}

std::optional<TimeZone> TimeZone::withAbbreviation(std::string_view abbreviation) {
  if (abbreviation == "GMT") return gmt();
  if (abbreviation == "UTC") return utc();
  return std::nullopt;
}

std::optional<TimeZone> TimeZone::unnamed(std::int32_t standardOffset,
                                          std::optional<std::int32_t> daylightOffset,
                                          std::string_view daylightRule) {
  auto impl = std::make_shared<Impl>();
  impl->kind = Kind::Unnamed;
  impl->standardOffset = standardOffset;
  impl->daylightOffset = daylightOffset;
  if (!daylightRule.empty()) {
    if (!daylightOffset) return std::nullopt;
    impl->rule = std::string(daylightRule);
    impl->posix = DaylightRule::parse(impl->rule);
    if (!impl->posix) return std::nullopt;
  }
  return TimeZone(std::move(impl));
}

const std::vector<std::string>& TimeZone::databaseZoneNames() {
  static const std::vector<std::string> names = [] {
    std::vector<std::string> all;
    try {
      for (const date::time_zone& zone : date::get_tzdb().zones) all.emplace_back(zone.name());
    } catch (const std::exception&) {
    }
    return all;
  }();
  return names;
}

TimeZone::Kind TimeZone::kind() const {
  return impl_->kind;
}

std::optional<std::string> TimeZone::name() const {
  switch (impl_->kind) {
    case Kind::Named:
      return impl_->name;
    case Kind::Local: {
      const date::time_zone* zone = currentLocalZone();
      if (zone) return std::string(zone->name());
      return std::nullopt;
    }
    case Kind::Unnamed:
      return std::nullopt;
  }
  return std::nullopt;
}

std::optional<std::int32_t> TimeZone::standardOffset() const {
  if (impl_->kind != Kind::Unnamed) return std::nullopt;
  return impl_->standardOffset;
}

std::optional<std::int32_t> TimeZone::daylightOffset() const {
  if (impl_->kind != Kind::Unnamed) return std::nullopt;
  return impl_->daylightOffset;
}

std::optional<std::string> TimeZone::daylightRule() const {
  if (impl_->kind != Kind::Unnamed || impl_->rule.empty()) return std::nullopt;
  return impl_->rule;
}

bool TimeZone::isDaylightSavingTime(std::chrono::sys_seconds instant) const {
  return infoAt(*impl_, instant).daylight;
}

std::int32_t TimeZone::secondsFromGMT(std::chrono::sys_seconds instant) const {
  return infoAt(*impl_, instant).offset;
}

std::string TimeZone::abbreviation(std::chrono::sys_seconds instant) const {
  if (impl_->kind != Kind::Named || !impl_->zone) return {};
  return impl_->zone->get_info(date::sys_seconds{instant.time_since_epoch()}).abbrev;
}

std::chrono::sys_seconds TimeZone::instantAt(std::chrono::local_seconds wallClock) const {
  date::local_seconds t{wallClock.time_since_epoch()};
  switch (impl_->kind) {
    case Kind::Named:
      if (!impl_->zone) return std::chrono::sys_seconds{wallClock.time_since_epoch()};
      return instantFromLocal(impl_->zone->get_info(t), wallClock);
    case Kind::Local: {
      const date::time_zone* zone = currentLocalZone();
      if (!zone) return std::chrono::sys_seconds{wallClock.time_since_epoch()};
      return instantFromLocal(zone->get_info(t), wallClock);
    }
    case Kind::Unnamed: {
      // Read with the standard offset first; if that instant is in daylight time, the wall
      // clock was showing daylight time.
      std::chrono::sys_seconds asStandard{wallClock.time_since_epoch() -
                                          std::chrono::seconds{impl_->standardOffset}};
      if (impl_->posix &&
          impl_->posix->isDaylight(asStandard, impl_->standardOffset, *impl_->daylightOffset)) {
        return std::chrono::sys_seconds{wallClock.time_since_epoch() -
                                        std::chrono::seconds{*impl_->daylightOffset}};
      }
      return asStandard;
    }
  }
  return std::chrono::sys_seconds{wallClock.time_since_epoch()};
}

bool TimeZone::operator==(const TimeZone& other) const {
  if (impl_ == other.impl_) return true;
  if (impl_->kind != other.impl_->kind) return false;
  switch (impl_->kind) {
    case Kind::Named:
      return impl_->name == other.impl_->name;
    case Kind::Local:
      return true;
    case Kind::Unnamed:
      return impl_->standardOffset == other.impl_->standardOffset &&
             impl_->daylightOffset == other.impl_->daylightOffset &&
             impl_->rule == other.impl_->rule;
  }
  return false;
}

std::string TimeZone::description() const {
  switch (impl_->kind) {
    case Kind::Named:
      return impl_->name;
    case Kind::Local:
      return "local (" + name().value_or("UTC") + ")";
    case Kind::Unnamed: {
      std::string text = "UNNAMED " + std::to_string(impl_->standardOffset);
      if (impl_->daylightOffset) text += "/" + std::to_string(*impl_->daylightOffset);
      if (!impl_->rule.empty()) text += " " + impl_->rule;
      return text;
    }
  }
  return {};
}

}  // namespace zt::platform
