#include "tools/tessel/device_commands.h"

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <iostream>
#include <ostream>
#include <thread>
#include <vector>

#include "platform/device_library.h"
#include "platform/notification_listener.h"
#include "tessel/client.h"
#include "tessel/exception.h"
#include "tools/tessel/notification_file.h"
#include "tools/tessel/progress_view.h"

namespace tessel::cli {

namespace {

std::string hexIdentifier(std::uint64_t uniqueID) {
  return zt::platform::formatUniqueId(uniqueID);
}

volatile std::sig_atomic_t interrupted = 0;

void onInterrupt(int) {
  interrupted = 1;
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

namespace {

// Without a session bus: the lines appended to the notifications log from now on.
int followLog(const std::filesystem::path& path, const std::optional<std::string>& client,
              ProgressView& view) {
  std::error_code error;
  NotificationFile file(path, std::filesystem::exists(path, error)
                                  ? NotificationFile::startOfFollowing(path, client)
                                  : 0);
  while (!interrupted) {
    const std::vector<zt::platform::Notification> notes = file.readNew();
    if (notes.empty()) std::this_thread::sleep_for(std::chrono::milliseconds(200));
    for (const zt::platform::Notification& note : notes) {
      if (auto status = view.show(note.name, note.sender, note.userInfo)) return *status;
    }
  }
  view.end();
  return 0;
}

}  // namespace

int watchSyncs(CommandContext& context, const std::optional<std::string>& clientIdentifier) {
  std::signal(SIGINT, onInterrupt);
  std::signal(SIGTERM, onInterrupt);
  ProgressView view(context.out(), clientIdentifier);
  std::unique_ptr<zt::platform::NotificationListener> listener =
      zt::platform::NotificationListener::connectToSessionBus();
  if (!listener) {
    const char* log = std::getenv("TESSEL_NOTIFICATIONS_LOG");
    if (log == nullptr || *log == '\0') {
      throw Exception(TesselStoreException,
                      "no session bus to listen on (DBUS_SESSION_BUS_ADDRESS is not set: on a "
                      "text console or over SSH, run `dbus-run-session -- bash`, or set "
                      "TESSEL_NOTIFICATIONS_LOG to a file for both zetosynctool and tessel "
                      "watch)");
    }
    std::cerr << "tessel: no session bus; following " << log << '\n';
    return followLog(log, clientIdentifier, view);
  }
  while (!interrupted) {
    std::optional<zt::platform::Notification> posted =
        listener->next(std::chrono::milliseconds(250));
    if (!posted) continue;
    if (auto status = view.show(posted->name, posted->sender, posted->userInfo)) return *status;
  }
  view.end();
  return 0;
}

}  // namespace tessel::cli
