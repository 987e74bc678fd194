#include "platform/folder_handle.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <utility>

#include "platform/atomic_file.h"
#include "platform/error_text.h"

namespace zt::platform {
namespace {

constexpr int kFolderFlags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;

FileType typeOfMode(mode_t mode) {
  if (S_ISREG(mode)) return FileType::Regular;
  if (S_ISDIR(mode)) return FileType::Directory;
  if (S_ISLNK(mode)) return FileType::Link;
  return FileType::Other;
}

// statx gives the nanoseconds that the file system keeps; fstatat(2) is the fallback on
// kernels or sandboxes without statx.
std::variant<FileAttributes, int> readAttributes(int folder, const std::string& name) {
  struct statx info {};
  if (::statx(folder, name.c_str(), AT_SYMLINK_NOFOLLOW | AT_STATX_SYNC_AS_STAT,
              STATX_TYPE | STATX_SIZE | STATX_MTIME, &info) == 0) {
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
  if (::fstatat(folder, name.c_str(), &fallback, AT_SYMLINK_NOFOLLOW) != 0) return errno;
  FileAttributes attributes;
  attributes.type = typeOfMode(fallback.st_mode);
  attributes.size = static_cast<std::uint64_t>(fallback.st_size);
  attributes.modificationDate =
      CalendarDate(std::chrono::sys_seconds(std::chrono::seconds(fallback.st_mtim.tv_sec)),
                   TimeZone::gmt(), static_cast<std::uint32_t>(fallback.st_mtim.tv_nsec));
  return attributes;
}

// The names in the folder, or the error number. A descriptor of its own for "." gives the
// listing a fresh read position, whoever else lists the same folder.
std::variant<std::vector<std::string>, int> listNames(int folder) {
  const int fd = ::openat(folder, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (fd < 0) return errno;
  const std::unique_ptr<DIR, int (*)(DIR*)> directory(::fdopendir(fd), ::closedir);
  if (!directory) {
    const int error = errno;
    ::close(fd);
    return error;
  }
  std::vector<std::string> names;
  while (true) {
    errno = 0;
    const dirent* entry = ::readdir(directory.get());
    if (entry == nullptr) {
      if (errno != 0) return errno;
      break;
    }
    const std::string_view name = entry->d_name;
    if (name != "." && name != "..") names.emplace_back(name);
  }
  std::sort(names.begin(), names.end());
  return names;
}

// Removes `name` from the folder `folder` (known as `path`): anything but a real folder is
// unlinked, a real folder is opened without following links and emptied the same way first.
Result<void> removeEntry(int folder, const std::filesystem::path& path, const std::string& name) {
  const std::filesystem::path entryPath = path / name;
  if (::unlinkat(folder, name.c_str(), 0) == 0) return {};
  // unlink(2) refuses folders with EISDIR (EPERM on some file systems, where EPERM can also
  // be a refusal of the file itself).
  const int unlinkError = errno;
  if (unlinkError != EISDIR && unlinkError != EPERM)
    return errorText("remove", entryPath, unlinkError);
  const int child = ::openat(folder, name.c_str(), kFolderFlags);
  if (child < 0)
    return errorText("remove", entryPath, errno == ENOTDIR || errno == ELOOP ? unlinkError : errno);
  auto listing = listNames(child);
  Result<void> emptied;
  if (const int* error = std::get_if<int>(&listing)) {
    emptied = errorText("remove", entryPath, *error);
  } else {
    for (const std::string& inner : std::get<std::vector<std::string>>(listing)) {
      emptied = removeEntry(child, entryPath, inner);
      if (!emptied) break;
    }
  }
  ::close(child);
  if (!emptied) return emptied;
  if (::unlinkat(folder, name.c_str(), AT_REMOVEDIR) != 0)
    return errorText("remove", entryPath, errno);
  return {};
}

}  // namespace

Result<FolderHandle> FolderHandle::open(const std::filesystem::path& path) {
  const int fd = ::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (fd < 0) return errorText("open the folder", path, errno);
  return FolderHandle(path, fd);
}

FolderHandle::FolderHandle(std::filesystem::path path, int fd) : path_(std::move(path)), fd_(fd) {}

FolderHandle::FolderHandle(FolderHandle&& other) noexcept
    : path_(std::move(other.path_)), fd_(std::exchange(other.fd_, -1)) {}

FolderHandle& FolderHandle::operator=(FolderHandle&& other) noexcept {
  if (this != &other) {
    if (fd_ >= 0) ::close(fd_);
    path_ = std::move(other.path_);
    fd_ = std::exchange(other.fd_, -1);
  }
  return *this;
}

FolderHandle::~FolderHandle() {
  if (fd_ >= 0) ::close(fd_);
}

Result<FolderHandle> FolderHandle::openChild(const std::string& name, IfMissing ifMissing) const {
  const std::filesystem::path childPath = path_ / name;
  int fd = ::openat(fd_, name.c_str(), kFolderFlags);
  if (fd < 0 && errno == ENOENT && ifMissing == IfMissing::Create) {
    // Another process creating it meanwhile is fine; what it created is checked by the open.
    if (::mkdirat(fd_, name.c_str(), 0777) != 0 && errno != EEXIST)
      return errorText("create the folder", childPath, errno);
    fd = ::openat(fd_, name.c_str(), kFolderFlags);
  }
  if (fd < 0) return errorText("open the folder", childPath, errno);
  return FolderHandle(childPath, fd);
}

Result<std::vector<std::string>> FolderHandle::entries() const {
  auto listing = listNames(fd_);
  if (const int* error = std::get_if<int>(&listing))
    return errorText("list the folder", path_, *error);
  return std::get<std::vector<std::string>>(std::move(listing));
}

Result<FileAttributes> FolderHandle::attributes(const std::string& name) const {
  auto result = readAttributes(fd_, name);
  if (const int* error = std::get_if<int>(&result))
    return errorText("read the attributes of", path_ / name, *error);
  return std::get<FileAttributes>(std::move(result));
}

Result<void> FolderHandle::remove(const std::string& name) const {
  return removeEntry(fd_, path_, name);
}

Result<void> FolderHandle::atomicWrite(const std::string& name, std::span<const std::uint8_t> bytes,
                                       Durability durability) const {
  Result<AtomicFile> file = AtomicFile::create(*this, name);
  if (!file) return Error{file.error()};
  if (Result<void> written = file->write(bytes); !written) return written;
  return file->commit(durability);
}

Result<void> FolderHandle::sync() const {
  int error = ::fsync(fd_) == 0 ? 0 : errno;
  // Some file systems cannot fsync a folder at all; its renames are then as durable as they get.
  if (error == EINVAL || error == ENOTSUP) error = 0;
  if (error != 0) return errorText("flush", path_, error);
  return {};
}

Result<std::vector<std::uint8_t>> FolderHandle::readFile(const std::string& name,
                                                         std::size_t largest) const {
  const std::filesystem::path filePath = path_ / name;
  // O_NONBLOCK: a named pipe put in the file's place must not hang the open.
  const int fd = ::openat(fd_, name.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC | O_NONBLOCK);
  if (fd < 0) return errorText("read", filePath, errno);
  struct stat status {};
  Result<std::vector<std::uint8_t>> result = errorText("read", filePath, EINVAL);
  if (::fstat(fd, &status) != 0) {
    result = errorText("read", filePath, errno);
  } else if (!S_ISREG(status.st_mode)) {
    result = errorText("read", filePath, EINVAL);
  } else if (static_cast<std::uint64_t>(status.st_size) > largest) {
    result = errorText("read", filePath, EFBIG);
  } else {
    std::vector<std::uint8_t> bytes(static_cast<std::size_t>(status.st_size));
    std::size_t done = 0;
    while (done < bytes.size()) {
      const ssize_t got = ::read(fd, bytes.data() + done, bytes.size() - done);
      if (got < 0 && errno == EINTR) continue;
      if (got <= 0) break;
      done += static_cast<std::size_t>(got);
    }
    if (done == bytes.size()) {
      result = std::move(bytes);
    } else {
      result = errorText("read", filePath, EIO);
    }
  }
  ::close(fd);
  return result;
}

Result<void> FolderHandle::removeStaleTemporaries(const std::string& name) const {
  Result<std::vector<std::string>> listing = entries();
  if (!listing) return Error{listing.error()};
  for (const std::string& entry : *listing) {
    if (!AtomicFile::isTemporaryName(entry, name)) continue;
    auto attributes = readAttributes(fd_, entry);
    const auto* read = std::get_if<FileAttributes>(&attributes);
    if (!read || read->type != FileType::Regular) continue;
    if (::unlinkat(fd_, entry.c_str(), 0) != 0 && errno != ENOENT)
      return errorText("remove", path_ / entry, errno);
  }
  return {};
}

}  // namespace zt::platform
