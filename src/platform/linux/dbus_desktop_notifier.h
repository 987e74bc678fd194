#pragma once

#include <memory>
#include <string>
#include <utility>

#include "platform/desktop_notifier.h"

struct sd_bus;

namespace zt::platform {

// The org.freedesktop.Notifications service of the session bus: a Notify call per notice. A
// service that is not running yet may be started by the bus for the call.
class DBusDesktopNotifier final : public DesktopNotifier {
 public:
  // Nothing without a session bus.
  static std::unique_ptr<DBusDesktopNotifier> connect(std::string applicationName);

  ~DBusDesktopNotifier() override;
  DBusDesktopNotifier(const DBusDesktopNotifier&) = delete;
  DBusDesktopNotifier& operator=(const DBusDesktopNotifier&) = delete;

  Result<void> show(const DesktopNotice& notice) override;

 private:
  DBusDesktopNotifier(sd_bus* bus, std::string applicationName)
      : bus_(bus), applicationName_(std::move(applicationName)) {}

  // Whether the service reads the body as markup, where a "<" or "&" of a name must be escaped.
  bool serviceReadsMarkup();

  sd_bus* bus_;
  std::string applicationName_;
};

}  // namespace zt::platform
