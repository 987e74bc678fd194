#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

// Text helpers for the writers, whose formats count in UTF-16 code units (the line folding
// of the iCalendar writer) or are written in UTF-16 (the vCard file). Text elsewhere in the
// program is UTF-8.
namespace zt::platform::utf16 {

// UTF-8 to UTF-16: characters outside the Basic Multilingual Plane become surrogate pairs.
// Malformed UTF-8 sequences become U+FFFD.
std::u16string fromUtf8(std::string_view utf8);
// UTF-16 to UTF-8: surrogate pairs become one four-byte character; a lone surrogate
// becomes U+FFFD.
std::string toUtf8(std::u16string_view utf16);

// The number of UTF-16 code units of a UTF-8 text.
std::size_t length(std::string_view utf8);

// Folds a UTF-8 text in place so that, counted in UTF-16 code units of the unfolded text,
// "\r\n " stands before units limit, 2*limit, ... When the length is an exact multiple of
// the limit, a fold is also inserted at the very end. Texts shorter than the limit stay as
// they are. A cut that falls between the two halves of a surrogate pair splits the
// character: each half is written as U+FFFD, which is what encoding the UTF-16 text to
// UTF-8 would give.
void fold(std::string& utf8, std::size_t limit);

// Appends the UTF-16BE bytes of a UTF-8 text.
void appendBigEndian(std::string& out, std::string_view utf8);

}  // namespace zt::platform::utf16
