#pragma once

#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/time_zone.h"

struct icalcomponent_impl;

namespace tessel::importers {

// The zones that the TZID parameters of one VCALENDAR object name (RFC 5545 section 3.2.19:
// a TZID refers to a VTIMEZONE of the same object). A TZID becomes the first of:
// - the zone of the zone database of that name, also in another case, with "_" or "-" for
//   "/" ("Europe_Berlin"), or behind a "/vendor/version/" prefix, as Evolution and Mozilla
//   write them;
// - the zone the VTIMEZONE's X-LIC-LOCATION or TZURL names (tzurl.org's addresses end with
//   the IANA name);
// - the IANA zone that Windows means by it, when it is a Windows zone name or the display
//   name of one ("(UTC-05:00) Eastern Time (US & Canada)"), as Outlook writes them;
// - the zone of the database whose offsets are those of the VTIMEZONE at every hour of the
//   years the calendar's items start in (at most the last twenty);
// - else an unnamed zone with the offsets and daylight rule of its VTIMEZONE.
class ICalTimeZones {
 public:
  // The years the items of a calendar start in (their first DTSTART), for a calendar whose
  // items are read one by one rather than held in it.
  using ItemYears = std::function<std::vector<int>()>;

  // Keeps pointers into `calendar`, which must outlive it. The years of the items come from
  // the components `calendar` holds and from `itemYears`, which is asked once, and only when
  // a zone is matched by its rules.
  explicit ICalTimeZones(icalcomponent_impl* calendar, ItemYears itemYears = {});

  // None when nothing defines the TZID.
  std::optional<zt::platform::TimeZone> zone(std::string_view tzid);

 private:
  std::optional<zt::platform::TimeZone> resolve(std::string_view tzid);
  void addYear(int year);
  // Settles the years over which zones are matched by their rules.
  void settleYears();

  static constexpr int kFirstMatchedYear = 1970;
  static constexpr int kLastMatchedYear = 2037;

  std::map<std::string, icalcomponent_impl*, std::less<>> definitions_;
  // The years over which zones known by their rules are matched.
  int firstYear_ = 0;
  int lastYear_ = 0;
  ItemYears itemYears_;
  bool yearsSettled_ = false;
  std::map<std::string, std::optional<zt::platform::TimeZone>, std::less<>> resolved_;
};

// The unnamed zone a VTIMEZONE describes: the offset of its latest STANDARD observance and,
// when daylight time is still observed, the offset of its latest DAYLIGHT observance with
// the two yearly rules as a POSIX rule ("M3.5.0,M10.5.0/3"). None when it has no observance.
std::optional<zt::platform::TimeZone> unnamedZoneOfVTimezone(icalcomponent_impl* vtimezone);

}  // namespace tessel::importers
