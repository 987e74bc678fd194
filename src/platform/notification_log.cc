#include "platform/notification_log.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <nlohmann/json.hpp>

namespace zt::platform {
namespace {

using Json = nlohmann::ordered_json;

Json toJson(const Value& value);

Json toJson(const Dictionary& dictionary) {
  Json object = Json::object();
  for (const auto& [key, value] : dictionary) object[key] = toJson(value);
  return object;
}

Json toJson(const Value& value) {
  switch (value.kind()) {
    case Value::Kind::String:
      return *value.asString();
    case Value::Kind::Number: {
      const Number& number = *value.asNumber();
      switch (number.kind()) {
        case Number::Kind::Integer:
          return number.int64Value();
        case Number::Kind::Boolean:
          return number.boolValue();
        case Number::Kind::Real:
          return number.doubleValue();
      }
      return nullptr;
    }
    case Value::Kind::Array: {
      Json array = Json::array();
      for (const Value& element : *value.asArray()) array.push_back(toJson(element));
      return array;
    }
    case Value::Kind::Dictionary:
      return toJson(*value.asDictionary());
    case Value::Kind::Date:
    case Value::Kind::Url:
    case Value::Kind::Data:
      return value.description();
  }
  return nullptr;
}

}  // namespace

std::optional<NotificationLog> NotificationLog::fromEnvironment() {
  const char* path = std::getenv("TESSEL_NOTIFICATIONS_LOG");
  if (path == nullptr || *path == '\0') return std::nullopt;
  return NotificationLog(path);
}

std::string NotificationLog::jsonLine(std::string_view name, std::string_view sender,
                                      const Dictionary& userInfo) {
  Json line = Json::object();
  line["name"] = std::string(name);
  line["object"] = std::string(sender);
  line["userInfo"] = toJson(userInfo);
  // A payload is never refused for a stray byte that is not UTF-8.
  return line.dump(-1, ' ', false, Json::error_handler_t::replace);
}

void NotificationLog::append(std::string_view name, std::string_view sender,
                             const Dictionary& userInfo) const {
  const std::string line = jsonLine(name, sender, userInfo) + "\n";
  const int fd = ::open(path_.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644);
  if (fd < 0) return;
  // A second write could land after another process's line; a line is small enough that
  // the kernel writes it whole, so only an interrupted write is tried again.
  ssize_t written;
  do {
    written = ::write(fd, line.data(), line.size());
  } while (written < 0 && errno == EINTR);
  ::close(fd);
}

}  // namespace zt::platform
