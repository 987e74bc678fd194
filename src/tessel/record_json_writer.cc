#include <cmath>
#include <utility>

#include "platform/base64.h"
#include "tessel/record_json.h"
#include "tessel/record_json_path.h"
#include "tessel/record_json_values.h"

// Writing records as typed JSON.

namespace tessel {

using zt::platform::Dictionary;
using zt::platform::Number;
using zt::platform::Value;

namespace {

using typed_json::dateToJson;
using typed_json::fail;
using typed_json::Json;
using typed_json::Path;

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
    case Value::Kind::Date:
      return dateToJson(*value.asDate());
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

}  // namespace

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

}  // namespace tessel
