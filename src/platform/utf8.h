#pragma once

#include <cstddef>
#include <string_view>

// Checks of UTF-8 text (RFC 3629) read from files other programs wrote.
namespace zt::platform::utf8 {

// The length of the UTF-8 sequence that starts at byte `i` of `text`, or 0 when the bytes
// there are not UTF-8: overlong forms, surrogates, code points past U+10FFFF and sequences
// cut short by the end of the text included.
std::size_t sequenceLength(std::string_view text, std::size_t i);

// Whether the whole text is UTF-8.
bool isValid(std::string_view text);

}  // namespace zt::platform::utf8
