#pragma once

#include <chrono>
#include <deque>
#include <memory>
#include <optional>

#include "platform/notification_center.h"

struct sd_bus;
struct sd_bus_slot;

namespace zt::platform {

// Receives the notifications that any process posts on the session bus (the signal
// org.tessel.Notifications.Posted), in the order the bus delivers them. For tests and for
// commands that follow a running sync.
class NotificationListener {
 public:
  // Connects to the session bus and subscribes. The subscription is in place when this
  // returns, so every notification posted afterwards is received. Nothing without a bus.
  static std::unique_ptr<NotificationListener> connectToSessionBus();

  ~NotificationListener();
  NotificationListener(const NotificationListener&) = delete;
  NotificationListener& operator=(const NotificationListener&) = delete;

  // The next notification, waiting up to `timeout` for one to arrive; nothing when none came
  // in time or the connection was lost.
  std::optional<Notification> next(std::chrono::milliseconds timeout);

  // Readable when bus traffic is waiting, for callers that poll(2) several sources; call
  // next() with a zero timeout then. Notifications may also be buffered already, so next()
  // should be drained before polling again.
  int fileDescriptor() const;

 private:
  explicit NotificationListener(sd_bus* bus) : bus_(bus) {}
  friend struct ListenerCallbacks;

  sd_bus* bus_;
  sd_bus_slot* slot_ = nullptr;
  std::deque<Notification> received_;
};

}  // namespace zt::platform
