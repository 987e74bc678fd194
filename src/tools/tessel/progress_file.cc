#include "tools/tessel/progress_file.h"

#include <cstdio>
#include <cstdlib>
#include <random>
#include <system_error>
#include <utility>

namespace tessel::cli {

namespace fs = std::filesystem;

zt::platform::Result<ProgressFile> ProgressFile::open() {
  const char* shared = std::getenv("TESSEL_NOTIFICATIONS_LOG");
  if (shared != nullptr && *shared != '\0') return ProgressFile(shared, Ownership::Shared);
  // The runtime folder is the user's own and lives in memory: the right place for a file that
  // lives as long as one command.
  const char* runtime = std::getenv("XDG_RUNTIME_DIR");
  std::error_code error;
  const fs::path folder = runtime != nullptr && fs::is_directory(runtime, error)
                              ? fs::path(runtime)
                              : fs::temp_directory_path(error);
  std::random_device random;
  for (int attempt = 0; attempt < 8; ++attempt) {
    const fs::path path = folder / ("tessel-sync-" + std::to_string(random()) + ".jsonl");
    // "x": made here or not at all, so no file of somebody else's is ever taken over.
    if (std::FILE* file = std::fopen(path.c_str(), "wx")) {
      std::fclose(file);
      return ProgressFile(path, Ownership::Own);
    }
  }
  return zt::platform::Error{"cannot make a file for the progress of the sync in " +
                             folder.string()};
}

ProgressFile::ProgressFile(fs::path path, Ownership ownership)
    : path_(std::move(path)), ownership_(ownership) {}

ProgressFile::ProgressFile(ProgressFile&& other) noexcept
    : path_(std::move(other.path_)), ownership_(other.ownership_) {
  other.ownership_ = Ownership::Shared;
}

ProgressFile::~ProgressFile() {
  std::error_code ignored;
  if (ownership_ == Ownership::Own) fs::remove(path_, ignored);
}

std::map<std::string, std::string> ProgressFile::environment() const {
  if (ownership_ == Ownership::Shared) return {};
  return {{"TESSEL_NOTIFICATIONS_LOG", path_.string()}};
}

}  // namespace tessel::cli
