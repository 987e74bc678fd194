#include "sync/synctool_fixture.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <fstream>
#include <sstream>
#include <system_error>
#include <thread>

#include "filters/filter_classes.h"
#include "platform/device_library.h"
#include "support/files.h"
#include "support/process.h"
#include "sync/zt_sync_manager.h"

namespace zt::sync::test_support {

namespace {

// A run that takes longer than this is stuck; it is killed and the test fails.
constexpr auto kRunDeadline = std::chrono::seconds(50);

using zt::test_support::readFile;
using zt::test_support::splitLines;
using zt::test_support::writeFile;

}  // namespace

bool SynctoolRun::logged(std::string_view line) const {
  return lineIndex(line).has_value();
}

bool SynctoolRun::logContains(std::string_view text) const {
  return log.find(text) != std::string::npos;
}

std::optional<std::size_t> SynctoolRun::lineIndex(std::string_view line) const {
  auto found = std::find(logLines.begin(), logLines.end(), line);
  if (found == logLines.end()) return std::nullopt;
  return static_cast<std::size_t>(found - logLines.begin());
}

std::optional<std::int64_t> SynctoolRun::finalStatus() const {
  if (notifications.empty()) return std::nullopt;
  const Json& userInfo = notifications.back()["userInfo"];
  if (!userInfo.contains("TesselClientStatus")) return std::nullopt;
  return userInfo["TesselClientStatus"].get<std::int64_t>();
}

std::optional<std::vector<std::string>> SynctoolRun::dataClassesSyncing() const {
  for (const Json& note : notifications) {
    const Json& userInfo = note["userInfo"];
    if (userInfo.contains("TesselClientDataClassSyncing")) {
      return userInfo["TesselClientDataClassSyncing"].get<std::vector<std::string>>();
    }
  }
  return std::nullopt;
}

Json expectedNotification(std::string_view sender, std::string_view phase, double percent,
                          std::optional<std::int64_t> status,
                          std::optional<std::vector<std::string>> dataClasses) {
  Json userInfo = Json::object();
  userInfo["TesselClientCurrentPhase"] = std::string(phase);
  if (status) userInfo["TesselClientStatus"] = *status;
  if (dataClasses) userInfo["TesselClientDataClassSyncing"] = Json(*dataClasses);
  userInfo["TesselClientPercentProgressionPhase"] = percent;
  Json line = Json::object();
  line["name"] = "TesselClientSyncNotification";
  line["object"] = std::string(sender);
  line["userInfo"] = std::move(userInfo);
  return line;
}

void SynctoolTest::SetUp() {
  fs::create_directories(volume());
  fs::create_directories(folder() / "run");
  // The test reads the filters the tool wrote back as the tool's own classes.
  filters::registerFilterClasses();
  store_ = tessel::Store::open(folder() / "truth.db");
  setPlayers({Player(std::string(kPlayerID))});
  setDebugLog(true);
}

void SynctoolTest::TearDown() {
  store_.reset();
}

std::unique_ptr<tessel::Client> SynctoolTest::registerClient(std::string_view identifier,
                                                             bool contacts, bool calendars) {
  std::vector<std::string> entities;
  if (contacts) {
    const auto& names = ZTSyncManager::entitiesForContacts();
    entities.insert(entities.end(), names.begin(), names.end());
  }
  if (calendars) {
    const auto& names = ZTSyncManager::entitiesForCalendars();
    entities.insert(entities.end(), names.begin(), names.end());
  }
  return store_->registerClient(identifier, "Zeto", entities);
}

std::unique_ptr<tessel::Client> SynctoolTest::client(std::string_view identifier) const {
  return store_->clientWithIdentifier(identifier);
}

void SynctoolTest::setPlayers(const std::vector<Player>& players) {
  Json list = Json::array();
  for (const Player& player : players) {
    Json entry = Json::object();
    entry["id"] = player.id;
    entry["volume"] = (player.volume.empty() ? volume() : player.volume).string();
    entry["mounted"] = player.mounted;
    if (player.mountAfter) entry["mount_after"] = *player.mountAfter;
    if (player.checkpoint) entry["checkpoint"] = player.checkpoint->string();
    list.push_back(std::move(entry));
  }
  setDevicesFile(list.dump(2));
}

void SynctoolTest::setDevicesFile(const std::string& json) {
  writeFile(folder() / "devices.json", json);
}

void SynctoolTest::setDefaults(const std::string& text) {
  writeFile(folder() / "defaults.conf", text);
}

void SynctoolTest::setDebugLog(bool on) {
  setDefaults(std::string("DebugLog = ") + (on ? "true" : "false") + "\n");
}

std::map<std::string, std::string> SynctoolTest::environment() const {
  std::map<std::string, std::string> env = {
      {"HOME", folder().string()},
      {"XDG_RUNTIME_DIR", (folder() / "run").string()},
      {"XDG_CONFIG_HOME", (folder() / "config").string()},
      {"XDG_DATA_HOME", (folder() / "data").string()},
      {"TESSEL_STORE", (folder() / "truth.db").string()},
      {"ZETO_VIRTUAL_DEVICES", (folder() / "devices.json").string()},
      {"ZETOSYNCTOOL_DEFAULTS", (folder() / "defaults.conf").string()},
      {"ZETOSYNCTOOL_LOG", (folder() / "log.txt").string()},
      {"TESSEL_NOTIFICATIONS_LOG", (folder() / "notes.jsonl").string()},
  };
  if (useSessionBus_) {
    if (const char* bus = std::getenv("DBUS_SESSION_BUS_ADDRESS")) {
      env["DBUS_SESSION_BUS_ADDRESS"] = bus;
    }
  }
  for (const auto& [name, value] : overrides_) env[name] = value;
  return env;
}

namespace {

// Runs `words` with `environment` (none: this process's), standard input from /dev/null and
// standard output and error into `output`, killing it after kRunDeadline, or at `kill` when
// given; its exit status, 128 + signal when it was killed. `logPipe`, when open, is the read
// end of the pipe the program logs into: what it carries is appended to `log` as it comes,
// and the time each line came to `lineSeconds`.
int runProgram(std::vector<std::string> words, std::optional<std::vector<std::string>> environment,
               const fs::path& output, const std::optional<KillAt>& kill = std::nullopt,
               int logPipe = -1, std::string* log = nullptr,
               std::vector<double>* lineSeconds = nullptr) {
  // Everything the child needs is made before the fork.
  std::vector<char*> argv, envp;
  for (std::string& word : words) argv.push_back(word.data());
  argv.push_back(nullptr);
  if (environment) {
    for (std::string& entry : *environment) envp.push_back(entry.data());
    envp.push_back(nullptr);
  }
  const std::string outFile = output.string();
  // File events are watched from before the start, so none is missed.
  int fileEvents = -1;
  std::size_t events = 0;
  if (kill && kill->folder) {
    fileEvents = ::inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
    if (fileEvents < 0 ||
        ::inotify_add_watch(fileEvents, kill->folder->c_str(), kill->fileEvents) < 0) {
      ADD_FAILURE() << "cannot watch " << *kill->folder;
    }
  }
  const auto start = std::chrono::steady_clock::now();
  const pid_t pid = ::fork();
  if (pid == 0) {
    const int in = ::open("/dev/null", O_RDONLY);
    const int out = ::open(outFile.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    if (in >= 0) ::dup2(in, STDIN_FILENO);
    if (out >= 0) {
      ::dup2(out, STDOUT_FILENO);
      ::dup2(out, STDERR_FILENO);
    }
    if (environment) {
      ::execve(argv[0], argv.data(), envp.data());
    } else {
      ::execv(argv[0], argv.data());
    }
    ::_exit(127);
  }
  if (pid < 0) {
    ADD_FAILURE() << "fork failed";
    return -1;
  }
  using Clock = std::chrono::steady_clock;
  const auto after = [](double seconds) {
    return std::chrono::duration_cast<Clock::duration>(std::chrono::duration<double>(seconds));
  };
  std::optional<Clock::time_point> killTime;
  if (kill && !kill->logLine && !kill->folder && kill->seconds) {
    killTime = start + after(*kill->seconds);
  }
  const auto readEvents = [&](Clock::time_point now) {
    alignas(inotify_event) char buffer[4096];
    ssize_t got;
    while ((got = ::read(fileEvents, buffer, sizeof buffer)) > 0) {
      for (ssize_t at = 0; at < got;) {
        const auto* event = reinterpret_cast<const inotify_event*>(buffer + at);
        if ((event->mask & kill->fileEvents) != 0 && ++events == kill->eventCount && !killTime) {
          killTime = now + after(*kill->seconds);
        }
        at += static_cast<ssize_t>(sizeof(inotify_event) + event->len);
      }
    }
  };
  const auto readLog = [&](Clock::time_point now) {
    char buffer[65536];
    ssize_t got;
    while ((got = ::read(logPipe, buffer, sizeof buffer)) > 0) {
      log->append(buffer, static_cast<std::size_t>(got));
      for (ssize_t i = 0; i < got; ++i) {
        if (buffer[i] != '\n') continue;
        lineSeconds->push_back(std::chrono::duration<double>(now - start).count());
        if (!killTime && kill->logLine && kill->seconds && lineSeconds->size() == *kill->logLine) {
          killTime = now + after(*kill->seconds);
        }
      }
    }
  };
  int status = 0;
  while (::waitpid(pid, &status, WNOHANG) != pid) {
    const auto now = Clock::now();
    if (logPipe >= 0) readLog(now);
    if (fileEvents >= 0) readEvents(now);
    const bool due = killTime && now >= *killTime;
    if (due || now - start > kRunDeadline) {
      ::kill(pid, SIGKILL);
      ::waitpid(pid, &status, 0);
      if (!due) ADD_FAILURE() << words[0] << " did not end in time and was killed";
      break;
    }
    if (logPipe < 0) {
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
      continue;
    }
    // A run that may be cut short is watched closely: the last millisecond before the kill is
    // spun through, so the kill lands where it was aimed.
    pollfd ready[2] = {{logPipe, POLLIN, 0}, {fileEvents, POLLIN, 0}};
    ::poll(ready, fileEvents >= 0 ? 2 : 1,
           killTime && *killTime - now < std::chrono::milliseconds(1) ? 0 : 1);
  }
  if (logPipe >= 0) readLog(Clock::now());
  if (fileEvents >= 0) ::close(fileEvents);
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

}  // namespace

SynctoolRun SynctoolTest::runSynctool(const std::vector<std::string>& arguments) {
  return runWatched(arguments, std::nullopt);
}

SynctoolRun SynctoolTest::runSynctool(const std::vector<std::string>& arguments,
                                      const KillAt& kill) {
  return runWatched(arguments, kill);
}

SynctoolRun SynctoolTest::runWatched(const std::vector<std::string>& arguments,
                                     const std::optional<KillAt>& kill) {
  const fs::path logPath = folder() / "log.txt";
  const fs::path notesPath = folder() / "notes.jsonl";
  std::error_code ignored;
  fs::remove(logPath, ignored);
  fs::remove(notesPath, ignored);
  // A pipe in place of the log file; its read end is open before the tool opens the other
  // end, so neither waits for the other.
  int logPipe = -1;
  if (kill) {
    if (::mkfifo(logPath.c_str(), 0600) != 0 ||
        (logPipe = ::open(logPath.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC)) < 0) {
      ADD_FAILURE() << "cannot make the log pipe " << logPath;
    }
  }

  std::vector<std::string> words = {ZETOSYNCTOOL_BINARY};
  words.insert(words.end(), arguments.begin(), arguments.end());
  std::vector<std::string> env;
  for (const auto& [name, value] : environment()) env.push_back(name + "=" + value);

  SynctoolRun run;
  const auto start = std::chrono::steady_clock::now();
  run.exitStatus = runProgram(std::move(words), std::move(env), folder() / "stderr.txt", kill,
                              logPipe, &run.log, &run.logLineSeconds);
  run.seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
  if (logPipe >= 0) {
    ::close(logPipe);
    fs::remove(logPath, ignored);
  } else {
    run.log = readFile(logPath);
  }
  run.logLines = splitLines(run.log);
  run.standardError = readFile(folder() / "stderr.txt");
  for (const std::string& line : splitLines(readFile(notesPath))) {
    if (line.empty()) continue;
    Json parsed = Json::parse(line, nullptr, false);
    if (parsed.is_discarded()) {
      // A killed run may leave its last line half written.
      if (!kill) ADD_FAILURE() << "not a JSON line in the notification log: " << line;
      continue;
    }
    run.notifications.push_back(std::move(parsed));
  }
  return run;
}

SynctoolTest::TesselRun SynctoolTest::runTessel(const std::vector<std::string>& arguments) {
  std::vector<std::string> words = {TESSEL_BINARY, "--store", (folder() / "truth.db").string()};
  words.insert(words.end(), arguments.begin(), arguments.end());
  zt::test_support::ProcessOptions options;
  options.mergeErrorIntoOutput = true;
  options.environment = environment();
  const zt::test_support::ProcessRun run = zt::test_support::runProcess(words, options);
  return {run.status, run.out};
}

LockHolder::LockHolder(const std::map<std::string, std::string>& environment,
                       std::uint64_t uniqueId) {
  int answer[2], release[2];
  if (::pipe2(answer, O_CLOEXEC) != 0 || ::pipe2(release, O_CLOEXEC) != 0) {
    ADD_FAILURE() << "pipe failed";
    return;
  }
  pid_ = ::fork();
  if (pid_ == 0) {
    for (const auto& [name, value] : environment) ::setenv(name.c_str(), value.c_str(), 1);
    std::int32_t result = platform::kZetoErrorNoSuchDevice;
    std::unique_ptr<platform::DeviceLibrary> library = platform::makeDeviceLibrary();
    std::vector<platform::ZetoRef> devices;
    if (library->ZetoCopyConnected(devices) == platform::kZetoSuccess) {
      for (platform::ZetoRef device : devices) {
        if (library->ZetoGetUniqueID(device) == uniqueId) result = library->ZetoAquireLock(device);
      }
    }
    if (::write(answer[1], &result, sizeof result) != sizeof result) ::_exit(1);
    // Holds the lock until the test closes its end of the pipe (or dies).
    ::close(release[1]);
    char byte;
    while (::read(release[0], &byte, 1) < 0 && errno == EINTR) {
    }
    ::_exit(0);
  }
  ::close(answer[1]);
  ::close(release[0]);
  release_ = release[1];
  std::int32_t result = 0;
  if (pid_ > 0 && ::read(answer[0], &result, sizeof result) == sizeof result) result_ = result;
  ::close(answer[0]);
}

LockHolder::~LockHolder() {
  if (release_ >= 0) ::close(release_);
  if (pid_ > 0) {
    int status = 0;
    ::waitpid(pid_, &status, 0);
  }
}

}  // namespace zt::sync::test_support
