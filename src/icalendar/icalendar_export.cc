#include "icalendar/icalendar_export.h"

#include <algorithm>
#include <charconv>
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "icalendar/zeto_calendar_export.h"
#include "platform/ascii.h"
#include "platform/log.h"
#include "platform/utf16.h"

namespace zt::icalendar {

namespace {

template <typename Integer>
void appendDecimal(std::string& buffer, Integer value) {
  char digits[24];
  auto [end, ec] = std::to_chars(digits, digits + sizeof digits, value);
  (void)ec;  // 24 characters hold any 64-bit integer
  buffer.append(digits, end);
}

// The characters that RFC 2445 section 4.3.11 escapes in text values, plus the double quote
// the device also wants escaped; parameter values escape ":" too.
template <bool kEscapeColon>
constexpr bool isEscapable(char c) {
  switch (c) {
    case '\\':
    case ';':
    case ',':
    case '\n':
    case '\r':
    case '"':
      return true;
    case ':':
      return kEscapeColon;
    default:
      return false;
  }
}

template <bool kEscapeColon>
std::size_t findEscapable(std::string_view text, std::size_t from) {
  for (std::size_t i = from; i < text.size(); ++i) {
    if (isEscapable<kEscapeColon>(text[i])) return i;
  }
  return std::string_view::npos;
}

// One pass that gives the same text as replacing, in order, \ ; [:] , LF CR and the double
// quote over the whole text: none of the replacements introduces a character that a later
// one looks for, so escaping character by character is equivalent. CR LF thus becomes two
// escaped newlines and a lone CR one.
template <bool kEscapeColon>
void escapeInto(std::string& out, std::string_view text) {
  std::size_t from = 0;
  for (std::size_t at; (at = findEscapable<kEscapeColon>(text, from)) != text.npos; from = at + 1) {
    out.append(text, from, at - from);
    const char c = text[at];
    out += '\\';
    out += (c == '\n' || c == '\r') ? 'n' : c;
  }
  out.append(text, from);
}

template <bool kEscapeColon>
void escapeInPlace(std::string& buffer) {
  if (findEscapable<kEscapeColon>(buffer, 0) == std::string_view::npos) return;
  std::string escaped;
  escapeInto<kEscapeColon>(escaped, buffer);
  buffer.swap(escaped);
}

bool isQuoted(std::string_view text) {
  // A lone double quote both begins and ends the text.
  return !text.empty() && text.front() == '"' && text.back() == '"';
}

void appendTwoDigits(std::string& buffer, std::int64_t value) {
  buffer += static_cast<char>('0' + value / 10 % 10);
  buffer += static_cast<char>('0' + value % 10);
}

void appendFallbackRepresentation(const platform::Value& value, std::string& buffer) {
  const std::string description = value.description();
  platform::Log::always("WARNING appendRFC2445RepresentationTo was called on RootObject - %@ %@",
                        value.typeName(), description);
  buffer += description;
}

}  // namespace

// --- Output buffer ------------------------------------------------------------------------

void appendRFC2445ComponentStart(std::string& buffer, std::string_view name) {
  buffer += "BEGIN:";
  buffer += name;
  buffer += "\r\n";
}

void appendRFC2445ComponentEnd(std::string& buffer, std::string_view name) {
  buffer += "END:";
  buffer += name;
  buffer += "\r\n";
}

void appendRFC2445Line(std::string& buffer, std::string_view text) {
  buffer += fold(text);
  buffer += "\r\n";
}

std::string& fold(std::string& buffer) {
  // A UTF-8 text never has more UTF-16 code units than bytes, so short texts need no count.
  if (buffer.size() >= kFoldLimit) platform::utf16::fold(buffer, kFoldLimit);
  return buffer;
}

void foldRFC2445From(std::string& buffer, std::size_t start) {
  const std::size_t length = buffer.size() - start;
  if (length < kFoldLimit) return;
  const auto isAscii = [](char c) { return static_cast<unsigned char>(c) < 0x80; };
  if (!std::all_of(buffer.begin() + static_cast<std::ptrdiff_t>(start), buffer.end(), isAscii)) {
    std::string line = buffer.substr(start);
    buffer.resize(start);
    buffer += fold(line);
    return;
  }
  // ASCII text: one unit per byte, so a fold goes before every multiple of the limit, the
  // very end included. The pieces move back from the last one, in place.
  constexpr std::string_view kFold = "\r\n ";
  const std::size_t folds = length / kFoldLimit;
  buffer.resize(buffer.size() + folds * kFold.size());
  char* const line = buffer.data() + start;
  std::size_t from = length;
  std::size_t to = length + folds * kFold.size();
  for (std::size_t k = folds; k > 0; --k) {
    const std::size_t piece = k * kFoldLimit;
    to -= from - piece;
    std::memmove(line + to, line + piece, from - piece);
    to -= kFold.size();
    std::memcpy(line + to, kFold.data(), kFold.size());
    from = piece;
  }
}

void appendEscapedRFC2445Value(std::string& buffer, std::string_view text) {
  escapeInto<false>(buffer, text);
}

void appendQuotedString(std::string& buffer, std::string_view text) {
  if (isQuoted(text)) {
    buffer += text;
    return;
  }
  buffer += '"';
  buffer += text;
  buffer += '"';
}

void quoteRFC2445Value(std::string& buffer) {
  if (isQuoted(buffer)) return;
  buffer.insert(buffer.begin(), '"');
  buffer += '"';
}

void escapeRFC2445Value(std::string& buffer) {
  escapeInPlace<false>(buffer);
}

void escapeRFC2445ParameterValue(std::string& buffer) {
  escapeInPlace<true>(buffer);
}

void appendRFC2445ParameterName(std::string& buffer, std::string_view name) {
  buffer += ';';
  buffer += name;
  buffer += '=';
}

void appendRFC2445Parameter(std::string& buffer, std::string_view name, std::string_view value) {
  buffer += ';';
  buffer += name;
  buffer += '=';
  buffer += value;
}

void appendDatePropertyLine(std::string& buffer, std::string_view name,
                            platform::CalendarDate& date) {
  buffer += name;
  buffer += iCalendarPropertyValueRepresentation(date);
  buffer += "\r\n";
}

void appendDatePropertyLine(std::string& buffer, std::string_view name,
                            const platform::Value& value) {
  if (const platform::CalendarDate* date = value.asDate()) {
    // The text of the date as it would be switched to GMT, the value left as it is.
    buffer += name;
    appendPropertyValueRepresentation(buffer, *date);
    buffer += "\r\n";
    return;
  }
  buffer += name;
  buffer += ':';
  if (const std::string* text = value.asString()) {
    escapeInto<false>(buffer, *text);
  } else {
    escapeInto<false>(buffer, iCalendarRepresentation(value));
  }
  buffer += "\r\n";
}

// --- Strings ------------------------------------------------------------------------------

std::string iCalendarRepresentation(std::string_view text) {
  return std::string(text);
}

std::string iCalendarRepresentation(const std::string& text) {
  return text;
}

void appendRFC2445RepresentationTo(std::string_view text, std::string& buffer) {
  buffer += text;
}

void appendRFC2445RepresentationTo(const std::string& text, std::string& buffer) {
  buffer += text;
}

std::string fold(std::string_view text) {
  std::string copy(text);
  fold(copy);
  return copy;
}

std::string iCalendarQuoted(std::string_view text) {
  if (isQuoted(text)) return std::string(text);
  std::string quoted;
  quoted.reserve(text.size() + 2);
  quoted += '"';
  quoted += text;
  quoted += '"';
  return quoted;
}

std::string iCalendarParameterValue(std::string_view text) {
  return std::string(text);
}

std::string iCalendarEscapeValue(std::string_view text) {
  std::string escaped;
  escapeInto<false>(escaped, text);
  return escaped;
}

std::string iCalendarEscapeParameterValue(std::string_view text) {
  std::string escaped;
  escapeInto<true>(escaped, text);
  return escaped;
}

std::string iCalendarRepresentationPartStat(std::string_view word) {
  if (word == "needsaction") return "NEEDS-ACTION";
  if (word == "inprocess") return "IN-PROCESS";
  // The words that reach here are ASCII; other bytes pass through unchanged.
  return platform::upperAscii(word);
}

// --- Numbers ------------------------------------------------------------------------------

void appendRFC2445BoolRepresentationTo(const platform::Number& number, std::string& buffer) {
  buffer += number.boolValue() ? "TRUE" : "FALSE";
}

void appendRFC2445UTCOffsetRepresentationTo(const platform::Number& number, std::string& buffer) {
  const std::int32_t s = number.int32Value();
  buffer += s < 0 ? '-' : '+';
  // Truncating division drops the sign; an offset of a day or more wraps.
  const std::int64_t hours = std::llabs((s % 86400) / 3600);
  const std::int64_t minutes = std::llabs((s % 3600) / 60);
  const std::int64_t seconds = std::llabs(s % 60);
  appendTwoDigits(buffer, hours);
  appendTwoDigits(buffer, minutes);
  if (seconds != 0) appendTwoDigits(buffer, seconds);
}

void appendRFC2445RepresentationTo(const platform::Number& number, std::string& buffer) {
  appendDecimal(buffer, number.int32Value());
}

std::string iCalendarRepresentation(const platform::Number& number) {
  std::string text;
  appendDecimal(text, number.int32Value());
  return text;
}

std::string iCalendarDurationRepresentation(const platform::Number& number) {
  const std::int64_t v = number.int64Value();
  std::string text;
  if (v < 0) text += '-';
  text += 'P';
  const std::int64_t days = v / 86400;
  const std::int64_t hours = (v % 86400) / 3600;
  const std::int64_t minutes = (v % 3600) / 60;
  const std::int64_t seconds = v % 60;
  // The day count is written as a 32-bit quantity, as the device expects.
  const auto days32 = static_cast<std::int32_t>(days);
  if (days32 != 0) {
    const auto magnitude =
        days32 < 0 ? 0U - static_cast<std::uint32_t>(days32) : static_cast<std::uint32_t>(days32);
    appendDecimal(text, magnitude);
    text += 'D';
  }
  if (hours != 0 || minutes != 0 || seconds != 0) {
    text += 'T';
    if (hours != 0) {
      appendDecimal(text, std::llabs(hours));
      text += 'H';
    }
    if (minutes != 0) {
      appendDecimal(text, std::llabs(minutes));
      text += 'M';
    }
    if (seconds != 0) {
      appendDecimal(text, std::llabs(seconds));
      text += 'S';
    }
  }
  if (v == 0) text += "T0S";
  return text;
}

// --- URLs and arrays ----------------------------------------------------------------------

void appendRFC2445RepresentationTo(const platform::Url& url, std::string& buffer) {
  buffer += url.text;
}

void appendRFC2445RepresentationTo(const platform::Array& array, std::string& buffer) {
  bool first = true;
  for (const platform::Value& element : array) {
    if (!first) buffer += ',';
    first = false;
    appendRFC2445RepresentationTo(element, buffer);
  }
}

void appendRFC2445ParameterArrayRepresentationTo(const platform::Array& array,
                                                 std::string& buffer) {
  bool first = true;
  for (const platform::Value& element : array) {
    if (!first) buffer += ',';
    first = false;
    escapeInto<true>(buffer, element.description());
  }
}

// --- Any value ----------------------------------------------------------------------------

void appendRFC2445RepresentationTo(const platform::Value& value, std::string& buffer) {
  switch (value.kind()) {
    case platform::Value::Kind::String:
      buffer += *value.asString();
      return;
    case platform::Value::Kind::Number:
      appendRFC2445RepresentationTo(*value.asNumber(), buffer);
      return;
    case platform::Value::Kind::Url:
      appendRFC2445RepresentationTo(*value.asUrl(), buffer);
      return;
    case platform::Value::Kind::Array:
      appendRFC2445RepresentationTo(*value.asArray(), buffer);
      return;
    case platform::Value::Kind::Date:
    case platform::Value::Kind::Data:
    case platform::Value::Kind::Dictionary:
      appendFallbackRepresentation(value, buffer);
      return;
  }
}

std::string iCalendarRepresentation(const platform::Value& value) {
  switch (value.kind()) {
    case platform::Value::Kind::String:
      return *value.asString();
    case platform::Value::Kind::Number:
      return iCalendarRepresentation(*value.asNumber());
    case platform::Value::Kind::Date: {
      platform::CalendarDate copy = *value.asDate();
      return iCalendarRepresentation(copy);
    }
    case platform::Value::Kind::Url:
    case platform::Value::Kind::Data:
    case platform::Value::Kind::Array:
    case platform::Value::Kind::Dictionary:
      break;
  }
  std::string text;
  appendRFC2445RepresentationTo(value, text);
  return text;
}

}  // namespace zt::icalendar
