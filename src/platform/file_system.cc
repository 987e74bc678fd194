#include "platform/file_system.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statfs.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <memory>
#include <system_error>

#include "platform/atomic_file.h"
#include "platform/error_text.h"
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

FileType typeOfMode(mode_t mode) {
  if (S_ISREG(mode)) return FileType::Regular;
  if (S_ISDIR(mode)) return FileType::Directory;
  return FileType::Other;
}

// statx gives the nanoseconds that the file system keeps; stat(2) is the fallback on kernels
// or sandboxes without statx.
std::variant<FileAttributes, int> readAttributes(const std::filesystem::path& path) {
  struct statx info {};
  if (::statx(AT_FDCWD, path.c_str(), AT_STATX_SYNC_AS_STAT, STATX_TYPE | STATX_SIZE | STATX_MTIME,
              &info) == 0) {
    FileAttributes attributes;
    attributes.type = typeOfMode(info.stx_mode);
    attributes.size = info.stx_size;
    if (info.stx_mask & STATX_MTIME)
      attributes.modificationDate =
          CalendarDate(std::chrono::sys_seconds(std::chrono::seconds(info.stx_mtime.tv_sec)),
                       TimeZone::gmt(), info.stx_mtime.tv_nsec);
    return attributes;
  }
  if (errno != ENOSYS && errno != EPERM) return errno;
  struct stat fallback {};
  if (::stat(path.c_str(), &fallback) != 0) return errno;
  FileAttributes attributes;
  attributes.type = typeOfMode(fallback.st_mode);
  attributes.size = static_cast<std::uint64_t>(fallback.st_size);
  attributes.modificationDate =
      CalendarDate(std::chrono::sys_seconds(std::chrono::seconds(fallback.st_mtim.tv_sec)),
                   TimeZone::gmt(), static_cast<std::uint32_t>(fallback.st_mtim.tv_nsec));
  return attributes;
}

bool hasMode(const std::filesystem::path& path, mode_t type) {
  struct stat info {};
  return ::stat(path.c_str(), &info) == 0 && (info.st_mode & S_IFMT) == type;
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

bool FileSystem::exists(const std::filesystem::path& path) const {
  struct stat info {};
  return ::lstat(path.c_str(), &info) == 0;
}

bool FileSystem::isDirectory(const std::filesystem::path& path) const {
  return hasMode(path, S_IFDIR);
}

bool FileSystem::isRegularFile(const std::filesystem::path& path) const {
  return hasMode(path, S_IFREG);
}

std::optional<std::string> FileSystem::createDirectory(const std::filesystem::path& path,
                                                       Intermediates intermediates) const {
  if (intermediates == Intermediates::DoNotCreate) {
    if (::mkdir(path.c_str(), 0777) != 0) return errorText("create the folder", path, errno);
    return std::nullopt;
  }
  // Each level in turn, from the top: a level that exists must be a folder (or a link to
  // one), and a level that appears meanwhile (another process) is fine.
  std::vector<std::filesystem::path> components;
  for (const auto& component : path.lexically_normal())
    if (!component.empty()) components.push_back(component);
  std::filesystem::path level;
  for (std::size_t i = 0; i < components.size(); ++i) {
    level /= components[i];
    if (components[i] == "/" || isDirectory(level)) continue;
    if (::mkdir(level.c_str(), 0777) == 0) continue;
    int error = errno;
    if (error == EEXIST && isDirectory(level)) continue;
    // A file in place of a parent folder: the path cannot lead anywhere.
    if (error == EEXIST && i + 1 < components.size()) error = ENOTDIR;
    return errorText("create the folder", path, error);
  }
  return std::nullopt;
}

std::variant<std::vector<std::string>, std::string> FileSystem::contentsOfDirectory(
    const std::filesystem::path& folder) const {
  const std::unique_ptr<DIR, int (*)(DIR*)> directory(::opendir(folder.c_str()), ::closedir);
  if (!directory) return errorText("list the folder", folder, errno);
  std::vector<std::string> names;
  while (true) {
    errno = 0;
    const dirent* entry = ::readdir(directory.get());
    if (entry == nullptr) {
      if (errno != 0) return errorText("list the folder", folder, errno);
      break;
    }
    const std::string_view name = entry->d_name;
    if (name != "." && name != "..") names.emplace_back(name);
  }
  std::sort(names.begin(), names.end());
  return names;
}

std::optional<std::string> FileSystem::remove(const std::filesystem::path& path) const {
  std::error_code error;
  std::filesystem::remove_all(path, error);
  if (error) return errorText("remove", path, error.value());
  return std::nullopt;
}

std::variant<FileAttributes, std::string> FileSystem::attributes(
    const std::filesystem::path& path) const {
  auto result = readAttributes(path);
  if (const int* error = std::get_if<int>(&result))
    return errorText("read the attributes of", path, *error);
  return std::get<FileAttributes>(std::move(result));
}

std::optional<CalendarDate> FileSystem::modificationDate(const std::filesystem::path& path) const {
  auto result = readAttributes(path);
  if (auto* attributes = std::get_if<FileAttributes>(&result))
    return std::move(attributes->modificationDate);
  return std::nullopt;
}

std::optional<std::string> FileSystem::atomicWrite(const std::filesystem::path& path,
                                                   std::span<const std::uint8_t> bytes) const {
  auto created = AtomicFile::create(path);
  if (auto* error = std::get_if<std::string>(&created)) return std::move(*error);
  AtomicFile& file = std::get<AtomicFile>(created);
  if (auto error = file.write(bytes)) return error;
  return file.commit();
}

}  // namespace zt::platform
