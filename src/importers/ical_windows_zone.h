#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace tessel::importers {

// The IANA zone that Windows means by one of its zone names ("W. Europe Standard Time" →
// "Europe/Berlin"), from CLDR's table as ICU carries it; none for a name Windows does not
// use. Outlook and Exchange write these names as TZID values.
std::optional<std::string> ianaZoneForWindowsZone(std::string_view windowsName);

}  // namespace tessel::importers
