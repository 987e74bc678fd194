#include "platform/linux/dbus_notification_center.h"

#include <systemd/sd-bus.h>

#include "platform/linux/dbus_payload.h"

namespace zt::platform {

NotificationCenter& NotificationCenter::system() {
  static DbusNotificationCenter center;
  return center;
}

DbusNotificationCenter::DbusNotificationCenter() : log_(NotificationLog::fromEnvironment()) {}

DbusNotificationCenter::~DbusNotificationCenter() {
  dropConnection();
}

void DbusNotificationCenter::post(std::string_view name, std::string_view sender,
                                  const Dictionary& userInfo) {
  if (log_) log_->append(name, sender, userInfo);

  sd_bus* bus = connection();
  if (bus == nullptr) return;

  sd_bus_message* message = nullptr;
  int result = sd_bus_message_new_signal(bus, &message, dbus::kNotificationsPath,
                                         dbus::kNotificationsInterface, dbus::kPostedMember);
  if (result >= 0) result = dbus::appendNotification(message, name, sender, userInfo);
  // A payload that cannot be marshalled loses this notification only.
  if (result < 0) {
    sd_bus_message_unref(message);
    return;
  }
  result = sd_bus_send(bus, message, nullptr);
  sd_bus_message_unref(message);
  // The signal must leave the process now: the tool may exit right after its last post.
  if (result >= 0) result = sd_bus_flush(bus);
  if (result < 0) {
    dropConnection();
    return;
  }
  // Nothing is ever awaited from the bus; consuming what arrived (the Hello reply,
  // NameAcquired) keeps it from piling up in the socket.
  while (sd_bus_process(bus, nullptr) > 0) {
  }
}

sd_bus* DbusNotificationCenter::connection() {
  if (state_ == BusState::NotTried) {
    state_ = sd_bus_open_user(&bus_) >= 0 ? BusState::Connected : BusState::Unavailable;
    if (state_ == BusState::Unavailable) bus_ = nullptr;
  }
  return state_ == BusState::Connected ? bus_ : nullptr;
}

void DbusNotificationCenter::dropConnection() {
  if (bus_ != nullptr) sd_bus_flush_close_unref(bus_);
  bus_ = nullptr;
  if (state_ == BusState::Connected) state_ = BusState::Unavailable;
}

}  // namespace zt::platform
