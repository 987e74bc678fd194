#include "importers/vcard_decoding.h"

#include <iconv.h>

#include <cerrno>
#include <cstdint>
#include <stdexcept>
#include <utility>

#include "platform/ascii.h"
#include "platform/base64.h"
#include "platform/utf8.h"

namespace tessel::importers {

using zt::platform::lowerAscii;
using zt::platform::trimBlanks;

namespace {

int hexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  return -1;
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
  auto bytes = zt::platform::base64::decode(text, zt::platform::base64::Form::Tolerant);
  if (!bytes) throw std::invalid_argument("bad base64");
  return std::move(*bytes);
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

std::string toUtf8(std::string_view bytes, std::optional<std::string_view> charset) {
  if (!charset) {
    if (zt::platform::utf8::isValid(bytes)) return std::string(bytes);
    Converter converter("WINDOWS-1252");
    // windows-1252 leaves five bytes unassigned; ISO-8859-1 reads every byte.
    if (auto text = converter.convert(bytes)) return *text;
    Converter latin1("ISO-8859-1");
    return latin1.convert(bytes).value_or(std::string());
  }
  const std::string name(trimBlanks(*charset));
  const std::string lower = lowerAscii(name);
  if (lower == "utf-8" || lower == "utf8" || lower == "us-ascii" || lower == "ascii") {
    if (!zt::platform::utf8::isValid(bytes))
      throw std::invalid_argument("text is not valid " + name);
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

std::vector<std::string> splitUnescaped(std::string_view raw, char separator, TextEscapes escapes) {
  std::vector<std::string> parts(1);
  for (std::size_t i = 0; i < raw.size(); ++i) {
    const bool escape = raw[i] == '\\' && i + 1 < raw.size() &&
                        (escapes == TextEscapes::Version3 || raw[i + 1] == ';');
    if (escape) {
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

std::string unescapeText(std::string_view raw, TextEscapes escapes) {
  std::string out;
  out.reserve(raw.size());
  for (std::size_t i = 0; i < raw.size(); ++i) {
    if (raw[i] != '\\' || i + 1 == raw.size()) {
      out += raw[i];
      continue;
    }
    const char next = raw[i + 1];
    if (escapes == TextEscapes::Version21 && next != ';') {
      out += '\\';  // itself; what follows is read on its own
      continue;
    }
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

}  // namespace tessel::importers
