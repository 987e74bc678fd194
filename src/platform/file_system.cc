#include "platform/file_system.h"

#include <sys/stat.h>
#include <sys/statfs.h>
#include <sys/sysmacros.h>

#include <cstdio>
#include <fstream>
#include <sstream>
#include <system_error>

namespace zt::platform {
namespace {

// mountinfo escapes blanks, tabs, new lines and backslashes in paths as \ooo.
std::string unescapeMountPath(const std::string& text) {
  std::string result;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '\\' && i + 3 < text.size()) {
      const std::string digits = text.substr(i + 1, 3);
      if (digits.find_first_not_of("01234567") == std::string::npos) {
        result += static_cast<char>(std::stoi(digits, nullptr, 8));
        i += 3;
        continue;
      }
    }
    result += text[i];
  }
  return result;
}

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
  std::ifstream mountinfo("/proc/self/mountinfo");
  std::optional<std::string> best;
  std::size_t bestLength = 0;
  for (std::string line; std::getline(mountinfo, line);) {
    std::istringstream fields(line);
    std::string id, parent, majorMinor, root, mountPoint;
    fields >> id >> parent >> majorMinor >> root >> mountPoint;
    const std::size_t separator = line.find(" - ");
    if (separator == std::string::npos) continue;
    std::istringstream tail(line.substr(separator + 3));
    std::string type, source;
    tail >> type >> source;
    unsigned major = 0, minor = 0;
    if (std::sscanf(majorMinor.c_str(), "%u:%u", &major, &minor) != 2) continue;
    if (makedev(major, minor) != device) continue;
    mountPoint = unescapeMountPath(mountPoint);
    if (!isWithin(canonical, mountPoint) || mountPoint.size() < bestLength) continue;
    bestLength = mountPoint.size();
    best = unescapeMountPath(source);
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
