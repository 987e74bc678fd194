#include "tools/tessel/setting_value.h"

#include <charconv>
#include <cstdint>
#include <cstdio>
#include <cstdlib>

#include "platform/iso_wall_clock.h"
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
  namespace iso = zt::platform::iso;
  std::size_t pos = 0;
  const std::optional<iso::WallClock> clock =
      iso::readWallClock(text, pos, iso::YearForm::FourDigits, iso::SecondsForm::Required);
  if (!clock || iso::firstInvalidField(*clock) != iso::Field::None) return std::nullopt;
  const CalendarDate::Fields f{static_cast<int>(clock->year),   static_cast<int>(clock->month),
                               static_cast<int>(clock->day),    static_cast<int>(clock->hour),
                               static_cast<int>(clock->minute), static_cast<int>(clock->second)};

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
  return CalendarDate(date.instant(), *zone, clock->nanoseconds);
}

std::string formatIsoDate(const CalendarDate& date) {
  const CalendarDate::Fields f = date.fields();
  char buffer[64];
  std::snprintf(buffer, sizeof buffer, "%04d-%02d-%02dT%02d:%02d:%02d", f.year, f.month, f.day,
                f.hour, f.minute, f.second);
  std::string out = buffer + zt::platform::iso::fraction(date.nanoseconds());
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
