#include "icalendar/calendar_sync_extension.h"

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <optional>
#include <string_view>
#include <utility>
#include <vector>

#include "icalendar/icalendar_export.h"
#include "platform/calendar_date.h"

namespace zt::icalendar {

namespace {

struct ZoneOffsets {
  std::int32_t standard = 0;
  std::int32_t daylight = 0;
  bool standardFound = false;
  bool daylightFound = false;
};

// Samples the zone at four instants of 2002 that fall on both sides of the changes of either
// hemisphere; the first instant of each kind gives its offset.
ZoneOffsets probe(const platform::TimeZone& zone) {
  static constexpr std::string_view kInstants[] = {
      "2002-2-1 00:00:00 +0000",
      "2002-5-1 00:00:00 +0000",
      "2002-7-1 00:00:00 +0000",
      "2002-11-1 00:00:00 +0000",
  };
  ZoneOffsets offsets;
  for (std::string_view text : kInstants) {
    const std::optional<platform::CalendarDate> date = platform::CalendarDate::fromString(text);
    if (!date) continue;
    const auto instant = date->instant();
    if (zone.isDaylightSavingTime(instant)) {
      if (!offsets.daylightFound) {
        offsets.daylight = zone.secondsFromGMT(instant);
        offsets.daylightFound = true;
      }
    } else if (!offsets.standardFound) {
      offsets.standard = zone.secondsFromGMT(instant);
      offsets.standardFound = true;
    }
  }
  return offsets;
}

std::string unknownZoneID(const ZoneOffsets& offsets) {
  char text[48];
  const int n =
      std::snprintf(text, sizeof text, "UNKNOWN-%d-%d", offsets.standard, offsets.daylight);
  return std::string(text, static_cast<std::size_t>(n));
}

// The TZOFFSETTO value: hhmm with a "-" only for negative offsets. The device wants no "+",
// unlike the UTC offset form of RFC 2445 section 4.3.14.
void appendOffsetLine(std::string& buffer, std::int32_t seconds) {
  buffer += "TZOFFSETTO:";
  if (seconds < 0) buffer += '-';
  const int hours = std::abs((seconds / 3600) % 24);
  const int minutes = std::abs((seconds / 60) % 60);
  buffer += static_cast<char>('0' + hours / 10);
  buffer += static_cast<char>('0' + hours % 10);
  buffer += static_cast<char>('0' + minutes / 10);
  buffer += static_cast<char>('0' + minutes % 10);
  buffer += "\r\n";
}

}  // namespace

std::string timezoneBlockID(const platform::TimeZone& zone) {
  if (std::optional<std::string> name = zone.name()) return std::move(*name);
  return unknownZoneID(probe(zone));
}

void appendTimezoneBlockID(const platform::TimeZone& zone, std::string& buffer) {
  if (zone.isLocal()) {
    // The local zone's name follows $TZ, so it is never kept.
    buffer += timezoneBlockID(zone);
    return;
  }
  // Equal zones (the same name, or the same offsets and rule) have the same text.
  struct Known {
    platform::TimeZone zone;
    std::string id;
  };
  constexpr std::size_t kKept = 8;
  thread_local std::vector<Known> known;
  thread_local std::size_t next = 0;
  for (const Known& entry : known) {
    if (entry.zone == zone) {
      buffer += entry.id;
      return;
    }
  }
  std::string id = timezoneBlockID(zone);
  buffer += id;
  if (known.size() < kKept) {
    known.push_back({zone, std::move(id)});
  } else {
    known[next] = {zone, std::move(id)};
    next = (next + 1) % kKept;
  }
}

void appendCalendarRepresentationTo(const platform::TimeZone& zone, std::string& buffer) {
  const ZoneOffsets offsets = probe(zone);
  appendRFC2445ComponentStart(buffer, "VTIMEZONE");
  buffer += "TZID:";
  if (std::optional<std::string> name = zone.name()) {
    buffer += *name;
  } else {
    buffer += unknownZoneID(offsets);
  }
  buffer += "\r\n";
  if (offsets.standardFound) {
    appendRFC2445ComponentStart(buffer, "STANDARD");
    appendOffsetLine(buffer, offsets.standard);
    appendRFC2445ComponentEnd(buffer, "STANDARD");
  }
  if (offsets.daylightFound) {
    appendRFC2445ComponentStart(buffer, "DAYLIGHT");
    appendOffsetLine(buffer, offsets.daylight);
    appendRFC2445ComponentEnd(buffer, "DAYLIGHT");
  }
  appendRFC2445ComponentEnd(buffer, "VTIMEZONE");
}

}  // namespace zt::icalendar
