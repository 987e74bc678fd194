#include "platform/base64.h"

#include <string_view>

namespace zt::platform::base64 {

namespace {
constexpr std::string_view kAlphabet =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
}  // namespace

void encodeInto(std::span<const std::uint8_t> bytes, char* out) {
  std::size_t i = 0;
  for (; i + 3 <= bytes.size(); i += 3) {
    const std::uint32_t n = (std::uint32_t{bytes[i]} << 16) | (std::uint32_t{bytes[i + 1]} << 8) |
                            std::uint32_t{bytes[i + 2]};
    *out++ = kAlphabet[(n >> 18) & 63];
    *out++ = kAlphabet[(n >> 12) & 63];
    *out++ = kAlphabet[(n >> 6) & 63];
    *out++ = kAlphabet[n & 63];
  }
  const std::size_t rest = bytes.size() - i;
  if (rest > 0) {
    std::uint32_t n = std::uint32_t{bytes[i]} << 16;
    if (rest == 2) n |= std::uint32_t{bytes[i + 1]} << 8;
    *out++ = kAlphabet[(n >> 18) & 63];
    *out++ = kAlphabet[(n >> 12) & 63];
    *out++ = rest == 2 ? kAlphabet[(n >> 6) & 63] : '=';
    *out++ = '=';
  }
}

std::string encode(std::span<const std::uint8_t> bytes) {
  std::string out(encodedLength(bytes.size()), '\0');
  encodeInto(bytes, out.data());
  return out;
}

}  // namespace zt::platform::base64
