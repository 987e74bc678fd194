#include "importers/ical_windows_zone.h"

#include <unicode/ucal.h>

#include <algorithm>
#include <iterator>
#include <vector>

namespace tessel::importers {

namespace {

struct DisplayName {
  std::string_view text;  // lower case, "&" for "and", single spaces
  std::string_view windowsZone;
};

// The texts after the offset in the display names of Windows zones, in the forms recent and
// older Outlook versions wrote them, sorted by text.
constexpr DisplayName kDisplayNames[] = {
    {"abu dhabi, muscat", "Arabian Standard Time"},
    {"adelaide", "Cen. Australia Standard Time"},
    {"alaska", "Alaskan Standard Time"},
    {"amman", "Jordan Standard Time"},
    {"amsterdam, belgrade, berlin, brussels, budapest, madrid, paris, prague, stockholm",
     "W. Europe Standard Time"},
    {"amsterdam, berlin, bern, rome, stockholm, vienna", "W. Europe Standard Time"},
    {"arizona", "US Mountain Standard Time"},
    {"ashgabat, tashkent", "West Asia Standard Time"},
    {"astana", "Central Asia Standard Time"},
    {"astana, dhaka", "Central Asia Standard Time"},
    {"asuncion", "Paraguay Standard Time"},
    {"athens, beirut, istanbul, minsk", "GTB Standard Time"},
    {"athens, bucharest", "GTB Standard Time"},
    {"athens, bucharest, istanbul", "GTB Standard Time"},
    {"atlantic time (canada)", "Atlantic Standard Time"},
    {"auckland, wellington", "New Zealand Standard Time"},
    {"azores", "Azores Standard Time"},
    {"baghdad", "Arabic Standard Time"},
    {"baja california", "Pacific Standard Time (Mexico)"},
    {"baku", "Azerbaijan Standard Time"},
    {"bangkok, hanoi, jakarta", "SE Asia Standard Time"},
    {"beijing, chongqing, hong kong sar, urumqi", "China Standard Time"},
    {"beijing, chongqing, hong kong, urumqi", "China Standard Time"},
    {"beirut", "Middle East Standard Time"},
    {"belgrade, bratislava, budapest, ljubljana, prague", "Central Europe Standard Time"},
    {"bogota, lima, quito", "SA Pacific Standard Time"},
    {"bogota, lima, quito, rio branco", "SA Pacific Standard Time"},
    {"brasilia", "E. South America Standard Time"},
    {"brasília", "E. South America Standard Time"},
    {"brisbane", "E. Australia Standard Time"},
    {"brussels, copenhagen, madrid, paris", "Romance Standard Time"},
    {"bucharest", "E. Europe Standard Time"},
    {"buenos aires", "Argentina Standard Time"},
    {"buenos aires, georgetown", "SA Eastern Standard Time"},
    {"cabo verde is.", "Cape Verde Standard Time"},
    {"cairo", "Egypt Standard Time"},
    {"canberra, melbourne, sydney", "AUS Eastern Standard Time"},
    {"cape verde is.", "Cape Verde Standard Time"},
    {"caracas", "Venezuela Standard Time"},
    {"casablanca", "Morocco Standard Time"},
    {"casablanca, monrovia, reykjavik", "Greenwich Standard Time"},
    {"cayenne, fortaleza", "SA Eastern Standard Time"},
    {"central america", "Central America Standard Time"},
    {"central time (us & canada)", "Central Standard Time"},
    {"chennai, kolkata, mumbai, new delhi", "India Standard Time"},
    {"chihuahua, la paz, mazatlan", "Mountain Standard Time (Mexico)"},
    {"chisinau", "E. Europe Standard Time"},
    {"city of buenos aires", "Argentina Standard Time"},
    {"coordinated universal time", "UTC"},
    {"coordinated universal time+12", "UTC+12"},
    {"coordinated universal time-02", "UTC-02"},
    {"coordinated universal time-11", "UTC-11"},
    {"cuiaba", "Central Brazilian Standard Time"},
    {"damascus", "Syria Standard Time"},
    {"darwin", "AUS Central Standard Time"},
    {"dhaka", "Bangladesh Standard Time"},
    {"dublin, edinburgh, lisbon, london", "GMT Standard Time"},
    {"eastern time (us & canada)", "Eastern Standard Time"},
    {"ekaterinburg", "Ekaterinburg Standard Time"},
    {"fiji", "Fiji Standard Time"},
    {"fiji, kamchatka, marshall is.", "Fiji Standard Time"},
    {"georgetown, la paz, manaus, san juan", "SA Western Standard Time"},
    {"greenland", "Greenland Standard Time"},
    {"greenwich mean time : dublin, edinburgh, lisbon, london", "GMT Standard Time"},
    {"guadalajara, mexico city, monterrey", "Central Standard Time (Mexico)"},
    {"guam, port moresby", "West Pacific Standard Time"},
    {"harare, pretoria", "South Africa Standard Time"},
    {"hawaii", "Hawaiian Standard Time"},
    {"helsinki, kiev, riga, sofia, tallinn, vilnius", "FLE Standard Time"},
    {"helsinki, kyiv, riga, sofia, tallinn, vilnius", "FLE Standard Time"},
    {"hobart", "Tasmania Standard Time"},
    {"indiana (east)", "US Eastern Standard Time"},
    {"international date line west", "Dateline Standard Time"},
    {"irkutsk", "North Asia East Standard Time"},
    {"islamabad, karachi", "Pakistan Standard Time"},
    {"islamabad, karachi, tashkent", "Pakistan Standard Time"},
    {"istanbul", "Turkey Standard Time"},
    {"jerusalem", "Israel Standard Time"},
    {"kabul", "Afghanistan Standard Time"},
    {"kaliningrad", "Kaliningrad Standard Time"},
    {"kathmandu", "Nepal Standard Time"},
    {"krasnoyarsk", "North Asia Standard Time"},
    {"kuala lumpur, singapore", "Singapore Standard Time"},
    {"kuwait, riyadh", "Arab Standard Time"},
    {"magadan", "Magadan Standard Time"},
    {"magadan, solomon is., new caledonia", "Central Pacific Standard Time"},
    {"manaus", "Central Brazilian Standard Time"},
    {"mid-atlantic", "Mid-Atlantic Standard Time"},
    {"midway island, samoa", "UTC-11"},
    {"minsk", "Belarus Standard Time"},
    {"monrovia, reykjavik", "Greenwich Standard Time"},
    {"montevideo", "Montevideo Standard Time"},
    {"moscow, st. petersburg", "Russian Standard Time"},
    {"moscow, st. petersburg, volgograd", "Russian Standard Time"},
    {"mountain time (us & canada)", "Mountain Standard Time"},
    {"nairobi", "E. Africa Standard Time"},
    {"newfoundland", "Newfoundland Standard Time"},
    {"novosibirsk", "N. Central Asia Standard Time"},
    {"nuku'alofa", "Tonga Standard Time"},
    {"osaka, sapporo, tokyo", "Tokyo Standard Time"},
    {"pacific time (us & canada)", "Pacific Standard Time"},
    {"pacific time (us & canada), tijuana", "Pacific Standard Time"},
    {"pacific time (us & canada); tijuana", "Pacific Standard Time"},
    {"perth", "W. Australia Standard Time"},
    {"port louis", "Mauritius Standard Time"},
    {"samoa", "Samoa Standard Time"},
    {"santiago", "Pacific SA Standard Time"},
    {"sarajevo, skopje, warsaw, zagreb", "Central European Standard Time"},
    {"saskatchewan", "Canada Central Standard Time"},
    {"seoul", "Korea Standard Time"},
    {"solomon is., new caledonia", "Central Pacific Standard Time"},
    {"sri jayawardenepura", "Sri Lanka Standard Time"},
    {"taipei", "Taipei Standard Time"},
    {"tbilisi", "Georgian Standard Time"},
    {"tehran", "Iran Standard Time"},
    {"tijuana, baja california", "Pacific Standard Time (Mexico)"},
    {"ulaanbaatar", "Ulaanbaatar Standard Time"},
    {"vladivostok", "Vladivostok Standard Time"},
    {"west central africa", "W. Central Africa Standard Time"},
    {"windhoek", "Namibia Standard Time"},
    {"yakutsk", "Yakutsk Standard Time"},
    {"yangon (rangoon)", "Myanmar Standard Time"},
    {"yekaterinburg", "Ekaterinburg Standard Time"},
    {"yerevan", "Caucasus Standard Time"},
};

// The Windows zones of those display names by offset and, within an offset, the most used
// first: the order in which their IANA zones are preferred.
constexpr std::string_view kWindowsOrder[] = {
    "Dateline Standard Time",
    "UTC-11",
    "Hawaiian Standard Time",
    "Alaskan Standard Time",
    "Pacific Standard Time",
    "Pacific Standard Time (Mexico)",
    "US Mountain Standard Time",
    "Mountain Standard Time",
    "Mountain Standard Time (Mexico)",
    "Central Standard Time",
    "Central America Standard Time",
    "Central Standard Time (Mexico)",
    "Canada Central Standard Time",
    "Eastern Standard Time",
    "SA Pacific Standard Time",
    "US Eastern Standard Time",
    "Venezuela Standard Time",
    "Paraguay Standard Time",
    "Atlantic Standard Time",
    "Central Brazilian Standard Time",
    "SA Western Standard Time",
    "Pacific SA Standard Time",
    "Newfoundland Standard Time",
    "E. South America Standard Time",
    "Argentina Standard Time",
    "SA Eastern Standard Time",
    "Greenland Standard Time",
    "Montevideo Standard Time",
    "UTC-02",
    "Mid-Atlantic Standard Time",
    "Azores Standard Time",
    "Cape Verde Standard Time",
    "Morocco Standard Time",
    "UTC",
    "GMT Standard Time",
    "Greenwich Standard Time",
    "W. Europe Standard Time",
    "Romance Standard Time",
    "Central Europe Standard Time",
    "Central European Standard Time",
    "W. Central Africa Standard Time",
    "Namibia Standard Time",
    "GTB Standard Time",
    "FLE Standard Time",
    "E. Europe Standard Time",
    "Middle East Standard Time",
    "Egypt Standard Time",
    "South Africa Standard Time",
    "Israel Standard Time",
    "Kaliningrad Standard Time",
    "Russian Standard Time",
    "Turkey Standard Time",
    "Arab Standard Time",
    "Arabic Standard Time",
    "Belarus Standard Time",
    "E. Africa Standard Time",
    "Jordan Standard Time",
    "Syria Standard Time",
    "Iran Standard Time",
    "Arabian Standard Time",
    "Azerbaijan Standard Time",
    "Mauritius Standard Time",
    "Georgian Standard Time",
    "Caucasus Standard Time",
    "Afghanistan Standard Time",
    "Pakistan Standard Time",
    "Ekaterinburg Standard Time",
    "West Asia Standard Time",
    "India Standard Time",
    "Sri Lanka Standard Time",
    "Nepal Standard Time",
    "Bangladesh Standard Time",
    "Central Asia Standard Time",
    "Myanmar Standard Time",
    "SE Asia Standard Time",
    "N. Central Asia Standard Time",
    "North Asia Standard Time",
    "China Standard Time",
    "Singapore Standard Time",
    "North Asia East Standard Time",
    "W. Australia Standard Time",
    "Taipei Standard Time",
    "Ulaanbaatar Standard Time",
    "Tokyo Standard Time",
    "Korea Standard Time",
    "Yakutsk Standard Time",
    "Cen. Australia Standard Time",
    "AUS Central Standard Time",
    "AUS Eastern Standard Time",
    "E. Australia Standard Time",
    "West Pacific Standard Time",
    "Tasmania Standard Time",
    "Vladivostok Standard Time",
    "Central Pacific Standard Time",
    "Magadan Standard Time",
    "New Zealand Standard Time",
    "UTC+12",
    "Fiji Standard Time",
    "Tonga Standard Time",
    "Samoa Standard Time",
};

// "(UTC-05:00) ", "(GMT+01:00) ", "(UTC) ": the offset before the text, if any.
std::string_view withoutOffset(std::string_view text) {
  if (text.size() > 4 && text.front() == '(' &&
      (text.substr(1, 3) == "UTC" || text.substr(1, 3) == "GMT")) {
    const std::size_t close = text.find(')');
    if (close != std::string_view::npos) text.remove_prefix(close + 1);
  }
  return text;
}

std::string normalized(std::string_view text) {
  std::string words;
  for (std::size_t i = 0; i < text.size(); ++i) {
    char c = text[i];
    if (c == '\\' && i + 1 < text.size() && (text[i + 1] == ',' || text[i + 1] == ';')) continue;
    if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
    const bool space = c == ' ' || c == '\t';
    if (space && (words.empty() || words.back() == ' ')) continue;
    words += space ? ' ' : c;
  }
  while (!words.empty() && words.back() == ' ') words.pop_back();
  for (std::size_t at = words.find(" and "); at != std::string::npos;
       at = words.find(" and ", at)) {
    words.replace(at, 5, " & ");
  }
  return words;
}

}  // namespace

std::optional<std::string_view> windowsZoneForDisplayName(std::string_view displayName) {
  const std::string text = normalized(withoutOffset(displayName));
  if (text.empty()) return std::nullopt;
  const auto* found = std::lower_bound(
      std::begin(kDisplayNames), std::end(kDisplayNames), text,
      [](const DisplayName& row, const std::string& key) { return row.text < key; });
  if (found == std::end(kDisplayNames) || found->text != text) return std::nullopt;
  return found->windowsZone;
}

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

namespace tessel::importers {

const std::vector<std::string>& ianaZonesOfDisplayNames() {
  static const std::vector<std::string> zones = [] {
    std::vector<std::string> all;
    for (std::string_view windowsZone : kWindowsOrder) {
      std::optional<std::string> zone = ianaZoneForWindowsZone(windowsZone);
      if (zone && std::find(all.begin(), all.end(), *zone) == all.end()) all.push_back(*zone);
    }
    return all;
  }();
  return zones;
}

}  // namespace tessel::importers
