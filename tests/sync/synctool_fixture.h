#pragma once

#include <gtest/gtest.h>
#include <sys/types.h>

#include <cstdint>
#include <filesystem>
#include <map>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "support/temporary_folder.h"
#include "tessel/client.h"
#include "tessel/store.h"

namespace zt::sync::test_support {

namespace fs = std::filesystem;
using Json = nlohmann::ordered_json;

// One simulated player of the virtual device file.
struct Player {
  // A mounted player; an empty volume is the test's volume folder.
  explicit Player(std::string identifier, fs::path volumePath = {})
      : id(std::move(identifier)), volume(std::move(volumePath)) {}
  // A player whose volume mounts that many seconds after the tool registers for events.
  static Player mountingAfter(std::string identifier, double seconds) {
    Player player(std::move(identifier));
    player.mounted = false;
    player.mountAfter = seconds;
    return player;
  }
  static Player neverMounting(std::string identifier) {
    Player player(std::move(identifier));
    player.mounted = false;
    return player;
  }

  std::string id;  // as the file writes it: leading zeros and lower case are allowed
  fs::path volume;
  bool mounted = true;
  std::optional<double> mountAfter;
  // The self-description document its capability probe answers with; none: the probe fails.
  std::optional<fs::path> checkpoint;
};

// What one run of the binary left behind.
struct SynctoolRun {
  int exitStatus = -1;  // 128 + signal when it was killed
  double seconds = 0;   // wall time of the run
  std::string log;      // the whole log file; empty when nothing was logged
  std::vector<std::string> logLines;
  // When each log line came, in seconds after the start; only for a run watched to be killed.
  std::vector<double> logLineSeconds;
  std::vector<Json> notifications;  // the notification log, one object per line, in order
  std::string standardError;        // standard output and standard error together

  // Whether some line of the log is exactly `line`.
  bool logged(std::string_view line) const;
  // Whether the log holds `text` anywhere (messages may span lines).
  bool logContains(std::string_view text) const;
  // The index of the first line exactly `line`; none when absent.
  std::optional<std::size_t> lineIndex(std::string_view line) const;
  // "TesselClientStatus" of the last notification; none when it has none.
  std::optional<std::int64_t> finalStatus() const;
  // The data-class list of the first notification that carries one; none without one.
  std::optional<std::vector<std::string>> dataClassesSyncing() const;
};

// A notification's line as the tool writes it, its payload keys in the order they are added.
// A status of none and a class list of none are left out.
Json expectedNotification(std::string_view sender, std::string_view phase, double percent,
                          std::optional<std::int64_t> status = std::nullopt,
                          std::optional<std::vector<std::string>> dataClasses = std::nullopt);

// Where a run is cut short with SIGKILL: `seconds` after the tool wrote its n-th log line
// (counting from 1), or after the n-th file event of `fileEvents` (an inotify mask: IN_CREATE,
// IN_CLOSE_WRITE...) on a file of `folder`, or after the start when neither is given. A
// watched run (the default) is followed the same way but not killed.
struct KillAt {
  static KillAt afterLogLine(std::size_t n, double seconds = 0) {
    KillAt at;
    at.logLine = n;
    at.seconds = seconds;
    return at;
  }
  static KillAt afterFileEvent(fs::path folder, std::uint32_t fileEvents, std::size_t n = 1) {
    KillAt at;
    at.folder = std::move(folder);
    at.fileEvents = fileEvents;
    at.eventCount = n;
    at.seconds = 0;
    return at;
  }
  static KillAt afterStart(double seconds) {
    KillAt at;
    at.seconds = seconds;
    return at;
  }

  std::optional<std::size_t> logLine;
  std::optional<fs::path> folder;
  std::uint32_t fileEvents = 0;
  std::size_t eventCount = 1;
  std::optional<double> seconds;  // none: never killed
};

// Each test gets a fresh folder holding the engine's store, a volume folder, a virtual device
// file with one mounted player (kPlayerID) on that volume, and the tool's defaults file with
// debug logging on. runSynctool() starts the real zetosynctool there with an environment of
// that folder alone, and no session bus unless useSessionBus() was called.
class SynctoolTest : public ::testing::Test {
 protected:
  // A player identifier as the device file writes it, and the client identifier that ends
  // with its "%llX" text.
  static constexpr std::string_view kPlayerID = "000A27001A2B3C4D";
  static constexpr std::string_view kClientID = "000A27001A2B3C4D";

  void SetUp() override;
  void TearDown() override;

  const fs::path& folder() const { return folder_.path(); }
  fs::path volume() const { return folder_ / "vol"; }
  tessel::Store& store() { return *store_; }

  // Registers a client for the entities of the chosen data classes.
  std::unique_ptr<tessel::Client> registerClient(std::string_view identifier, bool contacts,
                                                 bool calendars);
  // The client as the store has it now.
  std::unique_ptr<tessel::Client> client(std::string_view identifier) const;

  void setPlayers(const std::vector<Player>& players);
  void setDevicesFile(const std::string& json);
  void setDefaults(const std::string& text);
  void setDebugLog(bool on);
  // The binary posts on this process's session bus too.
  void useSessionBus() { useSessionBus_ = true; }
  // Replaces or adds one variable of the binary's environment.
  void setEnvironment(const std::string& name, const std::string& value) {
    overrides_[name] = value;
  }

  // The environment the binary runs with; helper processes of a test use it too.
  std::map<std::string, std::string> environment() const;

  // Runs zetosynctool with these arguments (the program name is added) and collects what it
  // left. The log and notification files are emptied first, so each run is seen alone.
  SynctoolRun runSynctool(const std::vector<std::string>& arguments);
  // The same run, killed at that moment if it is still going; the log then goes through a
  // pipe, so a line is seen as soon as the tool wrote it.
  SynctoolRun runSynctool(const std::vector<std::string>& arguments, const KillAt& kill);
  SynctoolRun syncClient(std::string_view clientID) {
    return runSynctool({"--oneshot", "--sync", std::string(clientID)});
  }

  // What one run of the `tessel` command gave.
  struct TesselRun {
    int exitStatus = -1;
    std::string output;  // standard output and standard error together
  };
  // `tessel --store <the test's store> arguments...`, as the desktop application would run it,
  // with the binary's environment.
  TesselRun runTessel(const std::vector<std::string>& arguments);

 private:
  SynctoolRun runWatched(const std::vector<std::string>& arguments,
                         const std::optional<KillAt>& kill);

  zt::test_support::TemporaryFolder folder_;
  std::unique_ptr<tessel::Store> store_;
  bool useSessionBus_ = false;
  std::map<std::string, std::string> overrides_;
};

// Another process that holds the device library's lock on one player, taken through the
// library itself with the test's environment, until this object goes.
class LockHolder {
 public:
  LockHolder(const std::map<std::string, std::string>& environment, std::uint64_t uniqueId);
  ~LockHolder();
  LockHolder(const LockHolder&) = delete;
  LockHolder& operator=(const LockHolder&) = delete;

  // The library's answer to the holder's ZetoAquireLock; none when the holder did not get
  // that far.
  std::optional<std::int32_t> result() const { return result_; }

 private:
  pid_t pid_ = -1;
  int release_ = -1;  // closing it lets the holder end
  std::optional<std::int32_t> result_;
};

}  // namespace zt::sync::test_support
