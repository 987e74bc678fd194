#pragma once

#include <map>
#include <optional>
#include <string>
#include <vector>

namespace zt::test_support {

// What one run of a program gave.
struct ProcessRun {
  int status = -1;  // exit status, 128 + signal when it was killed
  std::string out;
  std::string err;  // empty when standard error went with standard output
};

struct ProcessOptions {
  std::string input;  // on standard input
  // The whole environment of the program; none: this process's.
  std::optional<std::map<std::string, std::string>> environment;
  bool mergeErrorIntoOutput = false;
  int deadlineSeconds = 50;  // killed after that, and the test fails
};

// Runs `words` (the program's path first) and waits for it.
ProcessRun runProcess(const std::vector<std::string>& words, const ProcessOptions& options = {});

// A program started in the background, its standard output into a file; waited for at the
// latest when the object goes.
class BackgroundProcess {
 public:
  explicit BackgroundProcess(const std::vector<std::string>& words);
  ~BackgroundProcess();
  BackgroundProcess(const BackgroundProcess&) = delete;
  BackgroundProcess& operator=(const BackgroundProcess&) = delete;

  bool started() const { return pid_ > 0; }
  // Waits for the end (at most `deadlineSeconds`, then kills it): the exit status and output.
  ProcessRun wait(int deadlineSeconds = 50);

 private:
  int pid_ = -1;
  std::string outPath_;
};

}  // namespace zt::test_support
