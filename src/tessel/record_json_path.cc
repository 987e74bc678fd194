#include "tessel/record_json_path.h"

#include <utility>

#include "tessel/record_json.h"

namespace tessel::typed_json {

namespace {

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

}  // namespace

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

std::string pathText(const Path& path) {
  std::string out;
  appendPath(out, &path);
  return out;
}

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

}  // namespace tessel::typed_json
