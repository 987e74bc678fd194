#pragma once

#include <chrono>
#include <filesystem>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/result.h"

namespace zt::platform {

// How a child process ended: its exit status, or the signal that killed it.
struct ChildExit {
  enum class Kind { Exited, Killed };
  Kind kind = Kind::Exited;
  int code = 0;  // the exit status, or the signal's number
};

// Another program run from this one, sharing its standard input and output; its standard error
// comes through a pipe, so that the caller decides where and when the text shows (a live
// progress line on the same terminal would otherwise be torn apart by it).
class ChildProcess {
 public:
  // Starts `program` with `arguments` (without the program's name) and this process's
  // environment, with `environment` set over it.
  static Result<ChildProcess> start(const std::filesystem::path& program,
                                    const std::vector<std::string>& arguments,
                                    const std::map<std::string, std::string>& environment);

  ChildProcess(ChildProcess&& other) noexcept;
  ChildProcess& operator=(ChildProcess&&) = delete;
  ChildProcess(const ChildProcess&) = delete;
  ChildProcess& operator=(const ChildProcess&) = delete;
  // Waits for the child when it still runs: a sync is never cut short by its caller's end.
  ~ChildProcess();

  // What the child wrote on standard error since the last call, waiting up to `timeout` for
  // something to come; empty when nothing came.
  std::string readError(std::chrono::milliseconds timeout);

  // How the child ended, once it has; nothing while it runs. Never waits.
  std::optional<ChildExit> ended();

 private:
  ChildProcess(int pid, int errorPipe) : pid_(pid), errorPipe_(errorPipe) {}

  int pid_ = -1;
  int errorPipe_ = -1;
  std::optional<ChildExit> exit_;
};

// Where the program `name` is: beside the running program first (an installed tool finds its
// companion in the same folder, whatever PATH says), then in the folders of $PATH.
std::optional<std::filesystem::path> findProgram(std::string_view name);

}  // namespace zt::platform
