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

using Clock = std::chrono::steady_clock;
using zt::test_support::readFile;
using zt::test_support::splitLines;
using zt::test_support::writeFile;

Clock::duration after(double seconds) {
  return std::chrono::duration_cast<Clock::duration>(std::chrono::duration<double>(seconds));
}

}  // namespace

std::optional<std::size_t> SynctoolRun::lineIndex(std::string_view line) const {
  auto found = std::find(logLines.begin(), logLines.end(), line);
  if (found == logLines.end()) return std::nullopt;
  return static_cast<std::size_t>(found - logLines.begin());
}

std::optional<std::int64_t> SynctoolRun::finalStatus() const {
  if (notifications.empty() || !notifications.back()["userInfo"].contains("TesselClientStatus"))
    return std::nullopt;
  return notifications.back()["userInfo"]["TesselClientStatus"].get<std::int64_t>();
}

std::optional<std::vector<std::string>> SynctoolRun::dataClassesSyncing() const {
  for (const Json& note : notifications) {
    if (note["userInfo"].contains("TesselClientDataClassSyncing"))
      return note["userInfo"]["TesselClientDataClassSyncing"].get<std::vector<std::string>>();
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
  return Json{{"name", "TesselClientSyncNotification"},
              {"object", std::string(sender)},
              {"userInfo", std::move(userInfo)}};
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

std::unique_ptr<tessel::Client> SynctoolTest::registerClient(std::string_view identifier,
                                                             bool contacts, bool calendars) {
  std::vector<std::string> entities;
  if (contacts) entities = ZTSyncManager::entitiesForContacts();
  if (calendars) {
    const auto& names = ZTSyncManager::entitiesForCalendars();
    entities.insert(entities.end(), names.begin(), names.end());
  }
  return store_->registerClient(identifier, "Zeto", entities);
}

void SynctoolTest::setPlayers(const std::vector<Player>& players) {
  Json list = Json::array();
  for (const Player& player : players) {
    Json entry = {{"id", player.id},
                  {"volume", (player.volume.empty() ? volume() : player.volume).string()},
                  {"mounted", player.mounted}};
    if (player.mountAfter) entry["mount_after"] = *player.mountAfter;
    if (player.checkpoint) entry["checkpoint"] = player.checkpoint->string();
    list.push_back(std::move(entry));
  }
  writeFile(folder() / "devices.json", list.dump(2));
}

void SynctoolTest::setDebugLog(bool on) {
  writeFile(folder() / "defaults.conf", std::string("DebugLog = ") + (on ? "true\n" : "false\n"));
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
  const char* bus = std::getenv("DBUS_SESSION_BUS_ADDRESS");
  if (useSessionBus_ && bus) env["DBUS_SESSION_BUS_ADDRESS"] = bus;
  for (const auto& [name, value] : overrides_) env[name] = value;
  return env;
}

SynctoolRun SynctoolTest::runSynctool(const std::vector<std::string>& arguments,
                                      const std::optional<KillAt>& watch) {
  const fs::path logPath = folder() / "log.txt", notesPath = folder() / "notes.jsonl";
  const std::string outPath = (folder() / "stderr.txt").string();
  std::error_code ignored;
  fs::remove(logPath, ignored);
  fs::remove(notesPath, ignored);
  // A watched run logs into a pipe whose read end is open before the tool opens the other end,
  // and file events are watched from before the start, so none is missed.
  int logPipe = -1, fileEvents = -1;
  if (watch && (::mkfifo(logPath.c_str(), 0600) != 0 ||
                (logPipe = ::open(logPath.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC)) < 0)) {
    ADD_FAILURE() << "cannot make the log pipe " << logPath;
  }
  if (watch && !watch->folder.empty() &&
      ((fileEvents = ::inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) < 0 ||
       ::inotify_add_watch(fileEvents, watch->folder.c_str(), watch->fileEvents) < 0)) {
    ADD_FAILURE() << "cannot watch " << watch->folder;
  }
  // Everything the child needs is made before the fork.
  std::vector<std::string> words = {ZETOSYNCTOOL_BINARY}, env;
  words.insert(words.end(), arguments.begin(), arguments.end());
  for (const auto& [name, value] : environment()) env.push_back(name + "=" + value);
  std::vector<char*> argv, envp;
  for (std::string& word : words) argv.push_back(word.data());
  for (std::string& entry : env) envp.push_back(entry.data());
  argv.push_back(nullptr);
  envp.push_back(nullptr);

  SynctoolRun run;
  const auto start = Clock::now();
  const pid_t pid = ::fork();
  if (pid == 0) {
    const int in = ::open("/dev/null", O_RDONLY);
    const int out = ::open(outPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    ::dup2(in, STDIN_FILENO);
    ::dup2(out, STDOUT_FILENO);
    ::dup2(out, STDERR_FILENO);
    ::execve(argv[0], argv.data(), envp.data());
    ::_exit(127);
  }
  std::optional<Clock::time_point> killTime;
  std::size_t events = 0;
  const auto readPipes = [&](Clock::time_point now) {
    char buffer[65536];
    for (ssize_t got; logPipe >= 0 && (got = ::read(logPipe, buffer, sizeof buffer)) > 0;) {
      run.log.append(buffer, static_cast<std::size_t>(got));
      for (ssize_t i = 0; i < got; ++i) {
        if (buffer[i] != '\n') continue;
        run.logLineSeconds.push_back(std::chrono::duration<double>(now - start).count());
        if (!killTime && run.logLineSeconds.size() == watch->logLine)
          killTime = now + after(watch->seconds);
      }
    }
    alignas(inotify_event) char eventBuffer[4096];
    for (ssize_t got; fileEvents >= 0 && (got = ::read(fileEvents, eventBuffer, 4096)) > 0;) {
      for (ssize_t at = 0; at < got;) {
        const auto* event = reinterpret_cast<const inotify_event*>(eventBuffer + at);
        if ((event->mask & watch->fileEvents) != 0 && ++events == watch->eventCount && !killTime)
          killTime = now + after(watch->seconds);
        at += static_cast<ssize_t>(sizeof(inotify_event) + event->len);
      }
    }
  };
  int status = 0;
  while (pid > 0 && ::waitpid(pid, &status, WNOHANG) != pid) {
    const auto now = Clock::now();
    readPipes(now);
    const bool due = killTime && now >= *killTime;
    if (due || now - start > kRunDeadline) {
      ::kill(pid, SIGKILL);
      ::waitpid(pid, &status, 0);
      if (!due) ADD_FAILURE() << "zetosynctool did not end in time and was killed";
      break;
    }
    // A watched run is followed closely: the last millisecond before the kill is spun through,
    // so the kill lands where it was aimed.
    pollfd ready[2] = {{logPipe, POLLIN, 0}, {fileEvents, POLLIN, 0}};
    if (logPipe < 0) {
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    } else {
      ::poll(ready, fileEvents >= 0 ? 2 : 1,
             killTime && *killTime - now < std::chrono::milliseconds(1) ? 0 : 1);
    }
  }
  readPipes(Clock::now());
  run.exitStatus = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
  run.seconds = std::chrono::duration<double>(Clock::now() - start).count();
  if (fileEvents >= 0) ::close(fileEvents);
  if (logPipe >= 0) {
    ::close(logPipe);
    fs::remove(logPath, ignored);
  } else {
    run.log = readFile(logPath);
  }
  run.logLines = splitLines(run.log);
  for (const std::string& line : splitLines(readFile(notesPath))) {
    if (line.empty()) continue;
    Json parsed = Json::parse(line, nullptr, false);
    // A killed run may leave its last line half written.
    if (parsed.is_discarded() && !watch) ADD_FAILURE() << "not a JSON notification: " << line;
    if (!parsed.is_discarded()) run.notifications.push_back(std::move(parsed));
  }
  return run;
}

zt::test_support::ProcessRun SynctoolTest::runTessel(const std::vector<std::string>& arguments) {
  zt::test_support::ProcessOptions options;
  options.environment = environment();
  std::vector<std::string> words = {TESSEL_BINARY, "--store",
                                    options.environment->at("TESSEL_STORE")};
  words.insert(words.end(), arguments.begin(), arguments.end());
  options.mergeErrorIntoOutput = true;
  return zt::test_support::runProcess(words, options);
}

void SynctoolTest::tessel(const std::vector<std::string>& arguments) {
  const zt::test_support::ProcessRun run = runTessel(arguments);
  EXPECT_EQ(run.status, 0) << "tessel " << ::testing::PrintToString(arguments) << ": " << run.out;
}

void SynctoolTest::putRecords(const std::vector<Json>& lines) {
  std::string text;
  for (const Json& line : lines) text += line.dump() + "\n";
  writeFile(folder() / "records.jsonl", text);
  tessel({"records", "put", (folder() / "records.jsonl").string()});
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
      for (platform::ZetoRef device : devices)
        if (library->ZetoGetUniqueID(device) == uniqueId) result = library->ZetoAquireLock(device);
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
