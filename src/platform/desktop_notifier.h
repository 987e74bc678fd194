#pragma once

#include <memory>
#include <string>

#include "platform/result.h"

namespace zt::platform {

// How insistently the desktop shows a notice; the values are those of the desktop's
// notification service.
enum class NoticeUrgency { Low = 0, Normal = 1, Critical = 2 };

// A notice for the person at the desktop: one line of summary and a body of plain text.
struct DesktopNotice {
  std::string summary;
  std::string body;
  NoticeUrgency urgency = NoticeUrgency::Normal;
};

// The desktop session's notification service (the pop-ups of the desktop), which a person sees
// even when no terminal is open, as when a sync starts because a player was plugged in.
class DesktopNotifier {
 public:
  // The service on this user's session bus, showing notices as from `applicationName`; nothing
  // without a session bus. Whether a service answers there is known only when a notice is shown.
  static std::unique_ptr<DesktopNotifier> connectToSessionBus(std::string applicationName);

  virtual ~DesktopNotifier() = default;

  // Shows the notice; the error says why it could not (no notification service, no answer).
  virtual Result<void> show(const DesktopNotice& notice) = 0;
};

}  // namespace zt::platform
