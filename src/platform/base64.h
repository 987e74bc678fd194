#pragma once

#include <cstdint>
#include <span>
#include <string>

namespace zt::platform::base64 {

// The standard alphabet of RFC 4648 with "=" padding, as one unbroken text.
std::string encode(std::span<const std::uint8_t> bytes);

// The length of encode()'s answer for `size` input bytes.
constexpr std::size_t encodedLength(std::size_t size) {
  return (size + 2) / 3 * 4;
}

// Writes encode()'s text to `out`, which must hold encodedLength(bytes.size()) characters.
void encodeInto(std::span<const std::uint8_t> bytes, char* out);

}  // namespace zt::platform::base64
