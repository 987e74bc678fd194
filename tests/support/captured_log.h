#pragma once

#include <algorithm>
#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "platform/log.h"
#include "support/files.h"
#include "support/scoped_environment.h"
#include "support/temporary_folder.h"

namespace zt::test_support {

// Sends the process's log to a file of its own for the life of the object, debug lines
// included unless `debug` is false, and reads back what was written since.
class CapturedLog {
 public:
  explicit CapturedLog(bool debug = true) : wasEnabled_(platform::Log::debugEnabled()) {
    environment_.set("ZETOSYNCTOOL_LOG", path().string());
    platform::Log::configureFromEnvironment();
    platform::Log::setDebugEnabled(debug);
  }
  ~CapturedLog() {
    platform::Log::setDebugEnabled(wasEnabled_);
    environment_.unset("ZETOSYNCTOOL_LOG");
    platform::Log::configureFromEnvironment();
  }
  CapturedLog(const CapturedLog&) = delete;
  CapturedLog& operator=(const CapturedLog&) = delete;

  fs::path path() const { return folder_ / "log"; }
  std::string text() const { return readFile(path()); }
  std::vector<std::string> lines() const { return splitLines(text()); }
  std::size_t count(std::string_view line) const {
    const std::vector<std::string> all = lines();
    return static_cast<std::size_t>(std::count(all.begin(), all.end(), line));
  }
  bool has(std::string_view line) const { return count(line) > 0; }
  std::string last() const {
    const std::vector<std::string> all = lines();
    return all.empty() ? std::string() : all.back();
  }

 private:
  TemporaryFolder folder_;
  ScopedEnvironment environment_;
  bool wasEnabled_;
};

}  // namespace zt::test_support
