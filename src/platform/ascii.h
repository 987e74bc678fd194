#pragma once

#include <string>
#include <string_view>

// Case and blanks of ASCII text: the keywords, parameter names and file extensions of the
// formats the tool reads and writes, which compare without case. Bytes outside ASCII (UTF-8
// text) are left as they are, whatever the locale.
namespace zt::platform {

std::string lowerAscii(std::string_view text);
std::string upperAscii(std::string_view text);

// Whether `text` equals `word`, or starts with `prefix`, when ASCII letters are compared
// without case.
bool equalsIgnoringAsciiCase(std::string_view text, std::string_view word);
bool startsWithIgnoringAsciiCase(std::string_view text, std::string_view prefix);

// Without blanks (space, tab) at either end.
std::string_view trimBlanks(std::string_view text);

}  // namespace zt::platform
