#pragma once

#include <systemd/sd-bus.h>

#include <optional>
#include <string_view>

#include "platform/notification_center.h"
#include "platform/value.h"

// How a notification travels on the session bus: the signal's address and the mapping
// between the tool's values and D-Bus types. Shared by the sender and the listener.
namespace zt::platform::dbus {

inline constexpr const char* kNotificationsPath = "/org/tessel/Notifications";
inline constexpr const char* kNotificationsInterface = "org.tessel.Notifications";
inline constexpr const char* kPostedMember = "Posted";

// Appends (name s, sender s, payload a{sv}). Values map to: string s; integer i, or x when it
// does not fit in 32 bits; boolean b; real d; array of strings (also empty) as, other arrays
// av; dictionary a{sv}; data ay; date and URL s (their description text). Answers a negative
// errno-style code on failure (a string that is not UTF-8, for example).
int appendNotification(sd_bus_message* message, std::string_view name, std::string_view sender,
                       const Dictionary& userInfo);

// Reads the arguments of a Posted signal. Any basic D-Bus type is accepted: integer types
// give integers, b booleans, d reals, s/o/g strings, ay data, a{s?} dictionaries, other
// arrays and structures arrays. Nothing when the message has another shape.
std::optional<Notification> readNotification(sd_bus_message* message);

}  // namespace zt::platform::dbus
