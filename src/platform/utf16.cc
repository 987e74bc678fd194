#include "platform/utf16.h"

#include <utility>

namespace zt::platform::utf16 {
namespace {

constexpr char32_t kReplacement = 0xFFFD;
constexpr std::string_view kReplacementUtf8 = "\xEF\xBF\xBD";
constexpr std::string_view kFold = "\r\n ";

bool isContinuation(unsigned char c) {
  return (c & 0xC0) == 0x80;
}

// Decodes the character at `p` and moves `p` past it. A malformed sequence gives U+FFFD and
// consumes its maximal subpart (the longest prefix that could still have started a valid
// character, at least one byte), so the next character is never swallowed: overlong forms,
// surrogates encoded in UTF-8 and values above U+10FFFF are all refused at their second byte.
char32_t decode(const unsigned char*& p, const unsigned char* end) {
  const unsigned char lead = *p++;
  if (lead < 0x80) return lead;

  int trailing;
  char32_t cp;
  // The allowed range of the second byte narrows for the leads where overlong forms,
  // surrogates or values above U+10FFFF would otherwise be reachable.
  unsigned char low = 0x80, high = 0xBF;
  if (lead >= 0xC2 && lead <= 0xDF) {
    trailing = 1;
    cp = lead & 0x1F;
  } else if (lead >= 0xE0 && lead <= 0xEF) {
    trailing = 2;
    cp = lead & 0x0F;
    if (lead == 0xE0) low = 0xA0;
    if (lead == 0xED) high = 0x9F;
  } else if (lead >= 0xF0 && lead <= 0xF4) {
    trailing = 3;
    cp = lead & 0x07;
    if (lead == 0xF0) low = 0x90;
    if (lead == 0xF4) high = 0x8F;
  } else {
    return kReplacement;  // a stray continuation byte, C0, C1 or F5...FF
  }

  if (p == end || *p < low || *p > high) return kReplacement;
  cp = (cp << 6) | (*p++ & 0x3F);
  while (--trailing > 0) {
    if (p == end || !isContinuation(*p)) return kReplacement;
    cp = (cp << 6) | (*p++ & 0x3F);
  }
  return cp;
}

void appendUtf8(std::string& out, char32_t cp) {
  if (cp < 0x80) {
    out += static_cast<char>(cp);
  } else if (cp < 0x800) {
    const char bytes[] = {static_cast<char>(0xC0 | (cp >> 6)),
                          static_cast<char>(0x80 | (cp & 0x3F))};
    out.append(bytes, 2);
  } else if (cp < 0x10000) {
    const char bytes[] = {static_cast<char>(0xE0 | (cp >> 12)),
                          static_cast<char>(0x80 | ((cp >> 6) & 0x3F)),
                          static_cast<char>(0x80 | (cp & 0x3F))};
    out.append(bytes, 3);
  } else {
    const char bytes[] = {
        static_cast<char>(0xF0 | (cp >> 18)), static_cast<char>(0x80 | ((cp >> 12) & 0x3F)),
        static_cast<char>(0x80 | ((cp >> 6) & 0x3F)), static_cast<char>(0x80 | (cp & 0x3F))};
    out.append(bytes, 4);
  }
}

const unsigned char* bytesOf(std::string_view s) {
  return reinterpret_cast<const unsigned char*>(s.data());
}

}  // namespace

std::u16string fromUtf8(std::string_view utf8) {
  std::u16string out;
  out.reserve(utf8.size());  // never more units than bytes
  const unsigned char* p = bytesOf(utf8);
  const unsigned char* const end = p + utf8.size();
  while (p != end) {
    if (*p < 0x80) {
      out += static_cast<char16_t>(*p++);
      continue;
    }
    const char32_t cp = decode(p, end);
    if (cp < 0x10000) {
      out += static_cast<char16_t>(cp);
    } else {
      const char32_t v = cp - 0x10000;
      out += static_cast<char16_t>(0xD800 | (v >> 10));
      out += static_cast<char16_t>(0xDC00 | (v & 0x3FF));
    }
  }
  return out;
}

std::string toUtf8(std::u16string_view utf16) {
  std::string out;
  out.reserve(utf16.size() * 3);  // a BMP unit is at most three bytes, a pair four
  for (std::size_t i = 0; i < utf16.size(); ++i) {
    const char16_t unit = utf16[i];
    if (unit < 0xD800 || unit > 0xDFFF) {
      appendUtf8(out, unit);
    } else if (unit <= 0xDBFF && i + 1 < utf16.size() && utf16[i + 1] >= 0xDC00 &&
               utf16[i + 1] <= 0xDFFF) {
      appendUtf8(out, 0x10000 + ((static_cast<char32_t>(unit - 0xD800) << 10) |
                                 static_cast<char32_t>(utf16[i + 1] - 0xDC00)));
      ++i;
    } else {
      appendUtf8(out, kReplacement);
    }
  }
  return out;
}

std::size_t length(std::string_view utf8) {
  std::size_t units = 0;
  const unsigned char* p = bytesOf(utf8);
  const unsigned char* const end = p + utf8.size();
  while (p != end) {
    if (*p < 0x80) {
      ++p;
      ++units;
    } else {
      units += decode(p, end) < 0x10000 ? 1 : 2;
    }
  }
  return units;
}

void fold(std::string& utf8, std::size_t limit) {
  // No text of fewer bytes than the limit can reach it: a unit needs at least one byte.
  if (limit == 0 || utf8.size() < limit) return;

  std::string out;
  // Each fold adds three bytes, or five when it splits a four-byte character.
  out.reserve(utf8.size() + (utf8.size() / limit + 1) * 5);
  const unsigned char* p = bytesOf(utf8);
  const unsigned char* const end = p + utf8.size();
  std::size_t units = 0;  // units of the unfolded text before `p`
  std::size_t nextCut = limit;
  bool folded = false;
  while (p != end) {
    if (units == nextCut) {
      out += kFold;
      nextCut += limit;
      folded = true;
    }
    const unsigned char* const start = p;
    std::size_t width = 1;
    if (*p < 0x80) {
      ++p;
    } else if (decode(p, end) >= 0x10000) {
      width = 2;
    }
    if (width == 2 && units + 1 == nextCut) {
      out += kReplacementUtf8;
      out += kFold;
      out += kReplacementUtf8;
      nextCut += limit;
      folded = true;
    } else {
      // Malformed bytes are kept as they are; they count as the one U+FFFD they stand for.
      out.append(reinterpret_cast<const char*>(start), static_cast<std::size_t>(p - start));
    }
    units += width;
  }
  if (units == nextCut) {
    out += kFold;
    folded = true;
  }
  if (folded) utf8.swap(out);
}

void appendBigEndian(std::string& out, std::string_view utf8) {
  out.reserve(out.size() + utf8.size() * 2);  // every form takes at most twice its bytes
  const auto put = [&out](char32_t unit) {
    const char bytes[] = {static_cast<char>(unit >> 8), static_cast<char>(unit & 0xFF)};
    out.append(bytes, 2);
  };
  const unsigned char* p = bytesOf(utf8);
  const unsigned char* const end = p + utf8.size();
  while (p != end) {
    const char32_t cp = *p < 0x80 ? *p++ : decode(p, end);
    if (cp < 0x10000) {
      put(cp);
    } else {
      const char32_t v = cp - 0x10000;
      put(0xD800 | (v >> 10));
      put(0xDC00 | (v & 0x3FF));
    }
  }
}

}  // namespace zt::platform::utf16
