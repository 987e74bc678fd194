#include "tools/tessel/sync_command.h"

#include <chrono>
#include <csignal>
#include <cstdint>
#include <cstdlib>
#include <exception>
#include <filesystem>
#include <iostream>
#include <map>
#include <string_view>
#include <vector>

#include "platform/child_process.h"
#include "platform/device_library.h"
#include "platform/result.h"
#include "tessel/client.h"
#include "tessel/exception.h"
#include "tessel/schema.h"
#include "tools/tessel/counted.h"
#include "tools/tessel/device_commands.h"
#include "tools/tessel/notification_file.h"
#include "tools/tessel/player_contents.h"
#include "tools/tessel/progress_file.h"
#include "tools/tessel/progress_view.h"
#include "tools/tessel/refresh_command.h"
#include "tools/tessel/sync_outcome.h"

namespace tessel::cli {

namespace {

namespace fs = std::filesystem;
using zt::platform::Result;

// The sources are brought in before any player is synced, so that a player plugged in gets
// what the servers and folders hold today. Each source that could not be read has said why on
// standard error; the error counts them.
Result<void> refreshBeforeSync(CommandContext& context) {
  const RefreshOutcome refreshed = refreshSources(context);
  if (refreshed.ok()) return {};
  return zt::platform::Error{counted(refreshed.failed, "source", "sources") + " could not be read"};
}

volatile std::sig_atomic_t interrupted = 0;

// Ctrl-C reaches the running zetosynctool as well; this process outlives it to say how it
// ended, and starts no other sync.
void onInterrupt(int) {
  interrupted = 1;
}

// One player to sync: its client and what a person calls it.
struct Target {
  std::string client;
  std::string name;
  bool contacts = false;
  bool calendars = false;
};

Target targetFor(const Client& client) {
  Target target{client.identifier(), client.displayName()};
  // A client named after nothing but its identifier is called what it is.
  if (target.name == target.client) target.name = "Zeto";
  target.contacts = client.isEnabledForEntityName(TesselEntity_Contacts_Contact);
  target.calendars = client.isEnabledForEntityName(TesselEntity_Calendars_Calendar);
  return target;
}

// Where the client's player stands now: connected or not, and where it is mounted.
struct PlayerState {
  bool connected = false;
  std::optional<fs::path> volume;
};

PlayerState playerOf(const std::string& client) {
  PlayerState state;
  std::unique_ptr<zt::platform::DeviceLibrary> devices = zt::platform::makeDeviceLibrary();
  std::vector<zt::platform::ZetoRef> connected;
  if (devices->ZetoCopyConnected(connected) != zt::platform::kZetoSuccess) return state;
  // The tool's own rule: the first connected player whose identifier ends the client's.
  for (zt::platform::ZetoRef device : connected) {
    if (!client.ends_with(zt::platform::formatUniqueId(devices->ZetoGetUniqueID(device)))) {
      continue;
    }
    state.connected = true;
    std::string mountPoint;
    if (devices->ZetoCopyMountpoint(device, mountPoint) == zt::platform::kZetoSuccess) {
      state.volume = mountPoint;
    }
    break;
  }
  return state;
}

// The players of the run: the named client, or every connected player with a registered one.
// Clients that cannot be synced are answered as outcomes in `run`.
std::vector<Target> chooseTargets(CommandContext& context, const std::optional<std::string>& client,
                                  SyncRun& run) {
  std::vector<Target> targets;
  if (client) {
    if (std::unique_ptr<Client> found = context.store().clientWithIdentifier(*client)) {
      targets.push_back(targetFor(*found));
    } else {
      run.players.push_back({*client, "Zeto", kSyncFailed,
                             "no sync client " + *client +
                                 " in the store: tessel devices suggests one for each player, "
                                 "tessel client register registers it"});
      context.out() << SyncRun::outcomeLine(run.players.back()) << '\n';
    }
    return targets;
  }
  std::unique_ptr<zt::platform::DeviceLibrary> devices = zt::platform::makeDeviceLibrary();
  std::vector<zt::platform::ZetoRef> connected;
  if (devices->ZetoCopyConnected(connected) != zt::platform::kZetoSuccess) {
    run.stopped = {kSyncFailed,
                   "cannot list the connected players (see the system log, or "
                   "$ZETOSYNCTOOL_LOG=stderr, for why)"};
    return targets;
  }
  Store& store = context.store();
  for (zt::platform::ZetoRef device : connected) {
    const std::uint64_t id = devices->ZetoGetUniqueID(device);
    const std::string suggested = suggestedClientIdentifier(id);
    if (std::unique_ptr<Client> found = store.clientWithIdentifier(suggested)) {
      targets.push_back(targetFor(*found));
    } else {
      std::cerr << "tessel: the player " << zt::platform::formatUniqueId(id)
                << " is not registered: tessel client register " << suggested
                << " --contacts --calendars\n";
    }
  }
  if (targets.empty()) {
    run.stopped = {kSyncNoPlayer, connected.empty()
                                      ? "no Zeto player is connected"
                                      : "no connected Zeto player has a registered sync client "
                                        "(tessel devices shows them)"};
  }
  return targets;
}

std::string logHint() {
  const char* log = std::getenv("ZETOSYNCTOOL_LOG");
  if (log != nullptr && *log != '\0' && std::string_view(log) != "stderr") {
    return std::string("the log in ") + log + " says why";
  }
  return "journalctl -t zetosynctool says why";
}

// Why a sync that did not succeed ended so, and what the person can do.
std::string failureDetail(const Target& target, int status,
                          const std::optional<zt::platform::ChildExit>& toolExit) {
  const std::string again = "tessel sync " + target.client;
  switch (status) {
    case kSyncCancelled:
      return "the session was cancelled; " + again + " syncs it again";
    case kSyncPlayerUnavailable: {
      const PlayerState state = playerOf(target.client);
      if (!state.connected) return "the player is not connected: plug it in (tessel devices)";
      if (!state.volume)
        return "the player's volume was not mounted in time: mount it, then " + again;
      return "another sync is using the player: " + again + " once it ends";
    }
    default:
      if (toolExit) {
        return toolExit->kind == zt::platform::ChildExit::Kind::Killed
                   ? "zetosynctool was stopped by signal " + std::to_string(toolExit->code)
                   : "zetosynctool ended with status " + std::to_string(toolExit->code) +
                         " and no outcome";
      }
      return logHint() + "; then " + again;
  }
}

std::string contentsDetail(const Target& target) {
  if (!target.contacts && !target.calendars) {
    return "nothing to sync: the client syncs neither contacts nor calendars";
  }
  const PlayerState state = playerOf(target.client);
  if (!state.volume) return "the player was unmounted before its files could be counted";
  const PlayerContents contents = PlayerContents::of(*state.volume);
  std::string detail;
  if (target.contacts) {
    detail = withThousands(contents.contacts) + (contents.contacts == 1 ? " contact" : " contacts");
  }
  if (target.calendars) {
    if (!detail.empty()) detail += ", ";
    detail +=
        withThousands(contents.calendars) + (contents.calendars == 1 ? " calendar" : " calendars");
  }
  return detail;
}

// Standard error of the tool, passed on a whole line at a time so that the progress bar can
// make way for it.
class ErrorLines {
 public:
  explicit ErrorLines(ProgressView& view) : view_(view) {}
  void add(const std::string& text) {
    pending_ += text;
    const std::size_t end = pending_.rfind('\n');
    if (end == std::string::npos) return;
    pass(pending_.substr(0, end + 1));
    pending_.erase(0, end + 1);
  }
  void finish() {
    if (!pending_.empty()) pass(pending_ + '\n');
    pending_.clear();
  }

 private:
  void pass(const std::string& lines) {
    view_.makeWay();
    std::cerr << lines;
    std::cerr.flush();
    view_.redraw();
  }

  ProgressView& view_;
  std::string pending_;
};

PlayerSync syncOne(CommandContext& context, const Target& target, const fs::path& synctool,
                   const ProgressFile& progress) {
  PlayerSync outcome{target.client, target.name, kSyncFailed, {}};
  // Only what the tool writes from now on is this sync's.
  std::error_code error;
  const std::uintmax_t size = fs::file_size(progress.path(), error);
  NotificationFile notes(progress.path(), error ? 0 : size);
  std::map<std::string, std::string> environment = progress.environment();
  // The tool takes no --store: it is told through its environment which store this is.
  environment["TESSEL_STORE"] = context.storePath().string();
  Result<zt::platform::ChildProcess> tool = zt::platform::ChildProcess::start(
      synctool, {"--oneshot", "--sync", target.client}, environment);
  if (!tool) {
    outcome.detail = tool.error();
    return outcome;
  }
  ProgressView view(context.out(), target.client);
  ErrorLines errors(view);
  std::optional<int> status;
  std::optional<zt::platform::ChildExit> ended;
  while (!ended) {
    errors.add(tool->readError(std::chrono::milliseconds(100)));
    ended = tool->ended();
    if (ended) {
      // What it wrote just before it ended is still in the pipe.
      for (std::string rest = tool->readError({}); !rest.empty(); rest = tool->readError({})) {
        errors.add(rest);
      }
    }
    for (const zt::platform::Notification& note : notes.readNew()) {
      if (auto final = view.show(note.name, note.sender, note.userInfo)) status = final;
    }
  }
  view.end();
  errors.finish();
  outcome.status = status && *status >= kSyncSucceeded && *status <= kSyncPlayerUnavailable
                       ? *status
                       : kSyncFailed;
  outcome.detail =
      outcome.status == kSyncSucceeded
          ? contentsDetail(target)
          : failureDetail(target, outcome.status, status ? std::nullopt : std::optional(*ended));
  return outcome;
}

void runSyncs(CommandContext& context, const std::optional<std::string>& client, SyncRun& run) {
  const std::vector<Target> targets = chooseTargets(context, client, run);
  if (targets.empty()) return;
  const std::optional<fs::path> synctool = zt::platform::findProgram("zetosynctool");
  if (!synctool) {
    run.stopped = {kSyncFailed,
                   "zetosynctool is neither beside tessel nor on PATH: install both programs "
                   "together (docs/USAGE.md)"};
    return;
  }
  Result<ProgressFile> progress = ProgressFile::open();
  if (!progress) {
    run.stopped = {kSyncFailed, progress.error()};
    return;
  }
  for (const Target& target : targets) {
    if (interrupted) break;
    PlayerSync outcome = syncOne(context, target, *synctool, *progress);
    context.out() << SyncRun::outcomeLine(outcome) << '\n';
    context.out().flush();
    run.players.push_back(std::move(outcome));
  }
}

}  // namespace

int syncPlayers(CommandContext& context, const std::optional<std::string>& clientIdentifier) {
  std::signal(SIGINT, onInterrupt);
  // The tool reads the store it is told of, so --store is no reason for a warning.
  context.passStoreToTool();
  SyncRun run;
  try {
    if (Result<void> refreshed = refreshBeforeSync(context); !refreshed) {
      run.refreshFailure = refreshed.error();
      std::cerr << "tessel: refresh failed: " << refreshed.error()
                << "; syncing what the store holds\n";
    }
    runSyncs(context, clientIdentifier, run);
  } catch (const Exception& e) {
    run.stopped = {kSyncFailed, e.reason().empty() ? e.name() : e.reason()};
  } catch (const std::exception& e) {
    run.stopped = {kSyncFailed, e.what()};
  }
  if (run.stopped) std::cerr << "tessel: " << run.stopped->reason << '\n';
  // Without a session bus or a notification service nobody is looking at a desktop: the notice
  // is left out without a word.
  if (auto desktop = zt::platform::DesktopNotifier::connectToSessionBus("tessel")) {
    static_cast<void>(desktop->show(run.notice()));
  }
  return run.exitStatus();
}

}  // namespace tessel::cli
