#pragma once

#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "platform/time_zone.h"

struct icalcomponent_impl;

namespace tessel::importers {

// The zones that the TZID parameters of one VCALENDAR object name (RFC 5545 section 3.2.19:
// a TZID refers to a VTIMEZONE of the same object). A TZID becomes, in this order:
// - the zone of that name in the zone database, when it is an IANA name (also behind a
//   "/vendor/version/" prefix, as Evolution and Mozilla write them, or as the VTIMEZONE's
//   X-LIC-LOCATION);
// - the IANA zone that Windows means by it, when it is a Windows zone name (Outlook);
// - else an unnamed zone with the offsets and daylight rule of its VTIMEZONE.
class ICalTimeZones {
 public:
  // Keeps pointers into `calendar`, which must outlive it.
  explicit ICalTimeZones(icalcomponent_impl* calendar);

  // None when nothing defines the TZID.
  std::optional<zt::platform::TimeZone> zone(std::string_view tzid);

 private:
  std::optional<zt::platform::TimeZone> resolve(std::string_view tzid) const;

  std::map<std::string, icalcomponent_impl*, std::less<>> definitions_;
  std::map<std::string, std::optional<zt::platform::TimeZone>, std::less<>> resolved_;
};

// The unnamed zone a VTIMEZONE describes: the offset of its latest STANDARD observance and,
// when daylight time is still observed, the offset of its latest DAYLIGHT observance with
// the two yearly rules as a POSIX rule ("M3.5.0,M10.5.0/3"). None when it has no observance.
std::optional<zt::platform::TimeZone> unnamedZoneOfVTimezone(icalcomponent_impl* vtimezone);

}  // namespace tessel::importers
