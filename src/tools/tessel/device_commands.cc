#include "tools/tessel/device_commands.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iomanip>
#include <iostream>
#include <map>
#include <nlohmann/json.hpp>
#include <ostream>
#include <sstream>
#include <thread>
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

namespace {

// One watch: the players' bars, drawn as notifications come, from the bus or from the log file.
class Watch {
 public:
  Watch(std::ostream& out, const std::optional<std::string>& client)
      : out_(out),
        client_(client),
        live_(zt::platform::isTerminal(zt::platform::StandardStream::Output)) {}

  // Shows one notification; answers the exit status once the watched client's sync ended.
  std::optional<int> show(const std::string& name, const std::string& sender,
                          const zt::platform::Dictionary& info) {
    if (name != zt::platform::sync_progress::kNotificationName) return std::nullopt;
    if (client_ && sender != *client_) return std::nullopt;
    Progress& progress = players_[sender];
    update(progress, info);
    // On a terminal each player's bar is redrawn in place; otherwise one line per update.
    if (live_) {
      out_ << '\r' << "\x1b[K" << bar(sender, progress);
      if (progress.status) out_ << '\n';
    } else {
      out_ << bar(sender, progress) << '\n';
    }
    out_.flush();
    if (!progress.status) return std::nullopt;
    const auto status = static_cast<int>(*progress.status);
    players_.erase(sender);
    if (client_) return status;
    return std::nullopt;
  }
  void end() {
    if (live_) out_ << '\n';
  }

 private:
  std::ostream& out_;
  std::optional<std::string> client_;
  bool live_;
  std::map<std::string, Progress> players_;
};

// A notification's payload from its JSON line: the strings, numbers and lists of strings that
// the progress needs.
zt::platform::Dictionary payloadFromJson(const nlohmann::json& info) {
  zt::platform::Dictionary payload;
  if (!info.is_object()) return payload;
  for (const auto& [key, value] : info.items()) {
    if (value.is_string()) {
      payload.set(key, zt::platform::Value(value.get<std::string>()));
    } else if (value.is_number_integer()) {
      payload.set(key, zt::platform::Value::integer(value.get<std::int64_t>()));
    } else if (value.is_number()) {
      payload.set(key, zt::platform::Value::real(value.get<double>()));
    } else if (value.is_array()) {
      zt::platform::Array names;
      for (const auto& element : value) {
        if (element.is_string()) names.emplace_back(element.get<std::string>());
      }
      payload.set(key, zt::platform::Value(std::move(names)));
    }
  }
  return payload;
}

bool isSyncNote(const nlohmann::json& note) {
  return note.is_object() && note.contains("name") && note["name"].is_string() &&
         note.contains("object") && note["object"].is_string();
}

// Where following starts: the end of the file, or for one client whose sync is under way (it
// began and has not ended), the start of that sync, so a watch started just after the tool
// misses nothing.
std::uintmax_t followingStart(const std::filesystem::path& path,
                              const std::optional<std::string>& client) {
  std::ifstream in(path, std::ios::binary);
  std::uintmax_t offset = 0;
  std::optional<std::uintmax_t> running;
  for (std::string line; std::getline(in, line);) {
    const std::uintmax_t start = offset;
    offset += line.size() + 1;
    if (!client || in.eof()) continue;
    const nlohmann::json note = nlohmann::json::parse(line, nullptr, false);
    if (!isSyncNote(note) || note["object"] != *client) continue;
    const nlohmann::json info = note.value("userInfo", nlohmann::json::object());
    if (info.contains(std::string(zt::platform::sync_progress::kStatusKey))) {
      running.reset();
    } else if (!running) {
      running = start;
    }
  }
  std::error_code error;
  const std::uintmax_t size = std::filesystem::file_size(path, error);
  return running && !error ? *running : error ? 0 : size;
}

// Without a session bus: the lines appended to the notifications log from now on.
int followLog(const std::filesystem::path& path, const std::optional<std::string>& client,
              Watch& watch) {
  std::error_code error;
  std::uintmax_t offset = std::filesystem::exists(path, error) ? followingStart(path, client) : 0;
  std::string pending;
  while (!interrupted) {
    const std::uintmax_t size = std::filesystem::file_size(path, error);
    if (error || size == offset) {
      std::this_thread::sleep_for(std::chrono::milliseconds(200));
      continue;
    }
    if (size < offset) offset = 0;  // emptied: read it from its start
    std::ifstream in(path, std::ios::binary);
    in.seekg(static_cast<std::streamoff>(offset));
    std::string chunk(static_cast<std::size_t>(size - offset), '\0');
    in.read(chunk.data(), static_cast<std::streamsize>(chunk.size()));
    chunk.resize(static_cast<std::size_t>(in.gcount()));
    offset += chunk.size();
    pending += chunk;
    for (auto end = pending.find('\n'); end != std::string::npos; end = pending.find('\n')) {
      const std::string line = pending.substr(0, end);
      pending.erase(0, end + 1);
      const nlohmann::json note = nlohmann::json::parse(line, nullptr, false);
      if (!isSyncNote(note)) continue;
      if (auto status =
              watch.show(note["name"].get<std::string>(), note["object"].get<std::string>(),
                         payloadFromJson(note.value("userInfo", nlohmann::json())))) {
        return *status;
      }
    }
  }
  watch.end();
  return 0;
}

}  // namespace

int watchSyncs(CommandContext& context, const std::optional<std::string>& clientIdentifier) {
  std::signal(SIGINT, onInterrupt);
  std::signal(SIGTERM, onInterrupt);
  Watch watch(context.out(), clientIdentifier);
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
    return followLog(log, clientIdentifier, watch);
  }
  while (!interrupted) {
    std::optional<zt::platform::Notification> posted =
        listener->next(std::chrono::milliseconds(250));
    if (!posted) continue;
    if (auto status = watch.show(posted->name, posted->sender, posted->userInfo)) return *status;
  }
  watch.end();
  return 0;
}

}  // namespace tessel::cli
