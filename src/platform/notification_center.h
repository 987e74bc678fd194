#pragma once

#include <string>
#include <string_view>

#include "platform/value.h"

namespace zt::platform {

// The system-wide notification centre: a named notification with a sender string and a
// key/value payload, broadcast to every interested process. Posting never waits for
// receivers and has no failure path: a notification nobody can receive is simply lost.
class NotificationCenter {
 public:
  virtual ~NotificationCenter() = default;

  virtual void post(std::string_view name, std::string_view sender, const Dictionary& userInfo) = 0;

  // The process's centre on this machine, created at the first call.
  static NotificationCenter& system();
};

// One notification as a receiver sees it.
struct Notification {
  std::string name;
  std::string sender;
  Dictionary userInfo;

  bool operator==(const Notification&) const = default;
};

}  // namespace zt::platform
