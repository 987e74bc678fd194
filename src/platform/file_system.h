#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <variant>

#include "platform/folder_handle.h"

namespace zt::platform {

struct FileSystemStatistics {
  std::uint64_t type = 0;  // the f_type magic number
  std::uint64_t blockSize = 0;
  std::uint64_t totalBlocks = 0;
  std::uint64_t freeBlocks = 0;
  std::uint64_t availableBlocks = 0;  // to an unprivileged user
  std::uint64_t totalNodes = 0;
  std::uint64_t freeNodes = 0;
  // The source of the mount that holds the path ("/dev/sdb1"), from /proc/self/mountinfo.
  std::optional<std::string> mountedFrom;
};

// The way into the files of a sync, on real folders: a player's volume, real or virtual, is
// a mounted folder either way. Everything on the volume goes through the FolderHandle of its
// mount point, so that nothing found on the volume can lead the sync elsewhere.
class FileSystem {
 public:
  std::optional<FileSystemStatistics> statistics(const std::filesystem::path& mountPath) const;

  // The folder at `path` (a volume's mount point), or the description of why it cannot be
  // opened.
  Result<FolderHandle> openFolder(const std::filesystem::path& path) const {
    return FolderHandle::open(path);
  }
};

}  // namespace zt::platform
