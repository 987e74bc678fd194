#include "tessel/record_json.h"

#include <array>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <limits>
#include <nlohmann/json.hpp>
#include <unordered_map>
#include <unordered_set>
#include <utility>

#include "platform/base64.h"
#include "platform/calendar_day.h"
#include "tessel/schema.h"

namespace tessel {

using zt::platform::Array;
using zt::platform::CalendarDate;
using zt::platform::Data;
using zt::platform::Dictionary;
using zt::platform::Number;
using zt::platform::TimeZone;
using zt::platform::Url;
using zt::platform::Value;
using Json = nlohmann::ordered_json;

namespace {

// Deeper input is refused before the recursive conversion could exhaust the stack.
constexpr std::size_t kMaxDepth = 256;
// No zone is a day or more away from GMT; a larger number is a mistake (milliseconds for
// seconds, say) that would otherwise be stored as a zone.
constexpr std::int64_t kMaxZoneOffset = 24 * 3600;

// ----- paths: where in the text a fault sits ------------------------------------------------

// A path is built on the stack while descending, so nothing is allocated unless a fault is
// reported.
struct Path {
  const Path* parent = nullptr;
  std::string_view key;
  std::optional<std::size_t> index;

  Path child(std::string_view k) const { return Path{this, k, std::nullopt}; }
  Path element(std::size_t i) const { return Path{this, {}, i}; }
};

bool isPlainKey(std::string_view key) {
  if (key.empty()) return false;
  for (char c : key) {
    const bool plain = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
                       c == '_' || c == '$';
    if (!plain) return false;
  }
  return true;
}

std::string jsonQuoted(std::string_view text) {
  return Json(std::string(text)).dump(-1, ' ', false, Json::error_handler_t::replace);
}

void appendPath(std::string& out, const Path* path) {
  if (path == nullptr) return;
  appendPath(out, path->parent);
  if (path->index) {
    out += '[' + std::to_string(*path->index) + ']';
  } else if (!path->key.empty() || path->parent != nullptr) {
    if (!out.empty()) out += '.';
    out += isPlainKey(path->key) ? std::string(path->key) : jsonQuoted(path->key);
  }
}

std::string pathText(const Path& path) {
  std::string out;
  appendPath(out, &path);
  return out;
}

// Thrown inside this file and turned into a RecordJsonError with the line once known.
[[noreturn]] void fail(const Path& path, std::string reason) {
  throw RecordJsonError(std::nullopt, pathText(path), std::move(reason));
}

std::string_view jsonKindName(const Json& json) {
  switch (json.type()) {
    case Json::value_t::null:
      return "null";
    case Json::value_t::object:
      return "an object";
    case Json::value_t::array:
      return "an array";
    case Json::value_t::string:
      return "a string";
    case Json::value_t::boolean:
      return "a boolean";
    case Json::value_t::number_integer:
    case Json::value_t::number_unsigned:
      return "an integer";
    case Json::value_t::number_float:
      return "a real number";
    default:
      return "an unsupported JSON value";
  }
}

// ----- base64 (RFC 4648, standard alphabet, padded; both ways the platform's) -------------

// Only the canonical text is accepted (padding present, unused bits zero), so that a byte
// string has exactly one written form and a damaged text is noticed rather than guessed at.
std::optional<Data> decodeBase64(std::string_view text, std::string& why) {
  using zt::platform::base64::DecodeFault;
  DecodeFault fault{};
  std::optional<Data> out =
      zt::platform::base64::decode(text, zt::platform::base64::Form::Canonical, &fault);
  if (out) return out;
  switch (fault.kind) {
    case DecodeFault::Kind::Length:
      why = "base64 text length " + std::to_string(text.size()) + " is not a multiple of 4";
      break;
    case DecodeFault::Kind::Character:
      why = "invalid base64 character " + jsonQuoted(text.substr(fault.offset, 1)) + " at offset " +
            std::to_string(fault.offset);
      break;
    case DecodeFault::Kind::StrayBits:
    case DecodeFault::Kind::Padding:
      why = "base64 text has stray bits before its padding";
      break;
  }
  return std::nullopt;
}

// ----- dates -------------------------------------------------------------------------------

struct WallClock {
  CalendarDate::Fields fields;
  std::uint32_t nanoseconds = 0;
};

// "YYYY-MM-DDTHH:MM[:SS[.fraction]]"; the year may have more than four digits and a sign, so
// that every date the store can hold has a written form.
std::optional<WallClock> parseWallClock(std::string_view text, std::string& why) {
  std::size_t pos = 0;
  auto digits = [&](std::size_t minCount, std::size_t maxCount, std::int64_t& out) -> bool {
    std::size_t start = pos;
    out = 0;
    while (pos < text.size() && pos - start < maxCount && text[pos] >= '0' && text[pos] <= '9') {
      out = out * 10 + (text[pos] - '0');
      ++pos;
    }
    return pos - start >= minCount;
  };
  auto expect = [&](char c) {
    if (pos < text.size() && text[pos] == c) {
      ++pos;
      return true;
    }
    return false;
  };
  why = "date " + jsonQuoted(text) + " is not of the form YYYY-MM-DDTHH:MM[:SS[.fraction]]";

  const bool negative = expect('-');
  std::int64_t year = 0, month = 0, day = 0, hour = 0, minute = 0, second = 0;
  // Nine digits of year keep the arithmetic far from overflow and cover every 64-bit instant
  // anyone writes down.
  if (!digits(4, 9, year) || !expect('-') || !digits(2, 2, month) || !expect('-') ||
      !digits(2, 2, day) || !expect('T') || !digits(2, 2, hour) || !expect(':') ||
      !digits(2, 2, minute)) {
    return std::nullopt;
  }
  std::uint32_t nanoseconds = 0;
  if (expect(':')) {
    if (!digits(2, 2, second)) return std::nullopt;
    if (expect('.')) {
      std::int64_t fraction = 0;
      const std::size_t start = pos;
      if (!digits(1, 9, fraction)) return std::nullopt;
      for (std::size_t n = pos - start; n < 9; ++n) fraction *= 10;
      nanoseconds = static_cast<std::uint32_t>(fraction);
      if (pos < text.size() && text[pos] >= '0' && text[pos] <= '9') {
        why = "date " + jsonQuoted(text) + " has more than nine fractional digits";
        return std::nullopt;
      }
    }
  }
  if (pos != text.size()) return std::nullopt;
  if (negative) year = -year;

  if (month < 1 || month > 12) {
    why = "date " + jsonQuoted(text) + " has month " + std::to_string(month);
  } else if (!zt::platform::isCalendarDay(year, month, day)) {
    why = "date " + jsonQuoted(text) + " has day " + std::to_string(day) + ", not in that month";
  } else if (hour > 23) {
    why = "date " + jsonQuoted(text) + " has hour " + std::to_string(hour);
  } else if (minute > 59) {
    why = "date " + jsonQuoted(text) + " has minute " + std::to_string(minute);
  } else if (second > 59) {
    why = "date " + jsonQuoted(text) + " has second " + std::to_string(second);
  } else {
    WallClock clock;
    clock.fields = {static_cast<int>(year), static_cast<int>(month),  static_cast<int>(day),
                    static_cast<int>(hour), static_cast<int>(minute), static_cast<int>(second)};
    clock.nanoseconds = nanoseconds;
    return clock;
  }
  return std::nullopt;
}

std::string formatWallClock(const CalendarDate& date) {
  const CalendarDate::Fields f = date.fields();
  std::string year = std::to_string(f.year < 0 ? -static_cast<std::int64_t>(f.year) : f.year);
  if (year.size() < 4) year.insert(0, 4 - year.size(), '0');
  if (f.year < 0) year.insert(0, 1, '-');

  std::array<char, 32> buffer{};
  std::snprintf(buffer.data(), buffer.size(), "-%02d-%02dT%02d:%02d:%02d", f.month, f.day, f.hour,
                f.minute, f.second);
  std::string out = year + buffer.data();
  if (date.nanoseconds() != 0) {
    std::snprintf(buffer.data(), buffer.size(), ".%09u", static_cast<unsigned>(date.nanoseconds()));
    std::string fraction = buffer.data();
    while (fraction.back() == '0') fraction.pop_back();
    out += fraction;
  }
  return out;
}

// ----- writing -----------------------------------------------------------------------------

Json zoneToJson(const TimeZone& zone) {
  switch (zone.kind()) {
    case TimeZone::Kind::Local:
      return "local";
    case TimeZone::Kind::Named:
      return zone.name().value_or("UTC");
    case TimeZone::Kind::Unnamed:
      break;
  }
  Json out = Json::object();
  out["std"] = zone.standardOffset().value_or(0);
  if (auto dst = zone.daylightOffset()) out["dst"] = *dst;
  if (auto rule = zone.daylightRule(); rule && !rule->empty()) out["rule"] = *rule;
  return out;
}

Json toJson(const Value& value, const Path& path);

Json dictionaryToJson(const Dictionary& dictionary, const Path& path) {
  Json out = Json::object();
  for (const auto& [key, item] : dictionary) {
    const Path here = path.child(key);
    if (!key.empty() && key.front() == '$') {
      fail(here,
           "a key starting with \"$\" cannot be written: it would read back as a typed value");
    }
    out[key] = toJson(item, here);
  }
  return out;
}

Json toJson(const Value& value, const Path& path) {
  switch (value.kind()) {
    case Value::Kind::String:
      return *value.asString();
    case Value::Kind::Number: {
      const Number& number = *value.asNumber();
      switch (number.kind()) {
        case Number::Kind::Boolean:
          return number.boolValue();
        case Number::Kind::Integer:
          return number.int64Value();
        case Number::Kind::Real:
          if (!std::isfinite(number.doubleValue())) {
            fail(path, "the real number " + number.description() + " has no JSON form");
          }
          return number.doubleValue();
      }
      break;
    }
    case Value::Kind::Date: {
      const CalendarDate& date = *value.asDate();
      Json out = Json::object();
      out["$date"] = formatWallClock(date);
      out["tz"] = zoneToJson(date.timeZone());
      return out;
    }
    case Value::Kind::Url:
      return Json::object({{"$url", value.asUrl()->text}});
    case Value::Kind::Data:
      return Json::object({{"$data", zt::platform::base64::encode(*value.asData())}});
    case Value::Kind::Array: {
      Json out = Json::array();
      std::size_t i = 0;
      for (const Value& item : *value.asArray()) out.push_back(toJson(item, path.element(i++)));
      return out;
    }
    case Value::Kind::Dictionary:
      return dictionaryToJson(*value.asDictionary(), path);
  }
  fail(path, "value of unknown kind");
}

std::string dump(const Json& json) {
  // Strings of records are UTF-8; should one not be, the listing still comes out.
  return json.dump(-1, ' ', false, Json::error_handler_t::replace);
}

// ----- reading -----------------------------------------------------------------------------

// nlohmann keeps the last of repeated keys silently; a typed form must not lose data, so the
// parse callback refuses repeats, and refuses nesting deep enough to threaten the stack.
class StrictParseGuard {
 public:
  bool operator()(int /*depth*/, nlohmann::detail::parse_event_t event, Json& parsed) {
    using Event = nlohmann::detail::parse_event_t;
    switch (event) {
      case Event::object_start:
      case Event::array_start:
        countElement();
        if (frames_.size() >= kMaxDepth) {
          throw RecordJsonError(std::nullopt, pathText(),
                                "nesting deeper than " + std::to_string(kMaxDepth) + " levels");
        }
        frames_.push_back(Frame{event == Event::object_start, {}, {}, 0});
        break;
      case Event::object_end:
      case Event::array_end:
        frames_.pop_back();
        break;
      case Event::key: {
        Frame& top = frames_.back();
        top.key = parsed.get<std::string>();
        if (!top.keys.insert(top.key).second) {
          throw RecordJsonError(std::nullopt, pathText(), "key given twice");
        }
        break;
      }
      case Event::value:
        countElement();
        break;
    }
    return true;
  }

 private:
  struct Frame {
    bool object;
    std::unordered_set<std::string> keys;
    std::string key;
    std::size_t count;
  };

  void countElement() {
    if (!frames_.empty() && !frames_.back().object) ++frames_.back().count;
  }

  std::string pathText() const {
    std::string out;
    for (const Frame& frame : frames_) {
      if (frame.object) {
        if (!out.empty()) out += '.';
        out += isPlainKey(frame.key) ? frame.key : jsonQuoted(frame.key);
      } else {
        out += '[' + std::to_string(frame.count == 0 ? 0 : frame.count - 1) + ']';
      }
    }
    return out;
  }

  std::vector<Frame> frames_;
};

Json parseJson(std::string_view text) {
  try {
    return Json::parse(text.begin(), text.end(), StrictParseGuard());
  } catch (const Json::parse_error& e) {
    // "[json.exception.parse_error.101] parse error at line 1, column 5: syntax error ..."
    std::string message = e.what();
    const std::size_t colon = message.find(": ");
    const std::string detail = colon == std::string::npos ? message : message.substr(colon + 2);
    throw RecordJsonError(std::nullopt, "",
                          "invalid JSON at byte " + std::to_string(e.byte) + ": " + detail);
  } catch (const Json::exception& e) {
    // Numbers too large for a double: "[json.exception.out_of_range.406] number overflow ..."
    std::string message = e.what();
    const std::size_t bracket = message.find("] ");
    throw RecordJsonError(
        std::nullopt, "",
        "invalid JSON: " + (bracket == std::string::npos ? message : message.substr(bracket + 2)));
  }
}

TimeZone zoneFromJson(const Json& json, const Path& path) {
  if (json.is_string()) {
    const std::string name = json.get<std::string>();
    if (name == "local") return TimeZone::local();
    if (name == "GMT") return TimeZone::gmt();
    if (name == "UTC") return TimeZone::utc();
    if (auto zone = TimeZone::named(name)) return *zone;
    fail(path, "unknown time zone " + jsonQuoted(name));
  }
  if (!json.is_object()) {
    fail(path, "a time zone is a name or {\"std\": ..., \"dst\": ..., \"rule\": ...}, not " +
                   std::string(jsonKindName(json)));
  }
  auto offset = [&](const char* key) -> std::optional<std::int32_t> {
    auto it = json.find(key);
    if (it == json.end()) return std::nullopt;
    const Path here = path.child(key);
    if (!it->is_number_integer()) {
      fail(here,
           "an offset is an integer number of seconds, not " + std::string(jsonKindName(*it)));
    }
    const bool inRange =
        it->is_number_unsigned()
            ? it->get<std::uint64_t>() < std::uint64_t{kMaxZoneOffset}
            : it->get<std::int64_t>() > -kMaxZoneOffset && it->get<std::int64_t>() < kMaxZoneOffset;
    if (!inRange) fail(here, "offset " + it->dump() + " is a day or more");
    return static_cast<std::int32_t>(it->get<std::int64_t>());
  };
  for (const auto& [key, item] : json.items()) {
    if (key != "std" && key != "dst" && key != "rule") {
      fail(path.child(key), "unexpected key in a time zone (std, dst and rule are known)");
    }
  }
  const std::optional<std::int32_t> standard = offset("std");
  if (!standard) fail(path, "an unnamed time zone needs its standard offset \"std\"");
  const std::optional<std::int32_t> daylight = offset("dst");
  std::string rule;
  if (auto it = json.find("rule"); it != json.end()) {
    if (!it->is_string()) fail(path.child("rule"), "a daylight rule is a string");
    rule = it->get<std::string>();
    if (!daylight) fail(path.child("rule"), "a daylight rule needs a daylight offset \"dst\"");
  }
  auto zone = TimeZone::unnamed(*standard, daylight, rule);
  if (!zone) fail(path.child("rule"), "daylight rule " + jsonQuoted(rule) + " cannot be read");
  return *zone;
}

Value valueFromJson(const Json& json, const Path& path);

Value typedValueFromJson(const Json& json, const Path& path) {
  auto onlyKeys = [&](std::initializer_list<std::string_view> allowed, std::string_view kind) {
    for (const auto& [key, item] : json.items()) {
      bool known = false;
      for (std::string_view a : allowed) known = known || key == a;
      if (!known) {
        fail(path.child(key), "unexpected key beside " + std::string(kind));
      }
    }
  };
  auto stringAt = [&](const char* key) -> std::string {
    const Json& item = json.at(key);
    if (!item.is_string()) {
      fail(path.child(key),
           std::string(key) + " holds a string, not " + std::string(jsonKindName(item)));
    }
    return item.get<std::string>();
  };

  if (json.contains("$url")) {
    onlyKeys({"$url"}, "$url");
    return Value(Url{stringAt("$url")});
  }
  if (json.contains("$data")) {
    onlyKeys({"$data"}, "$data");
    std::string why;
    auto data = decodeBase64(stringAt("$data"), why);
    if (!data) fail(path.child("$data"), why);
    return Value(std::move(*data));
  }
  if (json.contains("$date")) {
    onlyKeys({"$date", "tz"}, "$date");
    std::string why;
    auto clock = parseWallClock(stringAt("$date"), why);
    if (!clock) fail(path.child("$date"), why);
    if (!json.contains("tz")) fail(path, "a date needs its time zone \"tz\"");
    TimeZone zone = zoneFromJson(json.at("tz"), path.child("tz"));
    // A wall-clock time shown twice (autumn fold) reads as its earlier instant; the typed
    // form has no offset to say otherwise.
    const CalendarDate date = CalendarDate::fromFields(clock->fields, zone);
    return Value(CalendarDate(date.instant(), std::move(zone), clock->nanoseconds));
  }
  for (const auto& [key, item] : json.items()) {
    if (!key.empty() && key.front() == '$') {
      fail(path.child(key), "unknown typed value (known: $url, $data, $date)");
    }
  }
  fail(path, "not a typed value");
}

Dictionary dictionaryFromJson(const Json& json, const Path& path) {
  Dictionary out;
  out.reserve(json.size());
  for (const auto& [key, item] : json.items()) {
    out.set(key, valueFromJson(item, path.child(key)));
  }
  return out;
}

bool hasDollarKey(const Json& object) {
  for (const auto& [key, item] : object.items()) {
    if (!key.empty() && key.front() == '$') return true;
  }
  return false;
}

Value valueFromJson(const Json& json, const Path& path) {
  switch (json.type()) {
    case Json::value_t::string:
      return Value(json.get<std::string>());
    case Json::value_t::boolean:
      return Value::boolean(json.get<bool>());
    case Json::value_t::number_integer:
      return Value::integer(json.get<std::int64_t>());
    case Json::value_t::number_unsigned: {
      const std::uint64_t n = json.get<std::uint64_t>();
      if (n > static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())) {
        fail(path, "integer " + json.dump() + " does not fit in 64 signed bits");
      }
      return Value::integer(static_cast<std::int64_t>(n));
    }
    case Json::value_t::number_float: {
      const double d = json.get<double>();
      if (!std::isfinite(d)) fail(path, "number out of range");
      return Value::real(d);
    }
    case Json::value_t::array: {
      Array out;
      out.reserve(json.size());
      std::size_t i = 0;
      for (const Json& item : json) out.push_back(valueFromJson(item, path.element(i++)));
      return Value(std::move(out));
    }
    case Json::value_t::object:
      if (hasDollarKey(json)) return typedValueFromJson(json, path);
      return Value(dictionaryFromJson(json, path));
    case Json::value_t::null:
      fail(path, "null is not a value (leave the key out instead)");
    default:
      fail(path, "unsupported JSON value");
  }
}

Dictionary recordFromJson(const Json& json, const Path& path) {
  if (!json.is_object()) {
    fail(path, "a record is a JSON object, not " + std::string(jsonKindName(json)));
  }
  if (hasDollarKey(json)) {
    for (const auto& [key, item] : json.items()) {
      if (!key.empty() && key.front() == '$') {
        fail(path.child(key), "a record key cannot start with \"$\"");
      }
    }
  }
  return dictionaryFromJson(json, path);
}

// Faults found while parsing a line's JSON carry the path from the parse guard; faults found
// while converting carry it from the Path; this adds the line to either.
template <typename F>
auto onLine(std::size_t line, F&& f) -> decltype(f()) {
  try {
    return f();
  } catch (const RecordJsonError& e) {
    throw RecordJsonError(line, e.path(), e.reason());
  }
}

Record recordLineFromJson(const Json& json) {
  const Path root;
  if (!json.is_object()) {
    fail(root, "a line is an object {\"id\": ..., \"record\": {...}}, not " +
                   std::string(jsonKindName(json)));
  }
  for (const auto& [key, item] : json.items()) {
    if (key != "id" && key != "record") {
      fail(root.child(key), "unexpected key in a line (id and record are known)");
    }
  }
  auto id = json.find("id");
  if (id == json.end()) fail(root, "the line has no \"id\"");
  if (!id->is_string() || id->get<std::string>().empty()) {
    fail(root.child("id"), "an identifier is a non-empty string");
  }
  auto record = json.find("record");
  if (record == json.end()) fail(root, "the line has no \"record\"");
  const Path recordPath = root.child("record");
  Record out{id->get<std::string>(), recordFromJson(*record, recordPath)};
  const Value* entity = out.record.find(TesselRecordEntityNameKey);
  if (entity == nullptr) {
    fail(recordPath,
         "the record has no entity name under \"" + std::string(TesselRecordEntityNameKey) + "\"");
  }
  if (entity->asString() == nullptr || entity->asString()->empty()) {
    fail(recordPath.child(TesselRecordEntityNameKey), "an entity name is a non-empty string");
  }
  return out;
}

}  // namespace

RecordJsonError::RecordJsonError(std::optional<std::size_t> line, std::string path,
                                 std::string reason)
    : std::runtime_error([&] {
        std::string message;
        if (line) message += "line " + std::to_string(*line) + ": ";
        if (!path.empty()) message += path + ": ";
        return message + reason;
      }()),
      line_(line),
      path_(std::move(path)),
      reason_(std::move(reason)) {}

std::string valueToJson(const Value& value) {
  return dump(toJson(value, Path{}));
}

std::string recordToJson(const Dictionary& record) {
  return dump(dictionaryToJson(record, Path{}));
}

std::string recordToJsonLine(std::string_view id, const Dictionary& record) {
  const Path root;
  Json line = Json::object();
  line["id"] = std::string(id);
  line["record"] = dictionaryToJson(record, root.child("record"));
  return dump(line);
}

Value valueFromJson(std::string_view json) {
  return valueFromJson(parseJson(json), Path{});
}

Dictionary recordFromJson(std::string_view json) {
  return recordFromJson(parseJson(json), Path{});
}

std::vector<Record> parseRecordLines(std::string_view text) {
  std::vector<Record> out;
  std::unordered_map<std::string, std::size_t> lineOfId;
  std::size_t lineNumber = 0;
  while (!text.empty()) {
    ++lineNumber;
    const std::size_t end = text.find('\n');
    std::string_view line = text.substr(0, end);
    text = end == std::string_view::npos ? std::string_view{} : text.substr(end + 1);
    if (!line.empty() && line.back() == '\r') line.remove_suffix(1);
    if (line.find_first_not_of(" \t") == std::string_view::npos) continue;

    Record record = onLine(lineNumber, [&] { return recordLineFromJson(parseJson(line)); });
    auto [it, inserted] = lineOfId.emplace(record.id, lineNumber);
    if (!inserted) {
      throw RecordJsonError(lineNumber, "id",
                            "identifier " + jsonQuoted(record.id) + " was already given on line " +
                                std::to_string(it->second));
    }
    out.push_back(std::move(record));
  }
  return out;
}

}  // namespace tessel
