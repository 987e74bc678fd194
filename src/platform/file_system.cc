#include "platform/file_system.h"

#include <sys/stat.h>
#include <sys/statfs.h>
#include <sys/sysmacros.h>

#include <cstdio>
#include <system_error>

#include "platform/linux/mount_info.h"

namespace zt::platform {
namespace {

bool isWithin(const std::string& path, const std::string& mountPoint) {
  if (mountPoint == "/") return true;
  return path.rfind(mountPoint, 0) == 0 &&
         (path.size() == mountPoint.size() || path[mountPoint.size()] == '/');
}

// The source of the innermost mount that holds `path` and is the file system it lives on.
// Several mounts can share a device number (bind mounts, btrfs subvolumes), hence the
// additional test on the mount point; the last of equal matches is the one on top.
std::optional<std::string> mountSource(const std::filesystem::path& path, dev_t device) {
  std::error_code error;
  const std::string canonical = std::filesystem::canonical(path, error).string();
  if (error) return std::nullopt;
  const std::optional<std::string> table = readMountInfo();
  if (!table) return std::nullopt;
  std::optional<std::string> best;
  std::size_t bestLength = 0;
  for (const MountInfoEntry& mount : parseMountInfo(*table)) {
    if (makedev(mount.major, mount.minor) != device) continue;
    if (!isWithin(canonical, mount.mountPoint) || mount.mountPoint.size() < bestLength) continue;
    bestLength = mount.mountPoint.size();
    best = mount.source;
  }
  return best;
}

}  // namespace

std::optional<FileSystemStatistics> FileSystem::statistics(
    const std::filesystem::path& mountPath) const {
  struct statfs fs {};
  struct stat info {};
  if (::statfs(mountPath.c_str(), &fs) != 0 || ::stat(mountPath.c_str(), &info) != 0)
    return std::nullopt;
  FileSystemStatistics statistics;
  statistics.type = static_cast<std::uint64_t>(fs.f_type);
  statistics.blockSize = static_cast<std::uint64_t>(fs.f_bsize);
  statistics.totalBlocks = fs.f_blocks;
  statistics.freeBlocks = fs.f_bfree;
  statistics.availableBlocks = fs.f_bavail;
  statistics.totalNodes = fs.f_files;
  statistics.freeNodes = fs.f_ffree;
  statistics.mountedFrom = mountSource(mountPath, info.st_dev);
  return statistics;
}

}  // namespace zt::platform
