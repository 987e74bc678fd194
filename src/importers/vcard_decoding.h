#pragma once

// The value encodings a vCard property can arrive in: transfer encodings (base64, quoted-
// printable), character sets, and the backslash escapes of text values. Each decoder raises
// std::invalid_argument with a short reason ("bad base64") that the reader completes with
// the file and line.

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/value.h"

namespace tessel::importers {

// RFC 4648 base64 with the line breaks and blanks that folded vCard lines leave inside it.
// Padding may be left out; anything else outside the alphabet is an error.
zt::platform::Data decodeBase64(std::string_view text);

// RFC 2045 section 6.7 quoted-printable: "=XX" is one byte; a "=" that ends the text is a
// soft line break whose line end the reader already removed.
std::string decodeQuotedPrintable(std::string_view text);

// RFC 3986 "%XX" escapes, for data: URIs without ";base64".
std::string decodePercent(std::string_view text);

// The text in UTF-8. With a charset (any name iconv knows: UTF-8, ISO-8859-1,
// windows-1252...), the bytes must be valid in it. Without one, UTF-8 is kept and anything
// else is read as windows-1252, what vCard 2.1 writers without a CHARSET parameter meant.
std::string toUtf8(std::string_view bytes, std::optional<std::string_view> charset);

// Which backslashes of a text value are escapes.
enum class TextEscapes {
  // vCard 2.1: a backslash only keeps a semicolon from separating ("\;"); every other one is
  // itself, as in the Windows paths ("C:\Users\new") that its writers put in notes.
  Version21,
  // RFC 6350 section 3.4 (RFC 2426 section 5 alike): "\n" or "\N" is a line end, "\\",
  // "\,", "\;" the character itself. Other backslashes stay as written.
  Version3,
};

// Splits a raw value at each `separator` that is not escaped; escapes stay.
std::vector<std::string> splitUnescaped(std::string_view raw, char separator,
                                        TextEscapes escapes = TextEscapes::Version3);

std::string unescapeText(std::string_view raw, TextEscapes escapes = TextEscapes::Version3);

}  // namespace tessel::importers
