#include "importers/vcard_decoding.h"

#include <iconv.h>

#include <cerrno>
#include <cstdint>
#include <stdexcept>

namespace tessel::importers {

namespace {

int hexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  return -1;
}

int base64Digit(char c) {
  if (c >= 'A' && c <= 'Z') return c - 'A';
  if (c >= 'a' && c <= 'z') return c - 'a' + 26;
  if (c >= '0' && c <= '9') return c - '0' + 52;
  if (c == '+') return 62;
  if (c == '/') return 63;
  return -1;
}

bool isBlank(char c) {
  return c == ' ' || c == '\t' || c == '\r' || c == '\n';
}

// One iconv conversion descriptor, closed however the conversion ends.
class Converter {
 public:
  explicit Converter(const std::string& from) : cd_(iconv_open("UTF-8", from.c_str())) {}
  ~Converter() {
    if (valid()) iconv_close(cd_);
  }
  Converter(const Converter&) = delete;
  Converter& operator=(const Converter&) = delete;

  bool valid() const { return cd_ != reinterpret_cast<iconv_t>(-1); }

  // None when the bytes are not valid in the source charset.
  std::optional<std::string> convert(std::string_view bytes) {
    std::string out;
    std::string input(bytes);
    char* in = input.data();
    std::size_t inLeft = input.size();
    char buffer[4096];
    while (inLeft > 0) {
      char* outPtr = buffer;
      std::size_t outLeft = sizeof buffer;
      const std::size_t done = iconv(cd_, &in, &inLeft, &outPtr, &outLeft);
      out.append(buffer, static_cast<std::size_t>(outPtr - buffer));
      if (done == static_cast<std::size_t>(-1) && errno != E2BIG) return std::nullopt;
    }
    // Stateful charsets (ISO-2022-JP) may hold a shift sequence until flushed.
    char* outPtr = buffer;
    std::size_t outLeft = sizeof buffer;
    if (iconv(cd_, nullptr, nullptr, &outPtr, &outLeft) == static_cast<std::size_t>(-1)) {
      return std::nullopt;
    }
    out.append(buffer, static_cast<std::size_t>(outPtr - buffer));
    return out;
  }

 private:
  iconv_t cd_;
};

}  // namespace

zt::platform::Data decodeBase64(std::string_view text) {
  zt::platform::Data bytes;
  bytes.reserve(text.size() / 4 * 3);
  std::uint32_t bits = 0;
  int count = 0;
  int padding = 0;
  for (char c : text) {
    if (isBlank(c)) continue;
    if (c == '=') {
      ++padding;
      continue;
    }
    const int digit = base64Digit(c);
    if (digit < 0 || padding > 0) throw std::invalid_argument("bad base64");
    bits = (bits << 6) | static_cast<std::uint32_t>(digit);
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
    throw std::invalid_argument("bad base64");
  }
  if (count == 2) {
    bytes.push_back(static_cast<std::uint8_t>(bits >> 4));
  } else if (count == 3) {
    bytes.push_back(static_cast<std::uint8_t>(bits >> 10));
    bytes.push_back(static_cast<std::uint8_t>(bits >> 2));
  }
  return bytes;
}

std::string decodeQuotedPrintable(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] != '=') {
      out += text[i];
      continue;
    }
    if (i + 1 == text.size()) break;  // the soft break at the very end
    const int high = hexDigit(text[i + 1]);
    const int low = i + 2 < text.size() ? hexDigit(text[i + 2]) : -1;
    if (high < 0 || low < 0) throw std::invalid_argument("bad quoted-printable");
    out += static_cast<char>(high * 16 + low);
    i += 2;
  }
  return out;
}

std::string decodePercent(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (std::size_t i = 0; i < text.size(); ++i) {
    const int high = text[i] == '%' && i + 1 < text.size() ? hexDigit(text[i + 1]) : -1;
    const int low = high >= 0 && i + 2 < text.size() ? hexDigit(text[i + 2]) : -1;
    if (text[i] == '%' && low < 0) throw std::invalid_argument("bad %-escape in data: URI");
    if (low >= 0) {
      out += static_cast<char>(high * 16 + low);
      i += 2;
    } else {
      out += text[i];
    }
  }
  return out;
}

bool isValidUtf8(std::string_view text) {
  std::size_t i = 0;
  while (i < text.size()) {
    const auto byte = static_cast<unsigned char>(text[i]);
    std::size_t length = 0;
    std::uint32_t code = 0;
    if (byte < 0x80) {
      ++i;
      continue;
    } else if ((byte & 0xE0) == 0xC0) {
      length = 2;
      code = byte & 0x1F;
    } else if ((byte & 0xF0) == 0xE0) {
      length = 3;
      code = byte & 0x0F;
    } else if ((byte & 0xF8) == 0xF0) {
      length = 4;
      code = byte & 0x07;
    } else {
      return false;
    }
    if (i + length > text.size()) return false;
    for (std::size_t k = 1; k < length; ++k) {
      const auto next = static_cast<unsigned char>(text[i + k]);
      if ((next & 0xC0) != 0x80) return false;
      code = (code << 6) | (next & 0x3F);
    }
    // Overlong forms, surrogates and values past U+10FFFF are not UTF-8.
    static constexpr std::uint32_t kSmallest[] = {0, 0, 0x80, 0x800, 0x10000};
    if (code < kSmallest[length] || code > 0x10FFFF || (code >= 0xD800 && code <= 0xDFFF)) {
      return false;
    }
    i += length;
  }
  return true;
}

std::string toUtf8(std::string_view bytes, std::optional<std::string_view> charset) {
  if (!charset) {
    if (isValidUtf8(bytes)) return std::string(bytes);
    Converter converter("WINDOWS-1252");
    // windows-1252 leaves five bytes unassigned; ISO-8859-1 reads every byte.
    if (auto text = converter.convert(bytes)) return *text;
    Converter latin1("ISO-8859-1");
    return latin1.convert(bytes).value_or(std::string());
  }
  const std::string name(trimBlanks(*charset));
  const std::string lower = lowerAscii(name);
  if (lower == "utf-8" || lower == "utf8" || lower == "us-ascii" || lower == "ascii") {
    if (!isValidUtf8(bytes)) throw std::invalid_argument("text is not valid " + name);
    return std::string(bytes);
  }
  // iconv also reads names with "//" suffixes as conversion options; a charset is only a name.
  if (name.empty() || name.find('/') != std::string::npos) {
    throw std::invalid_argument("unknown charset \"" + name + "\"");
  }
  Converter converter(name);
  if (!converter.valid()) throw std::invalid_argument("unknown charset \"" + name + "\"");
  auto text = converter.convert(bytes);
  if (!text) throw std::invalid_argument("text is not valid " + name);
  return *text;
}

std::vector<std::string> splitUnescaped(std::string_view raw, char separator) {
  std::vector<std::string> parts(1);
  for (std::size_t i = 0; i < raw.size(); ++i) {
    if (raw[i] == '\\' && i + 1 < raw.size()) {
      parts.back() += raw[i];
      parts.back() += raw[++i];
    } else if (raw[i] == separator) {
      parts.emplace_back();
    } else {
      parts.back() += raw[i];
    }
  }
  return parts;
}

std::string unescapeText(std::string_view raw) {
  std::string out;
  out.reserve(raw.size());
  for (std::size_t i = 0; i < raw.size(); ++i) {
    if (raw[i] != '\\' || i + 1 == raw.size()) {
      out += raw[i];
      continue;
    }
    const char next = raw[i + 1];
    if (next == 'n' || next == 'N') {
      out += '\n';
    } else if (next == '\\' || next == ',' || next == ';') {
      out += next;
    } else {
      out += '\\';
      out += next;
    }
    ++i;
  }
  return out;
}

std::string lowerAscii(std::string_view text) {
  std::string out(text);
  for (char& c : out) {
    if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
  }
  return out;
}

std::string_view trimBlanks(std::string_view text) {
  while (!text.empty() && (text.front() == ' ' || text.front() == '\t')) text.remove_prefix(1);
  while (!text.empty() && (text.back() == ' ' || text.back() == '\t')) text.remove_suffix(1);
  return text;
}

}  // namespace tessel::importers
