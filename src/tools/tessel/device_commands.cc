#include "tools/tessel/device_commands.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <csignal>
#include <cstdio>
#include <filesystem>
#include <iomanip>
#include <map>
#include <ostream>
#include <sstream>
#include <vector>

#include "platform/device_library.h"
#include "platform/notification_listener.h"
#include "platform/sync_progress.h"
#include "platform/terminal.h"
#include "tessel/client.h"
#include "tessel/exception.h"

namespace tessel::cli {

namespace {

std::string hexIdentifier(std::uint64_t uniqueID) {
  return zt::platform::formatUniqueId(uniqueID);
}

volatile std::sig_atomic_t interrupted = 0;

void onInterrupt(int) {
  interrupted = 1;
}

struct Progress {
  std::string phase;
  double percent = 0;
  std::string dataClasses;
  std::optional<std::int64_t> status;
};

std::string phaseWord(const std::string& phase) {
  static const std::map<std::string, std::string, std::less<>> words = {
      {zt::platform::sync_progress::kConnectingPhase, "connecting"},
      {zt::platform::sync_progress::kMinglingPhase, "preparing"},
      {zt::platform::sync_progress::kUploadingPhase, "writing"},
      {zt::platform::sync_progress::kDisconnectingPhase, "done"},
  };
  auto it = words.find(phase);
  return it == words.end() ? phase : it->second;
}

std::string statusWord(std::int64_t status) {
  switch (status) {
    case 0:
      return "success";
    case 1:
      return "cancelled";
    case 2:
      return "failed";
    case 3:
      return "player unavailable";
    default:
      return "status " + std::to_string(status);
  }
}

std::string bar(const std::string& client, const Progress& progress) {
  constexpr int kWidth = 30;
  double percent = std::isfinite(progress.percent) ? progress.percent : 0;
  percent = std::clamp(percent, 0.0, 100.0);
  int filled = static_cast<int>(std::lround(percent / 100 * kWidth));
  std::ostringstream line;
  line << client << " [" << std::string(static_cast<std::size_t>(filled), '#')
       << std::string(static_cast<std::size_t>(kWidth - filled), '-') << "] " << std::fixed
       << std::setprecision(1) << std::setw(5) << percent << "% " << phaseWord(progress.phase);
  if (!progress.dataClasses.empty()) line << " (" << progress.dataClasses << ")";
  if (progress.status) line << ": " << statusWord(*progress.status);
  return line.str();
}

// Reads one notification's payload into the player's progress.
void update(Progress& progress, const zt::platform::Dictionary& info) {
  if (const auto* phase = info.find(zt::platform::sync_progress::kCurrentPhaseKey);
      phase && phase->asString()) {
    progress.phase = *phase->asString();
  }
  if (const auto* percent = info.find(zt::platform::sync_progress::kPercentKey);
      percent && percent->asNumber()) {
    progress.percent = percent->asNumber()->doubleValue();
  }
  if (const auto* classes = info.find(zt::platform::sync_progress::kDataClassSyncingKey);
      classes && classes->asArray()) {
    std::string names;
    for (const zt::platform::Value& name : *classes->asArray()) {
      if (!name.asString()) continue;
      std::string text = *name.asString();
      // "tessel.contacts" reads better as "contacts".
      if (auto dot = text.rfind('.'); dot != std::string::npos) text.erase(0, dot + 1);
      names += (names.empty() ? "" : ", ") + text;
    }
    progress.dataClasses = names.empty() ? "nothing to sync" : names;
  }
  if (const auto* status = info.find(zt::platform::sync_progress::kStatusKey);
      status && status->asNumber()) {
    progress.status = status->asNumber()->int64Value();
  }
}

}  // namespace

std::string suggestedClientIdentifier(std::uint64_t uniqueID) {
  return "zeto-" + hexIdentifier(uniqueID);
}

void listDevices(CommandContext& context) {
  std::unique_ptr<zt::platform::DeviceLibrary> devices = zt::platform::makeDeviceLibrary();
  std::vector<zt::platform::ZetoRef> connected;
  if (devices->ZetoCopyConnected(connected) != zt::platform::kZetoSuccess) {
    throw Exception(TesselStoreException,
                    "cannot list the connected players (see the system log, or "
                    "$ZETOSYNCTOOL_LOG=stderr, for why)");
  }
  if (connected.empty()) {
    context.out() << "no Zeto player is connected\n";
    return;
  }
  // Whether each suggested client is registered; without a store, none is.
  std::error_code error;
  Store* store = std::filesystem::exists(context.storePath(), error) ? &context.store() : nullptr;
  for (zt::platform::ZetoRef device : connected) {
    std::uint64_t id = devices->ZetoGetUniqueID(device);
    std::string mountPoint;
    bool mounted = devices->ZetoCopyMountpoint(device, mountPoint) == zt::platform::kZetoSuccess;
    const std::string client = suggestedClientIdentifier(id);
    context.out() << hexIdentifier(id) << '\t' << (mounted ? mountPoint : "not mounted") << '\t'
                  << "client: " << client << '\t';
    if (store != nullptr && store->clientWithIdentifier(client)) {
      context.out() << "registered\n";
    } else {
      context.out() << "not registered: tessel client register " << client
                    << " --contacts --calendars\n";
    }
  }
}

int watchSyncs(CommandContext& context, const std::optional<std::string>& clientIdentifier) {
  std::unique_ptr<zt::platform::NotificationListener> listener =
      zt::platform::NotificationListener::connectToSessionBus();
  if (!listener) {
    throw Exception(TesselStoreException,
                    "no session bus to listen on (is DBUS_SESSION_BUS_ADDRESS set?)");
  }
  std::signal(SIGINT, onInterrupt);
  std::signal(SIGTERM, onInterrupt);
  const bool live = zt::platform::isTerminal(zt::platform::StandardStream::Output);
  std::map<std::string, Progress> players;
  std::ostream& out = context.out();
  while (!interrupted) {
    std::optional<zt::platform::Notification> posted =
        listener->next(std::chrono::milliseconds(250));
    if (!posted || posted->name != zt::platform::sync_progress::kNotificationName) continue;
    if (clientIdentifier && posted->sender != *clientIdentifier) continue;
    Progress& progress = players[posted->sender];
    update(progress, posted->userInfo);
    // On a terminal each player's bar is redrawn in place; otherwise one line per update.
    if (live) {
      out << '\r' << "\x1b[K" << bar(posted->sender, progress);
      if (progress.status) out << '\n';
    } else {
      out << bar(posted->sender, progress) << '\n';
    }
    out.flush();
    if (progress.status) {
      std::int64_t status = *progress.status;
      if (clientIdentifier) return static_cast<int>(status);
      players.erase(posted->sender);
    }
  }
  if (live) out << '\n';
  return 0;
}

}  // namespace tessel::cli
