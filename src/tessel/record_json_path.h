#pragma once

// What the reading and the writing of the typed JSON form share: the JSON type, and the path
// of keys and indexes that a fault names.

#include <cstddef>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <string_view>

namespace tessel::typed_json {

using Json = nlohmann::ordered_json;

// Where in the text a value sits. A path is built on the stack while descending, so nothing
// is allocated unless a fault is reported.
struct Path {
  const Path* parent = nullptr;
  std::string_view key;
  std::optional<std::size_t> index;

  Path child(std::string_view k) const { return Path{this, k, std::nullopt}; }
  Path element(std::size_t i) const { return Path{this, {}, i}; }
};

// `record."start date".tz`: keys that are not plain words are quoted.
std::string pathText(const Path& path);
bool isPlainKey(std::string_view key);
// The text as a JSON string, quotes included; bytes that are not UTF-8 become U+FFFD.
std::string jsonQuoted(std::string_view text);
// "an object", "a string"...: what a fault says was found instead.
std::string_view jsonKindName(const Json& json);

// Raises a RecordJsonError at `path`, without a line; the reader adds the line once known.
[[noreturn]] void fail(const Path& path, std::string reason);

}  // namespace tessel::typed_json
