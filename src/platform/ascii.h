#pragma once

#include <string>
#include <string_view>

// Case and blanks of ASCII text: the keywords, parameter names and file extensions of the
// formats the tool reads and writes, which compare without case. Bytes outside ASCII (UTF-8
// text) are left as they are, whatever the locale.
namespace zt::platform {

std::string lowerAscii(std::string_view text);
std::string upperAscii(std::string_view text);

// Whether `text` equals `word` when ASCII letters are compared without case.
bool equalsIgnoringAsciiCase(std::string_view text, std::string_view word);

// Without blanks (space, tab) at either end.
std::string_view trimBlanks(std::string_view text);

}  // namespace zt::platform
