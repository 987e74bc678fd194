#include "platform/linux/dbus_desktop_notifier.h"

#include <systemd/sd-bus.h>

#include <cstdint>
#include <string_view>

namespace zt::platform {

namespace {

constexpr const char* kService = "org.freedesktop.Notifications";
constexpr const char* kPath = "/org/freedesktop/Notifications";
constexpr const char* kInterface = "org.freedesktop.Notifications";
// A service the bus has to start first may take a moment; one that hangs must not hold the
// sync's end for longer.
constexpr std::uint64_t kCallTimeoutMicroseconds = 10'000'000;
// The icon of the desktop's icon theme for a portable media player.
constexpr const char* kIcon = "multimedia-player";

std::string escapedMarkup(std::string_view text) {
  std::string escaped;
  for (char c : text) {
    switch (c) {
      case '&':
        escaped += "&amp;";
        break;
      case '<':
        escaped += "&lt;";
        break;
      case '>':
        escaped += "&gt;";
        break;
      default:
        escaped += c;
    }
  }
  return escaped;
}

// One method call of the service; the reply, or why there is none.
Result<sd_bus_message*> call(sd_bus* bus, sd_bus_message* message) {
  // All zeros, which is what SD_BUS_ERROR_NULL, a C compound literal, makes.
  sd_bus_error error{};
  sd_bus_message* reply = nullptr;
  const int result = sd_bus_call(bus, message, kCallTimeoutMicroseconds, &error, &reply);
  if (result >= 0) return reply;
  std::string why = error.message != nullptr ? error.message : "the call failed";
  sd_bus_error_free(&error);
  return Error{"no desktop notification: " + why};
}

}  // namespace

std::unique_ptr<DesktopNotifier> DesktopNotifier::connectToSessionBus(std::string applicationName) {
  return DBusDesktopNotifier::connect(std::move(applicationName));
}

std::unique_ptr<DBusDesktopNotifier> DBusDesktopNotifier::connect(std::string applicationName) {
  sd_bus* bus = nullptr;
  if (sd_bus_open_user(&bus) < 0) return nullptr;
  return std::unique_ptr<DBusDesktopNotifier>(
      new DBusDesktopNotifier(bus, std::move(applicationName)));
}

DBusDesktopNotifier::~DBusDesktopNotifier() {
  sd_bus_flush_close_unref(bus_);
}

bool DBusDesktopNotifier::serviceReadsMarkup() {
  sd_bus_message* message = nullptr;
  if (sd_bus_message_new_method_call(bus_, &message, kService, kPath, kInterface,
                                     "GetCapabilities") < 0) {
    return false;
  }
  Result<sd_bus_message*> reply = call(bus_, message);
  sd_bus_message_unref(message);
  if (!reply) return false;
  bool markup = false;
  if (sd_bus_message_enter_container(*reply, 'a', "s") > 0) {
    const char* capability = nullptr;
    while (sd_bus_message_read(*reply, "s", &capability) > 0) {
      if (std::string_view(capability) == "body-markup") markup = true;
    }
  }
  sd_bus_message_unref(*reply);
  return markup;
}

Result<void> DBusDesktopNotifier::show(const DesktopNotice& notice) {
  // Markup is not ours to send: a "<" or "&" in a name would make the service drop the body.
  const std::string body = serviceReadsMarkup() ? escapedMarkup(notice.body) : notice.body;
  sd_bus_message* message = nullptr;
  int result =
      sd_bus_message_new_method_call(bus_, &message, kService, kPath, kInterface, "Notify");
  // app_name, replaces_id, app_icon, summary, body, actions, hints, expire_timeout (the
  // service's own).
  if (result >= 0) {
    result =
        sd_bus_message_append(message, "susssasa{sv}i", applicationName_.c_str(), std::uint32_t{0},
                              kIcon, notice.summary.c_str(), body.c_str(), 0, 1, "urgency", "y",
                              static_cast<std::uint8_t>(notice.urgency), std::int32_t{-1});
  }
  if (result < 0) {
    sd_bus_message_unref(message);
    return Error{"no desktop notification: the notice cannot be sent"};
  }
  Result<sd_bus_message*> reply = call(bus_, message);
  sd_bus_message_unref(message);
  if (!reply) return Error{reply.error()};
  sd_bus_message_unref(*reply);
  return {};
}

}  // namespace zt::platform
