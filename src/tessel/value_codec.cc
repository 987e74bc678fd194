#include "tessel/value_codec.h"

#include <bit>
#include <chrono>
#include <cstring>

#include "tessel/exception.h"

namespace tessel::detail {

namespace {

using zt::platform::Array;
using zt::platform::CalendarDate;
using zt::platform::Data;
using zt::platform::Dictionary;
using zt::platform::Number;
using zt::platform::TimeZone;
using zt::platform::Url;
using zt::platform::Value;

// Tags of the stored form. Their numbers are part of the file format: never renumber.
enum Tag : std::uint8_t {
  kString = 1,
  kInteger = 2,
  kReal = 3,
  kFalse = 4,
  kTrue = 5,
  kDate = 6,
  kUrl = 7,
  kData = 8,
  kArray = 9,
  kDictionary = 10,
};

enum ZoneTag : std::uint8_t { kZoneNamed = 1, kZoneLocal = 2, kZoneUnnamed = 3 };
enum UnnamedFlags : std::uint8_t { kHasDaylight = 1, kHasRule = 2 };

constexpr std::uint8_t kRecordFormat = 1;
// Deeper nesting than any record has; guards the reader's stack against hostile input.
constexpr int kMaxDepth = 64;

[[noreturn]] void corrupt(std::string_view what) {
  throw Exception(TesselCodingException, "malformed stored value: " + std::string(what));
}

}  // namespace

void ValueWriter::varint(std::uint64_t n) {
  while (n >= 0x80) {
    out_.push_back(static_cast<std::uint8_t>(n | 0x80));
    n >>= 7;
  }
  out_.push_back(static_cast<std::uint8_t>(n));
}

void ValueWriter::signedVarint(std::int64_t n) {
  // Zig-zag: small negative numbers stay short.
  varint((static_cast<std::uint64_t>(n) << 1) ^ static_cast<std::uint64_t>(n >> 63));
}

void ValueWriter::string(std::string_view text) {
  varint(text.size());
  out_.insert(out_.end(), text.begin(), text.end());
}

void ValueWriter::dictionary(const Dictionary& dictionary) {
  varint(dictionary.size());
  for (const auto& [key, item] : dictionary) {
    string(key);
    value(item);
  }
}

void ValueWriter::record(const Dictionary& record) {
  byte(kRecordFormat);
  dictionary(record);
}

void ValueWriter::value(const Value& value) {
  switch (value.kind()) {
    case Value::Kind::String:
      byte(kString);
      string(*value.asString());
      return;
    case Value::Kind::Number: {
      const Number& number = *value.asNumber();
      switch (number.kind()) {
        case Number::Kind::Integer:
          byte(kInteger);
          signedVarint(number.int64Value());
          return;
        case Number::Kind::Real: {
          byte(kReal);
          auto bits = std::bit_cast<std::uint64_t>(number.doubleValue());
          for (int i = 0; i < 8; ++i) out_.push_back(static_cast<std::uint8_t>(bits >> (8 * i)));
          return;
        }
        case Number::Kind::Boolean:
          byte(number.boolValue() ? kTrue : kFalse);
          return;
      }
      return;
    }
    case Value::Kind::Date: {
      const CalendarDate& date = *value.asDate();
      byte(kDate);
      signedVarint(date.instant().time_since_epoch().count());
      varint(date.nanoseconds());
      const TimeZone& zone = date.timeZone();
      switch (zone.kind()) {
        case TimeZone::Kind::Named:
          byte(kZoneNamed);
          string(zone.name().value_or(""));
          return;
        case TimeZone::Kind::Local:
          byte(kZoneLocal);
          return;
        case TimeZone::Kind::Unnamed: {
          byte(kZoneUnnamed);
          auto daylight = zone.daylightOffset();
          auto rule = zone.daylightRule();
          byte(static_cast<std::uint8_t>((daylight ? kHasDaylight : 0) | (rule ? kHasRule : 0)));
          signedVarint(zone.standardOffset().value_or(0));
          if (daylight) signedVarint(*daylight);
          if (rule) string(*rule);
          return;
        }
      }
      return;
    }
    case Value::Kind::Url:
      byte(kUrl);
      string(value.asUrl()->text);
      return;
    case Value::Kind::Data: {
      const Data& data = *value.asData();
      byte(kData);
      varint(data.size());
      out_.insert(out_.end(), data.begin(), data.end());
      return;
    }
    case Value::Kind::Array: {
      const Array& array = *value.asArray();
      byte(kArray);
      varint(array.size());
      for (const Value& item : array) this->value(item);
      return;
    }
    case Value::Kind::Dictionary:
      byte(kDictionary);
      dictionary(*value.asDictionary());
      return;
  }
}

std::span<const std::uint8_t> ValueReader::take(std::size_t n) {
  if (n > in_.size() - position_) corrupt("truncated");
  auto part = in_.subspan(position_, n);
  position_ += n;
  return part;
}

std::uint8_t ValueReader::byte() {
  return take(1)[0];
}

std::uint64_t ValueReader::varint() {
  std::uint64_t result = 0;
  for (int shift = 0; shift < 64; shift += 7) {
    std::uint8_t b = byte();
    result |= static_cast<std::uint64_t>(b & 0x7f) << shift;
    if (!(b & 0x80)) return result;
  }
  corrupt("overlong number");
}

std::int64_t ValueReader::signedVarint() {
  std::uint64_t n = varint();
  return static_cast<std::int64_t>((n >> 1) ^ (~(n & 1) + 1));
}

std::size_t ValueReader::count() {
  std::uint64_t n = varint();
  // Every element takes at least one byte: a larger count cannot be genuine.
  if (n > in_.size() - position_) corrupt("count beyond the end");
  return static_cast<std::size_t>(n);
}

std::string ValueReader::string() {
  auto bytes = take(count());
  return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

Value ValueReader::value() {
  return valueAtDepth(0);
}

Dictionary ValueReader::dictionary(int depth) {
  std::size_t n = count();
  Dictionary result;
  result.reserve(n);
  for (std::size_t i = 0; i < n; ++i) {
    std::string key = string();
    result.set(std::move(key), valueAtDepth(depth + 1));
  }
  return result;
}

Dictionary ValueReader::record() {
  beginRecord();
  return dictionary(0);
}

void ValueReader::beginRecord() {
  if (byte() != kRecordFormat) corrupt("unknown record format");
}

std::string_view ValueReader::key() {
  auto bytes = take(count());
  return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

void ValueReader::skipValue() {
  const std::uint8_t tag = byte();
  if (tag == kString || tag == kUrl || tag == kData) {
    take(count());
    return;
  }
  // Other values are small or nested: read them whole, which also checks them.
  --position_;
  valueAtDepth(1);
}

Value ValueReader::valueAtDepth(int depth) {
  if (depth > kMaxDepth) corrupt("nested too deeply");
  switch (byte()) {
    case kString:
      return Value(string());
    case kInteger:
      return Value::integer(signedVarint());
    case kReal: {
      auto bytes = take(8);
      std::uint64_t bits = 0;
      for (int i = 0; i < 8; ++i) bits |= static_cast<std::uint64_t>(bytes[i]) << (8 * i);
      return Value::real(std::bit_cast<double>(bits));
    }
    case kFalse:
      return Value::boolean(false);
    case kTrue:
      return Value::boolean(true);
    case kDate: {
      std::chrono::sys_seconds instant{std::chrono::seconds(signedVarint())};
      std::uint64_t nanoseconds = varint();
      if (nanoseconds >= 1000000000) corrupt("nanoseconds out of range");
      std::optional<TimeZone> zone;
      switch (byte()) {
        case kZoneNamed: {
          std::string name = string();
          zone = TimeZone::named(name);
          if (!zone) corrupt("unknown time zone " + name);
          break;
        }
        case kZoneLocal:
          zone = TimeZone::local();
          break;
        case kZoneUnnamed: {
          std::uint8_t flags = byte();
          auto standard = static_cast<std::int32_t>(signedVarint());
          std::optional<std::int32_t> daylight;
          if (flags & kHasDaylight) daylight = static_cast<std::int32_t>(signedVarint());
          std::string rule;
          if (flags & kHasRule) rule = string();
          zone = TimeZone::unnamed(standard, daylight, rule);
          if (!zone) corrupt("bad daylight rule");
          break;
        }
        default:
          corrupt("unknown zone kind");
      }
      return Value(CalendarDate(instant, *zone, static_cast<std::uint32_t>(nanoseconds)));
    }
    case kUrl:
      return Value(Url{string()});
    case kData: {
      auto bytes = take(count());
      return Value(Data(bytes.begin(), bytes.end()));
    }
    case kArray: {
      std::size_t n = count();
      Array array;
      array.reserve(n);
      for (std::size_t i = 0; i < n; ++i) array.push_back(valueAtDepth(depth + 1));
      return Value(std::move(array));
    }
    case kDictionary:
      return Value(dictionary(depth));
    default:
      corrupt("unknown value kind");
  }
}

std::vector<std::uint8_t> encodeRecord(const Dictionary& record) {
  std::vector<std::uint8_t> out;
  out.reserve(64);
  ValueWriter(out).record(record);
  return out;
}

Dictionary decodeRecord(std::span<const std::uint8_t> bytes) {
  ValueReader reader(bytes);
  Dictionary record = reader.record();
  if (!reader.atEnd()) corrupt("trailing bytes");
  return record;
}

Dictionary decodeRecordWithout(std::span<const std::uint8_t> bytes,
                               const std::vector<std::string>& omitted) {
  ValueReader reader(bytes);
  Dictionary record = reader.recordWithout([&](std::string_view key) {
    for (const std::string& name : omitted) {
      if (name == key) return true;
    }
    return false;
  });
  if (!reader.atEnd()) corrupt("trailing bytes");
  return record;
}

std::optional<Value> decodeRecordAttribute(std::span<const std::uint8_t> bytes,
                                           std::string_view attribute) {
  ValueReader reader(bytes);
  Dictionary record = reader.recordWithout([&](std::string_view key) { return key != attribute; });
  if (!reader.atEnd()) corrupt("trailing bytes");
  Value* value = record.find(attribute);
  if (!value) return std::nullopt;
  return std::move(*value);
}

std::vector<std::uint8_t> encodeValue(const Value& value) {
  std::vector<std::uint8_t> out;
  ValueWriter(out).value(value);
  return out;
}

Value decodeValue(std::span<const std::uint8_t> bytes) {
  ValueReader reader(bytes);
  Value value = reader.value();
  if (!reader.atEnd()) corrupt("trailing bytes");
  return value;
}

}  // namespace tessel::detail
