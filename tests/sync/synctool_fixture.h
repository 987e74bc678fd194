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

#include "support/process.h"
#include "support/temporary_folder.h"
#include "tessel/client.h"
#include "tessel/store.h"

namespace zt::sync::test_support {

namespace fs = std::filesystem;
using Json = nlohmann::ordered_json;

// One simulated player of the virtual device file; an empty volume is the test's volume folder.
struct Player {
  explicit Player(std::string identifier, fs::path volumePath = {})
      : id(std::move(identifier)), volume(std::move(volumePath)) {}
  // A player whose volume mounts that many seconds after the tool registers for events.
  static Player mountingAfter(std::string identifier, double seconds) {
    Player player(std::move(identifier));
    player.mounted = false;
    player.mountAfter = seconds;
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
  // When each log line came, in seconds after the start; only for a watched run.
  std::vector<double> logLineSeconds;
  std::vector<Json> notifications;  // the notification log, one object per line, in order

  bool logged(std::string_view line) const { return lineIndex(line).has_value(); }
  bool logContains(std::string_view text) const { return log.find(text) != std::string::npos; }
  std::optional<std::size_t> lineIndex(std::string_view line) const;
  // "TesselClientStatus" of the last notification; none when it has none.
  std::optional<std::int64_t> finalStatus() const;
  // The data-class list of the first notification that carries one.
  std::optional<std::vector<std::string>> dataClassesSyncing() const;
};

// A notification's line as the tool writes it, its payload keys in the order they are added.
Json expectedNotification(std::string_view sender, std::string_view phase, double percent,
                          std::optional<std::int64_t> status = std::nullopt,
                          std::optional<std::vector<std::string>> dataClasses = std::nullopt);

// A watched run: its log goes through a pipe, so each line is seen (and timed) as it is written.
// It is cut short with SIGKILL `seconds` after the tool wrote its `logLine`-th line (from 1), or
// after the `eventCount`-th inotify event of `fileEvents` in `folder`; with neither, never.
struct KillAt {
  static KillAt afterLogLine(std::size_t n, double seconds) {
    KillAt at;
    at.logLine = n;
    at.seconds = seconds;
    return at;
  }
  static KillAt afterFileEvent(fs::path folder, std::uint32_t events, std::size_t n) {
    KillAt at;
    at.folder = std::move(folder);
    at.fileEvents = events;
    at.eventCount = n;
    return at;
  }

  std::size_t logLine = 0;
  double seconds = 0;
  fs::path folder;
  std::uint32_t fileEvents = 0;
  std::size_t eventCount = 1;
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
  void TearDown() override { store_.reset(); }

  const fs::path& folder() const { return folder_.path(); }
  fs::path volume() const { return folder_ / "vol"; }
  tessel::Store& store() { return *store_; }

  // Registers a client for the entities of the chosen data classes.
  std::unique_ptr<tessel::Client> registerClient(std::string_view identifier, bool contacts,
                                                 bool calendars);
  std::unique_ptr<tessel::Client> client(std::string_view identifier) const {
    return store_->clientWithIdentifier(identifier);
  }

  void setPlayers(const std::vector<Player>& players);
  void setDebugLog(bool on);
  void useSessionBus() { useSessionBus_ = true; }
  void setEnvironment(const std::string& name, const std::string& value) {
    overrides_[name] = value;
  }
  // The environment the binary runs with; helper processes of a test use it too.
  std::map<std::string, std::string> environment() const;

  // Runs zetosynctool with these arguments and collects what it left; the log and
  // notification files are emptied first. With `watch`, the run is watched and maybe killed.
  SynctoolRun runSynctool(const std::vector<std::string>& arguments,
                          const std::optional<KillAt>& watch = std::nullopt);
  SynctoolRun syncClient(std::string_view clientID,
                         const std::optional<KillAt>& watch = std::nullopt) {
    return runSynctool({"--oneshot", "--sync", std::string(clientID)}, watch);
  }

  // `tessel --store <the test's store, or $TESSEL_STORE when set> arguments...` with the binary's
  // environment, as the desktop application would run it; standard error goes with the output.
  zt::test_support::ProcessRun runTessel(const std::vector<std::string>& arguments);
  // The same, and the test fails when it does.
  void tessel(const std::vector<std::string>& arguments);
  // `tessel records put` of these typed JSON lines.
  void putRecords(const std::vector<Json>& lines);

 private:
  zt::test_support::TemporaryFolder folder_;
  std::unique_ptr<tessel::Store> store_;
  bool useSessionBus_ = false;
  std::map<std::string, std::string> overrides_;
};

// Another process that holds the device library's lock on one player, taken through the
// library itself with the given environment, until this object goes.
class LockHolder {
 public:
  LockHolder(const std::map<std::string, std::string>& environment, std::uint64_t uniqueId);
  ~LockHolder();
  LockHolder(const LockHolder&) = delete;
  LockHolder& operator=(const LockHolder&) = delete;

  // The library's answer to the holder's ZetoAquireLock; none when it did not get that far.
  std::optional<std::int32_t> result() const { return result_; }

 private:
  pid_t pid_ = -1;
  int release_ = -1;  // closing it lets the holder end
  std::optional<std::int32_t> result_;
};

}  // namespace zt::sync::test_support
