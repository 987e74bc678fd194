#include "support/process.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <thread>

#include "support/files.h"
#include "support/temporary_folder.h"

extern char** environ;

namespace zt::test_support {

namespace {

std::vector<char*> pointers(std::vector<std::string>& words) {
  std::vector<char*> result;
  for (std::string& word : words) result.push_back(word.data());
  result.push_back(nullptr);
  return result;
}

int waitWithDeadline(pid_t pid, int deadlineSeconds, const std::string& name) {
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(deadlineSeconds);
  int status = 0;
  while (::waitpid(pid, &status, WNOHANG) != pid) {
    if (std::chrono::steady_clock::now() > deadline) {
      ::kill(pid, SIGKILL);
      ::waitpid(pid, &status, 0);
      ADD_FAILURE() << name << " did not end in time and was killed";
      break;
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
  }
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

}  // namespace

ProcessRun runProcess(const std::vector<std::string>& words, const ProcessOptions& options) {
  TemporaryFolder folder;
  const fs::path in = folder / "in", out = folder / "out", err = folder / "err";
  writeFile(in, options.input);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, 0, in.c_str(), O_RDONLY, 0);
  posix_spawn_file_actions_addopen(&actions, 1, out.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
  if (options.mergeErrorIntoOutput) {
    posix_spawn_file_actions_adddup2(&actions, 1, 2);
  } else {
    posix_spawn_file_actions_addopen(&actions, 2, err.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
  }
  std::vector<std::string> argv = words, envp;
  if (options.environment)
    for (const auto& [name, value] : *options.environment) envp.push_back(name + "=" + value);
  std::vector<char*> argvPointers = pointers(argv), envpPointers = pointers(envp);
  ProcessRun run;
  pid_t pid = 0;
  if (posix_spawn(&pid, argvPointers[0], &actions, nullptr, argvPointers.data(),
                  options.environment ? envpPointers.data() : environ) == 0) {
    run.status = waitWithDeadline(pid, options.deadlineSeconds, words[0]);
  } else {
    ADD_FAILURE() << "cannot start " << words[0];
  }
  posix_spawn_file_actions_destroy(&actions);
  run.out = readFile(out);
  run.err = readFile(err);
  return run;
}

BackgroundProcess::BackgroundProcess(const std::vector<std::string>& words) {
  outPath_ = (fs::temp_directory_path() / ("zt-background-" + std::to_string(::getpid()) + "-" +
                                           std::to_string(reinterpret_cast<std::uintptr_t>(this))))
                 .string();
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, 1, outPath_.c_str(), O_WRONLY | O_CREAT | O_TRUNC,
                                   0644);
  std::vector<std::string> argv = words;
  std::vector<char*> argvPointers = pointers(argv);
  pid_t pid = 0;
  if (posix_spawn(&pid, argvPointers[0], &actions, nullptr, argvPointers.data(), environ) == 0)
    pid_ = pid;
  posix_spawn_file_actions_destroy(&actions);
}

ProcessRun BackgroundProcess::wait(int deadlineSeconds) {
  ProcessRun run;
  if (pid_ <= 0) return run;
  run.status = waitWithDeadline(pid_, deadlineSeconds, "background process");
  pid_ = -1;
  run.out = readFile(outPath_);
  return run;
}

BackgroundProcess::~BackgroundProcess() {
  if (pid_ > 0) {
    ::kill(pid_, SIGKILL);
    int status = 0;
    ::waitpid(pid_, &status, 0);
  }
  std::error_code ignored;
  fs::remove(outPath_, ignored);
}

}  // namespace zt::test_support
