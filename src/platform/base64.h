#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace zt::platform::base64 {

// The standard alphabet of RFC 4648 with "=" padding, as one unbroken text.
std::string encode(std::span<const std::uint8_t> bytes);

// The length of encode()'s answer for `size` input bytes.
constexpr std::size_t encodedLength(std::size_t size) {
  return (size + 2) / 3 * 4;
}

// Writes encode()'s text to `out`, which must hold encodedLength(bytes.size()) characters.
void encodeInto(std::span<const std::uint8_t> bytes, char* out);

// How much a text to decode may differ from encode()'s answer.
enum class Form {
  // Exactly encode()'s form: padding present, unused bits zero, nothing outside the
  // alphabet. A byte string then has one written form, and a damaged text is noticed rather
  // than guessed at.
  Canonical,
  // What mail and vCard writers leave: blanks and line ends anywhere (folded lines), padding
  // left out. Padding that is present must still complete the last group.
  Tolerant,
};

// Why a text is not base64, and at which byte of it.
struct DecodeFault {
  enum class Kind {
    // Canonical only: the length is not a multiple of 4 (offset: the length).
    Length,
    // A character outside the alphabet, or one after the padding (offset: that character).
    Character,
    // Canonical only: bits set that the padding says are unused (offset: the last group).
    StrayBits,
    // Tolerant only: a last group of one digit, or padding that does not complete its group
    // (offset: the text's length).
    Padding,
  };
  Kind kind;
  std::size_t offset;
};

// The bytes of a base64 text; none, with `fault` filled in when given, when it is not one.
std::optional<std::vector<std::uint8_t>> decode(std::string_view text, Form form,
                                                DecodeFault* fault = nullptr);

}  // namespace zt::platform::base64
