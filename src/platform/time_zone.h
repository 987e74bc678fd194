#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace zt::platform {

// A time zone in which the fields of an instant are read.
//
// Three kinds exist: zones named by the time-zone database ("Europe/Paris", and the two
// fixed zones "GMT" and "UTC"), the process's automatically tracking local zone (it follows
// $TZ or the machine's setting at every use, so dates that carry it are floating times), and
// unnamed zones known only by a standard offset and, optionally, a daylight offset with the
// POSIX rule that says when daylight time is in force ("M3.5.0,M10.5.0/3").
//
// Copies are cheap: the rules are shared.
class TimeZone {
 public:
  enum class Kind { Named, Local, Unnamed };

  // The two zones that the calendar writer treats as "no zone at all": "GMT" and "UTC". They
  // are distinct zones that never compare equal to each other.
  static TimeZone gmt();
  static TimeZone utc();
  // The process's automatically tracking local zone.
  static TimeZone local();
  // A zone of the time-zone database by its name; "GMT" and "UTC" give the zones above.
  static std::optional<TimeZone> named(std::string_view name);
  // The zones the calendar writer looks up by abbreviation: "GMT" and "UTC" only.
  static std::optional<TimeZone> withAbbreviation(std::string_view abbreviation);
  // An unnamed zone. `daylightRule` is the rule part of a POSIX TZ string (the text after
  // the daylight offset: "M3.5.0,M10.5.0/3"); without it daylight time is never in force.
  // Returns nothing when the rule cannot be parsed.
  static std::optional<TimeZone> unnamed(std::int32_t standardOffset,
                                         std::optional<std::int32_t> daylightOffset = {},
                                         std::string_view daylightRule = {});

  // The names of the zones of the time-zone database, in its order; other names of zones
  // ("US/Eastern") are among them.
  static const std::vector<std::string>& databaseZoneNames();

  Kind kind() const;
  bool isLocal() const { return kind() == Kind::Local; }

  // The zone's name; absent for unnamed zones. The local zone answers the name of the zone
  // it tracks at the moment of the call.
  std::optional<std::string> name() const;

  // Offsets of an unnamed zone as it was made (absent for the other kinds).
  std::optional<std::int32_t> standardOffset() const;
  std::optional<std::int32_t> daylightOffset() const;
  std::optional<std::string> daylightRule() const;

  bool isDaylightSavingTime(std::chrono::sys_seconds instant) const;
  std::int32_t secondsFromGMT(std::chrono::sys_seconds instant) const;
  // The abbreviation the database gives a named zone at that instant ("CET"); empty for the
  // other kinds and for "GMT" and "UTC".
  std::string abbreviation(std::chrono::sys_seconds instant) const;

  // The instant at which the zone's wall clock shows `wallClock`. A time that the clock skips
  // (spring forward) is read with the offset in force before the gap; a time it shows twice
  // gives the earlier instant.
  std::chrono::sys_seconds instantAt(std::chrono::local_seconds wallClock) const;

  // Zone equality: the same kind, and the same name (named zones) or the same offsets and
  // rule (unnamed zones). Every local zone equals every other local zone.
  bool operator==(const TimeZone& other) const;

  // A readable text: the name, "local (Europe/Paris)", or "UNNAMED +3600/+7200".
  std::string description() const;

  struct Impl;

 private:
  explicit TimeZone(std::shared_ptr<const Impl> impl) : impl_(std::move(impl)) {}
  std::shared_ptr<const Impl> impl_;
};

}  // namespace zt::platform
