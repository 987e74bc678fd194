#include "importers/ical_windows_zone.h"

#include <unicode/ucal.h>

#include <vector>

namespace tessel::importers {

std::optional<std::string> ianaZoneForWindowsZone(std::string_view windowsName) {
  // Windows zone names are short printable ASCII texts; anything else is no Windows name.
  if (windowsName.empty() || windowsName.size() > 128) return std::nullopt;
  for (char c : windowsName) {
    if (static_cast<unsigned char>(c) < 0x20 || static_cast<unsigned char>(c) > 0x7E) {
      return std::nullopt;
    }
  }
  // ASCII widens to UTF-16 code unit by code unit.
  std::vector<UChar> name(windowsName.begin(), windowsName.end());

  UChar zone[128];
  UErrorCode status = U_ZERO_ERROR;
  // No region: CLDR's default ("001") zone for the name.
  const int32_t length = ucal_getTimeZoneIDForWindowsID(
      name.data(), static_cast<int32_t>(name.size()), nullptr, zone, 128, &status);
  if (U_FAILURE(status) || length <= 0 || length >= 128) return std::nullopt;
  std::string iana;
  for (int32_t i = 0; i < length; ++i) {
    // Zone identifiers are ASCII.
    if (zone[i] > 0x7E) return std::nullopt;
    iana += static_cast<char>(zone[i]);
  }
  return iana;
}

}  // namespace tessel::importers
