#pragma once

#include <chrono>
#include <memory>
#include <optional>

#include "platform/notification_center.h"

namespace zt::platform {

// Receives the notifications that any process posts system-wide, in the order they are
// delivered. For tests and for commands that follow a running sync.
class NotificationListener {
 public:
  // Connects to the session bus and subscribes. The subscription is in place when this
  // returns, so every notification posted afterwards is received. Nothing without a bus.
  static std::unique_ptr<NotificationListener> connectToSessionBus();

  virtual ~NotificationListener() = default;

  // The next notification, waiting up to `timeout` for one to arrive; nothing when none came
  // in time or the connection was lost.
  virtual std::optional<Notification> next(std::chrono::milliseconds timeout) = 0;
};

}  // namespace zt::platform
