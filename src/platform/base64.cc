#include "platform/base64.h"

#include <array>

namespace zt::platform::base64 {

namespace {

using Bytes = std::vector<std::uint8_t>;

constexpr std::string_view kAlphabet =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

// The value of each alphabet character; -1 for every other byte.
int digit(char c) {
  static const std::array<int, 256> kDigit = [] {
    std::array<int, 256> table{};
    table.fill(-1);
    for (std::size_t i = 0; i < kAlphabet.size(); ++i) {
      table[static_cast<unsigned char>(kAlphabet[i])] = static_cast<int>(i);
    }
    return table;
  }();
  return kDigit[static_cast<unsigned char>(c)];
}

std::optional<Bytes> failure(DecodeFault* fault, DecodeFault::Kind kind, std::size_t offset) {
  if (fault != nullptr) *fault = {kind, offset};
  return std::nullopt;
}

std::optional<Bytes> decodeCanonical(std::string_view text, DecodeFault* fault) {
  if (text.size() % 4 != 0) return failure(fault, DecodeFault::Kind::Length, text.size());
  Bytes out;
  out.reserve(text.size() / 4 * 3);
  for (std::size_t i = 0; i < text.size(); i += 4) {
    const bool last = i + 4 == text.size();
    std::size_t padding = 0;
    if (last && text[i + 3] == '=') padding = text[i + 2] == '=' ? 2 : 1;
    std::uint32_t n = 0;
    for (std::size_t j = 0; j < 4; ++j) {
      if (j >= 4 - padding) {
        n <<= 6;
        continue;
      }
      const int value = digit(text[i + j]);
      if (value < 0) return failure(fault, DecodeFault::Kind::Character, i + j);
      n = (n << 6) | static_cast<std::uint32_t>(value);
    }
    if ((padding == 1 && (n & 0xFF) != 0) || (padding == 2 && (n & 0xFFFF) != 0)) {
      return failure(fault, DecodeFault::Kind::StrayBits, i);
    }
    out.push_back(static_cast<std::uint8_t>(n >> 16));
    if (padding < 2) out.push_back(static_cast<std::uint8_t>(n >> 8));
    if (padding < 1) out.push_back(static_cast<std::uint8_t>(n));
  }
  return out;
}

bool isBlank(char c) {
  return c == ' ' || c == '\t' || c == '\r' || c == '\n';
}

std::optional<Bytes> decodeTolerant(std::string_view text, DecodeFault* fault) {
  Bytes bytes;
  bytes.reserve(text.size() / 4 * 3);
  std::uint32_t bits = 0;
  int count = 0;
  int padding = 0;
  for (std::size_t i = 0; i < text.size(); ++i) {
    const char c = text[i];
    if (isBlank(c)) continue;
    if (c == '=') {
      ++padding;
      continue;
    }
    const int value = digit(c);
    if (value < 0 || padding > 0) return failure(fault, DecodeFault::Kind::Character, i);
    bits = (bits << 6) | static_cast<std::uint32_t>(value);
    if (++count == 4) {
      bytes.push_back(static_cast<std::uint8_t>(bits >> 16));
      bytes.push_back(static_cast<std::uint8_t>(bits >> 8));
      bytes.push_back(static_cast<std::uint8_t>(bits));
      bits = 0;
      count = 0;
    }
  }
  // A last group of one digit cannot hold a byte; padding must complete the group it ends.
  if (count == 1 || padding > 2 || (padding > 0 && count + padding != 4)) {
    return failure(fault, DecodeFault::Kind::Padding, text.size());
  }
  if (count == 2) {
    bytes.push_back(static_cast<std::uint8_t>(bits >> 4));
  } else if (count == 3) {
    bytes.push_back(static_cast<std::uint8_t>(bits >> 10));
    bytes.push_back(static_cast<std::uint8_t>(bits >> 2));
  }
  return bytes;
}

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

std::optional<std::vector<std::uint8_t>> decode(std::string_view text, Form form,
                                                DecodeFault* fault) {
  return form == Form::Canonical ? decodeCanonical(text, fault) : decodeTolerant(text, fault);
}

}  // namespace zt::platform::base64
