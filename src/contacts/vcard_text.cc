#include "contacts/vcard_text.h"

#include <algorithm>

#include "platform/base64.h"

namespace zt::contacts {

void escapeVCardText(std::string_view source, std::string& slot) {
  slot.clear();
  slot.reserve(source.size() + 8);
  // One pass gives what the four whole-text replacements give in turn, because no
  // replacement brings in a character that a later one would replace. RFC 2426 section 4
  // asks for the backslash forms of line breaks, semicolons and commas in text values.
  for (const char c : source) {
    switch (c) {
      case '\n':
      case '\r':
        slot += "\\n";
        break;
      case ';':
        slot += "\\;";
        break;
      case ',':
        slot += "\\,";
        break;
      default:
        slot += c;
    }
  }
}

void appendBase64Block(std::string& out, std::span<const std::uint8_t> bytes) {
  if (bytes.empty()) {
    out += "\r\n";
    return;
  }
  // 57 bytes make exactly one line of 76 characters.
  constexpr std::size_t kBytesPerLine = 57;
  const std::size_t encoded = platform::base64::encodedLength(bytes.size());
  out.reserve(out.size() + encoded + 3 * (encoded / 76) + 3);
  for (std::size_t offset = 0; offset < bytes.size(); offset += kBytesPerLine) {
    const std::span<const std::uint8_t> line =
        bytes.subspan(offset, std::min(kBytesPerLine, bytes.size() - offset));
    out += ' ';
    const std::size_t at = out.size();
    out.resize(at + platform::base64::encodedLength(line.size()));
    platform::base64::encodeInto(line, out.data() + at);
    out += "\r\n";
  }
}

}  // namespace zt::contacts
