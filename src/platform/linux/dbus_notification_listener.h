#pragma once

#include <chrono>
#include <deque>
#include <optional>

#include "platform/notification_listener.h"

struct sd_bus;
struct sd_bus_slot;

namespace zt::platform {

// The notification listener on the session bus: the signal org.tessel.Notifications.Posted.
class DBusNotificationListener final : public NotificationListener {
 public:
  // Nothing without a session bus.
  static std::unique_ptr<DBusNotificationListener> connect();

  ~DBusNotificationListener() override;
  DBusNotificationListener(const DBusNotificationListener&) = delete;
  DBusNotificationListener& operator=(const DBusNotificationListener&) = delete;

  std::optional<Notification> next(std::chrono::milliseconds timeout) override;

 private:
  explicit DBusNotificationListener(sd_bus* bus) : bus_(bus) {}
  friend struct ListenerCallbacks;

  sd_bus* bus_;
  sd_bus_slot* slot_ = nullptr;
  std::deque<Notification> received_;
};

}  // namespace zt::platform
