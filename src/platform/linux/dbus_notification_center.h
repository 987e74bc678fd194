#pragma once

#include <optional>
#include <string_view>

#include "platform/notification_center.h"
#include "platform/notification_log.h"

struct sd_bus;

namespace zt::platform {

// Posts each notification as the D-Bus signal org.tessel.Notifications.Posted (name s,
// sender s, payload a{sv}) on /org/tessel/Notifications of the session bus, and appends it to
// the JSON-lines log named by $TESSEL_NOTIFICATIONS_LOG (read at construction) when set.
//
// The bus is connected at the first post, and only tried once: without a reachable session
// bus every later post skips the bus at no cost. A connection that breaks is dropped for good.
class DbusNotificationCenter final : public NotificationCenter {
 public:
  DbusNotificationCenter();
  ~DbusNotificationCenter() override;
  DbusNotificationCenter(const DbusNotificationCenter&) = delete;
  DbusNotificationCenter& operator=(const DbusNotificationCenter&) = delete;

  void post(std::string_view name, std::string_view sender, const Dictionary& userInfo) override;

 private:
  enum class BusState { NotTried, Connected, Unavailable };

  sd_bus* connection();
  void dropConnection();

  BusState state_ = BusState::NotTried;
  sd_bus* bus_ = nullptr;
  std::optional<NotificationLog> log_;
};

}  // namespace zt::platform
