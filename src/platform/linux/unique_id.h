#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

namespace zt::platform {

// A player's unique identifier as its serial number (or a virtual player's "id") writes it:
// 1 to 16 hexadecimal digits, either case. Anything else is not a Zeto identifier.
inline std::optional<std::uint64_t> parseUniqueId(std::string_view text) {
  if (text.empty() || text.size() > 16) return std::nullopt;
  std::uint64_t value = 0;
  for (char c : text) {
    int digit;
    if (c >= '0' && c <= '9') {
      digit = c - '0';
    } else if (c >= 'a' && c <= 'f') {
      digit = c - 'a' + 10;
    } else if (c >= 'A' && c <= 'F') {
      digit = c - 'A' + 10;
    } else {
      return std::nullopt;
    }
    value = value << 4 | static_cast<std::uint64_t>(digit);
  }
  return value;
}

}  // namespace zt::platform
