#include "platform/child_process.h"

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <system_error>
#include <thread>

extern char** environ;

namespace zt::platform {

namespace {

std::vector<char*> pointers(std::vector<std::string>& words) {
  std::vector<char*> result;
  for (std::string& word : words) result.push_back(word.data());
  result.push_back(nullptr);
  return result;
}

// This process's environment with `overrides` set over it.
std::vector<std::string> mergedEnvironment(const std::map<std::string, std::string>& overrides) {
  std::vector<std::string> merged;
  for (char** entry = environ; *entry != nullptr; ++entry) {
    const std::string_view text(*entry);
    const std::string name(text.substr(0, text.find('=')));
    if (!overrides.contains(name)) merged.emplace_back(text);
  }
  for (const auto& [name, value] : overrides) merged.push_back(name + "=" + value);
  return merged;
}

bool isExecutableFile(const std::filesystem::path& path) {
  std::error_code error;
  return std::filesystem::is_regular_file(path, error) && ::access(path.c_str(), X_OK) == 0;
}

}  // namespace

Result<ChildProcess> ChildProcess::start(const std::filesystem::path& program,
                                         const std::vector<std::string>& arguments,
                                         const std::map<std::string, std::string>& environment) {
  int errorPipe[2];
  if (::pipe2(errorPipe, O_CLOEXEC) != 0) {
    return Error{"cannot make a pipe: " + std::string(std::strerror(errno))};
  }
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  // dup2 clears close-on-exec on the child's descriptor 2; both pipe ends close at exec.
  posix_spawn_file_actions_adddup2(&actions, errorPipe[1], STDERR_FILENO);

  std::vector<std::string> argv = {program.string()};
  argv.insert(argv.end(), arguments.begin(), arguments.end());
  std::vector<std::string> envp = mergedEnvironment(environment);
  std::vector<char*> argvPointers = pointers(argv), envpPointers = pointers(envp);
  pid_t pid = 0;
  const int failure = posix_spawn(&pid, program.c_str(), &actions, nullptr, argvPointers.data(),
                                  envpPointers.data());
  posix_spawn_file_actions_destroy(&actions);
  ::close(errorPipe[1]);
  if (failure != 0) {
    ::close(errorPipe[0]);
    return Error{"cannot run " + program.string() + ": " + std::strerror(failure)};
  }
  return ChildProcess(pid, errorPipe[0]);
}

ChildProcess::ChildProcess(ChildProcess&& other) noexcept
    : pid_(other.pid_), errorPipe_(other.errorPipe_), exit_(other.exit_) {
  other.pid_ = -1;
  other.errorPipe_ = -1;
}

ChildProcess::~ChildProcess() {
  if (errorPipe_ >= 0) ::close(errorPipe_);
  if (pid_ > 0 && !exit_) {
    int status = 0;
    while (::waitpid(pid_, &status, 0) < 0 && errno == EINTR) {
    }
  }
}

std::string ChildProcess::readError(std::chrono::milliseconds timeout) {
  if (errorPipe_ < 0) {
    // The child closed its standard error (it ends soon): only the waiting is left to do.
    std::this_thread::sleep_for(timeout);
    return {};
  }
  pollfd ready{errorPipe_, POLLIN, 0};
  if (::poll(&ready, 1, static_cast<int>(timeout.count())) <= 0) return {};
  char buffer[4096];
  const ssize_t count = ::read(errorPipe_, buffer, sizeof buffer);
  if (count < 0 && errno == EINTR) return {};
  if (count <= 0) {
    ::close(errorPipe_);
    errorPipe_ = -1;
    return {};
  }
  return std::string(buffer, static_cast<std::size_t>(count));
}

std::optional<ChildExit> ChildProcess::ended() {
  if (exit_ || pid_ <= 0) return exit_;
  int status = 0;
  if (::waitpid(pid_, &status, WNOHANG) != pid_) return std::nullopt;
  exit_ = WIFSIGNALED(status) ? ChildExit{ChildExit::Kind::Killed, WTERMSIG(status)}
                              : ChildExit{ChildExit::Kind::Exited, WEXITSTATUS(status)};
  return exit_;
}

std::optional<std::filesystem::path> findProgram(std::string_view name) {
  std::error_code error;
  const std::filesystem::path self = std::filesystem::read_symlink("/proc/self/exe", error);
  if (!error && isExecutableFile(self.parent_path() / name)) return self.parent_path() / name;
  const char* path = std::getenv("PATH");
  if (path == nullptr) return std::nullopt;
  std::string_view folders(path);
  while (!folders.empty()) {
    const std::size_t colon = folders.find(':');
    const std::string_view folder = folders.substr(0, colon);
    // An empty entry is the current folder, by the shell's old rule.
    const std::filesystem::path candidate =
        std::filesystem::path(folder.empty() ? "." : std::string(folder)) / name;
    if (isExecutableFile(candidate)) return candidate;
    if (colon == std::string_view::npos) break;
    folders.remove_prefix(colon + 1);
  }
  return std::nullopt;
}

}  // namespace zt::platform
