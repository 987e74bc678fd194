#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tessel::importers {

// The IANA zone that Windows means by one of its zone names ("W. Europe Standard Time" →
// "Europe/Berlin"), from CLDR's table as ICU carries it; none for a name Windows does not
// use. Outlook and Exchange write these names as TZID values.
std::optional<std::string> ianaZoneForWindowsZone(std::string_view windowsName);

// The Windows zone name of one of the display names Outlook writes as TZID values, with or
// without the offset before it: "(UTC-05:00) Eastern Time (US & Canada)", "(GMT+01:00)
// Amsterdam, Berlin, Bern, Rome, Stockholm, Vienna", "Canberra, Melbourne, Sydney" →
// "Eastern Standard Time", "W. Europe Standard Time", "AUS Eastern Standard Time". Case,
// spacing, "and" for "&" and escaped commas do not matter. None for other texts.
std::optional<std::string_view> windowsZoneForDisplayName(std::string_view displayName);

// The IANA zones of the Windows zones of those display names, the zones most people use: by
// offset and, within an offset, the most used first.
const std::vector<std::string>& ianaZonesOfDisplayNames();

}  // namespace tessel::importers
