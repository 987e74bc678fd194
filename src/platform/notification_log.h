#pragma once

#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

#include "platform/value.h"

namespace zt::platform {

// A file that receives every posted notification as one JSON line
// {"name": ..., "object": ..., "userInfo": {...}}, so that scripts and tests can follow a
// run without a message bus.
class NotificationLog {
 public:
  explicit NotificationLog(std::filesystem::path path) : path_(std::move(path)) {}

  // The log named by $TESSEL_NOTIFICATIONS_LOG; nothing when it is unset or empty.
  static std::optional<NotificationLog> fromEnvironment();

  // The line for one notification, without its line end. Keys keep their order, integers and
  // booleans stay JSON integers and booleans, reals are written as JSON reals (NaN as null),
  // dates, URLs and data as their description text.
  static std::string jsonLine(std::string_view name, std::string_view sender,
                              const Dictionary& userInfo);

  // Appends the line. Each line is one write(2) on a descriptor opened with O_APPEND, so
  // lines of processes that share the file never interleave. Failures are ignored.
  void append(std::string_view name, std::string_view sender, const Dictionary& userInfo) const;

  const std::filesystem::path& path() const { return path_; }

 private:
  std::filesystem::path path_;
};

}  // namespace zt::platform
