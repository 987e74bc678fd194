#include "tools/tessel/setting_value.h"

#include <charconv>
#include <cstdint>
#include <cstdio>
#include <cstdlib>

#include "platform/calendar_day.h"
#include "tessel/record_json.h"

namespace tessel::cli {

using zt::platform::CalendarDate;
using zt::platform::Number;
using zt::platform::TimeZone;
using zt::platform::Value;

namespace {

std::optional<std::int64_t> parseInteger(std::string_view text) {
  if (!text.empty() && text.front() == '+') text.remove_prefix(1);
  if (text.empty()) return std::nullopt;
  std::int64_t value = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return value;
}

// Reads exactly `count` digits at `pos`.
bool readDigits(std::string_view text, std::size_t& pos, std::size_t count, int& out) {
  if (pos + count > text.size()) return false;
  out = 0;
  for (std::size_t i = 0; i < count; ++i) {
    const char c = text[pos + i];
    if (c < '0' || c > '9') return false;
    out = out * 10 + (c - '0');
  }
  pos += count;
  return true;
}

bool readChar(std::string_view text, std::size_t& pos, char c) {
  if (pos < text.size() && text[pos] == c) {
    ++pos;
    return true;
  }
  return false;
}

std::optional<CalendarDate> parseIsoDate(std::string_view text) {
  std::size_t pos = 0;
  CalendarDate::Fields f;
  if (!readDigits(text, pos, 4, f.year) || !readChar(text, pos, '-') ||
      !readDigits(text, pos, 2, f.month) || !readChar(text, pos, '-') ||
      !readDigits(text, pos, 2, f.day) || !readChar(text, pos, 'T') ||
      !readDigits(text, pos, 2, f.hour) || !readChar(text, pos, ':') ||
      !readDigits(text, pos, 2, f.minute) || !readChar(text, pos, ':') ||
      !readDigits(text, pos, 2, f.second)) {
    return std::nullopt;
  }
  if (!zt::platform::isCalendarDay(f.year, f.month, f.day) || f.hour > 23 || f.minute > 59 ||
      f.second > 59) {
    return std::nullopt;
  }
  std::uint32_t nanoseconds = 0;
  if (readChar(text, pos, '.')) {
    std::size_t digits = 0;
    while (pos < text.size() && text[pos] >= '0' && text[pos] <= '9') {
      if (digits == 9) return std::nullopt;
      nanoseconds = nanoseconds * 10 + static_cast<std::uint32_t>(text[pos] - '0');
      ++pos;
      ++digits;
    }
    if (digits == 0) return std::nullopt;
    for (; digits < 9; ++digits) nanoseconds *= 10;
  }

  // The zone designator is required: a setting date is an instant, and the offset written is
  // the zone its fields are read in later ("Z" is GMT, as in the dates the tool stores).
  std::optional<TimeZone> zone;
  if (readChar(text, pos, 'Z')) {
    zone = TimeZone::gmt();
  } else if (pos < text.size() && (text[pos] == '+' || text[pos] == '-')) {
    const int sign = text[pos] == '-' ? -1 : 1;
    ++pos;
    int hours = 0, minutes = 0;
    if (!readDigits(text, pos, 2, hours)) return std::nullopt;
    readChar(text, pos, ':');
    if (!readDigits(text, pos, 2, minutes) || hours > 23 || minutes > 59) return std::nullopt;
    const std::int32_t offset = sign * (hours * 3600 + minutes * 60);
    zone = offset == 0 ? TimeZone::gmt() : TimeZone::unnamed(offset);
  }
  if (!zone || pos != text.size()) return std::nullopt;
  const CalendarDate date = CalendarDate::fromFields(f, *zone);
  return CalendarDate(date.instant(), *zone, nanoseconds);
}

std::string formatIsoDate(const CalendarDate& date) {
  const CalendarDate::Fields f = date.fields();
  char buffer[64];
  std::snprintf(buffer, sizeof buffer, "%04d-%02d-%02dT%02d:%02d:%02d", f.year, f.month, f.day,
                f.hour, f.minute, f.second);
  std::string out = buffer;
  if (date.nanoseconds() != 0) {
    std::snprintf(buffer, sizeof buffer, ".%09u", static_cast<unsigned>(date.nanoseconds()));
    std::string fraction = buffer;
    while (fraction.back() == '0') fraction.pop_back();
    out += fraction;
  }
  const std::int32_t offset = date.timeZone().secondsFromGMT(date.instant());
  if (offset == 0) return out + "Z";
  const std::int32_t magnitude = std::abs(offset);
  std::snprintf(buffer, sizeof buffer, "%c%02d:%02d", offset < 0 ? '-' : '+', magnitude / 3600,
                magnitude % 3600 / 60);
  return out + buffer;
}

}  // namespace

std::optional<Value> parseSettingValue(std::string_view text) {
  if (text == "true") return Value::boolean(true);
  if (text == "false") return Value::boolean(false);
  if (auto integer = parseInteger(text)) return Value::integer(*integer);
  if (auto date = parseIsoDate(text)) return Value(std::move(*date));
  return std::nullopt;
}

std::string formatSettingValue(const Value& value) {
  if (const Number* number = value.asNumber()) {
    if (number->kind() == Number::Kind::Boolean) return number->boolValue() ? "true" : "false";
    return number->description();
  }
  if (const CalendarDate* date = value.asDate()) return formatIsoDate(*date);
  return valueToJson(value);
}

}  // namespace tessel::cli
