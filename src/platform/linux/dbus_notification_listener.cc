#include "platform/linux/dbus_notification_listener.h"

#include <systemd/sd-bus.h>

#include <cstdint>

#include "platform/linux/dbus_payload.h"

namespace zt::platform {

// The signal handler; a friend so that the header needs no sd-bus types.
struct ListenerCallbacks {
  static int onPosted(sd_bus_message* message, void* listener, sd_bus_error*) {
    // A signal of the right name but another shape is somebody else's mistake: skipped.
    if (auto notification = dbus::readNotification(message))
      static_cast<DBusNotificationListener*>(listener)->received_.push_back(
          std::move(*notification));
    return 0;
  }
};

std::unique_ptr<NotificationListener> NotificationListener::connectToSessionBus() {
  return DBusNotificationListener::connect();
}

std::unique_ptr<DBusNotificationListener> DBusNotificationListener::connect() {
  sd_bus* bus = nullptr;
  if (sd_bus_open_user(&bus) < 0) return nullptr;
  std::unique_ptr<DBusNotificationListener> listener(new DBusNotificationListener(bus));
  // The synchronous form waits for the bus to confirm the match.
  if (sd_bus_match_signal(bus, &listener->slot_, nullptr, dbus::kNotificationsPath,
                          dbus::kNotificationsInterface, dbus::kPostedMember,
                          &ListenerCallbacks::onPosted, listener.get()) < 0)
    return nullptr;
  return listener;
}

DBusNotificationListener::~DBusNotificationListener() {
  sd_bus_slot_unref(slot_);
  sd_bus_flush_close_unref(bus_);
}

std::optional<Notification> DBusNotificationListener::next(std::chrono::milliseconds timeout) {
  using Clock = std::chrono::steady_clock;
  const auto deadline = Clock::now() + timeout;
  while (received_.empty()) {
    const int processed = sd_bus_process(bus_, nullptr);
    if (processed < 0) break;
    if (processed > 0) continue;
    const auto remaining = deadline - Clock::now();
    if (remaining <= Clock::duration::zero()) break;
    const auto micros = std::chrono::ceil<std::chrono::microseconds>(remaining).count();
    if (sd_bus_wait(bus_, static_cast<std::uint64_t>(micros)) < 0) break;
  }
  if (received_.empty()) return std::nullopt;
  Notification first = std::move(received_.front());
  received_.pop_front();
  return first;
}

}  // namespace zt::platform
