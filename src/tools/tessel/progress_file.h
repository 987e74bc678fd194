#pragma once

#include <filesystem>
#include <map>
#include <string>

#include "platform/result.h"

namespace tessel::cli {

// The notifications log that zetosynctool writes while `tessel sync` follows it:
// $TESSEL_NOTIFICATIONS_LOG, which others may follow too, or else a file of this run's own in
// $XDG_RUNTIME_DIR (or the temporary folder), removed when this object goes.
class ProgressFile {
 public:
  static zt::platform::Result<ProgressFile> open();

  ProgressFile(ProgressFile&& other) noexcept;
  ProgressFile(const ProgressFile&) = delete;
  ProgressFile& operator=(const ProgressFile&) = delete;
  ProgressFile& operator=(ProgressFile&&) = delete;
  ~ProgressFile();

  const std::filesystem::path& path() const { return path_; }
  // What the tool's environment needs so that it writes here.
  std::map<std::string, std::string> environment() const;

 private:
  enum class Ownership { Shared, Own };
  ProgressFile(std::filesystem::path path, Ownership ownership);

  std::filesystem::path path_;
  Ownership ownership_;
};

}  // namespace tessel::cli
