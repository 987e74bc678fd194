#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <functional>
#include <limits>
#include <unordered_set>
#include <utility>

#include "tessel/record_json.h"
#include "tessel/record_json_path.h"
#include "tessel/record_json_scanner.h"
#include "tessel/record_json_values.h"
#include "tessel/schema.h"

// Reading records from typed JSON, strictly: anything but exactly the typed form is a
// RecordJsonError that names the line and path of the fault.

namespace tessel {

using zt::platform::Array;
using zt::platform::Dictionary;
using zt::platform::Value;

namespace {

using typed_json::fail;
using typed_json::isPlainKey;
using typed_json::Json;
using typed_json::jsonKindName;
using typed_json::jsonQuoted;
using typed_json::Path;
using typed_json::typedValueFromJson;

// Deeper input is refused before the recursive conversion could exhaust the stack.
constexpr std::size_t kMaxDepth = 256;

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

Value valueFromJson(const Json& json, const Path& path);

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

Value valueFromJson(std::string_view json) {
  return valueFromJson(parseJson(json), Path{});
}

Dictionary recordFromJson(std::string_view json) {
  return recordFromJson(parseJson(json), Path{});
}

std::vector<Record> parseRecordLines(std::string_view text) {
  std::vector<Record> out;
  // Room for every line, but no more than a text of short lines can hold: a text of nothing
  // but line ends must not reserve a record per byte.
  std::size_t lines = 1;
  for (const char *at = text.data(), *end = at + text.size();
       (at = static_cast<const char*>(std::memchr(at, '\n', static_cast<std::size_t>(end - at))));
       ++at) {
    ++lines;
  }
  out.reserve(std::min(lines, text.size() / 32 + 1));
  // The records read so far by identifier, as indexes into `out`, which may still move.
  std::vector<std::size_t> lineOf;
  lineOf.reserve(out.capacity());
  const auto idHash = [&out](std::size_t i) { return std::hash<std::string_view>{}(out[i].id); };
  const auto sameId = [&out](std::size_t a, std::size_t b) { return out[a].id == out[b].id; };
  std::unordered_set<std::size_t, decltype(idHash), decltype(sameId)> seen(out.capacity(), idHash,
                                                                           sameId);
  typed_json::RecordLineScanner scanner;
  std::size_t lineNumber = 0;
  while (!text.empty()) {
    ++lineNumber;
    const std::size_t end = text.find('\n');
    std::string_view line = text.substr(0, end);
    text = end == std::string_view::npos ? std::string_view{} : text.substr(end + 1);
    if (!line.empty() && line.back() == '\r') line.remove_suffix(1);
    if (line.find_first_not_of(" \t") == std::string_view::npos) continue;

    std::optional<Record> scanned = scanner.scan(line);
    out.push_back(scanned ? std::move(*scanned) : onLine(lineNumber, [&] {
      return recordLineFromJson(parseJson(line));
    }));
    lineOf.push_back(lineNumber);
    auto [it, inserted] = seen.insert(out.size() - 1);
    if (!inserted) {
      throw RecordJsonError(lineNumber, "id",
                            "identifier " + jsonQuoted(out.back().id) +
                                " was already given on line " + std::to_string(lineOf[*it]));
    }
  }
  return out;
}

}  // namespace tessel
