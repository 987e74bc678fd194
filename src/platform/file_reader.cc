#include "platform/file_reader.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <utility>

#include "platform/error_text.h"

namespace zt::platform {

Result<FileReader> FileReader::open(const FolderHandle& folder, const std::string& name) {
  std::filesystem::path path = folder.path() / name;
  // O_NONBLOCK: a named pipe put in the file's place must not hang the open.
  const int fd =
      ::openat(folder.descriptor(), name.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC | O_NONBLOCK);
  if (fd < 0) return errorText("read", path, errno);
  struct stat status {};
  int error = 0;
  if (::fstat(fd, &status) != 0) {
    error = errno;
  } else if (!S_ISREG(status.st_mode)) {
    error = EINVAL;
  }
  if (error != 0) {
    ::close(fd);
    return errorText("read", path, error);
  }
  return FileReader(std::move(path), fd, static_cast<std::uint64_t>(status.st_size));
}

FileReader::FileReader(std::filesystem::path path, int fd, std::uint64_t size)
    : path_(std::move(path)), fd_(fd), size_(size) {}

FileReader::FileReader(FileReader&& other) noexcept
    : path_(std::move(other.path_)), fd_(std::exchange(other.fd_, -1)), size_(other.size_) {}

FileReader& FileReader::operator=(FileReader&& other) noexcept {
  if (this != &other) {
    if (fd_ >= 0) ::close(fd_);
    path_ = std::move(other.path_);
    fd_ = std::exchange(other.fd_, -1);
    size_ = other.size_;
  }
  return *this;
}

FileReader::~FileReader() {
  if (fd_ >= 0) ::close(fd_);
}

Result<void> FileReader::readAt(std::uint64_t offset, std::span<std::uint8_t> into) const {
  while (!into.empty()) {
    const ssize_t got = ::pread(fd_, into.data(), into.size(), static_cast<off_t>(offset));
    if (got < 0 && errno == EINTR) continue;
    if (got < 0) return errorText("read", path_, errno);
    if (got == 0) return errorText("read", path_, EIO);
    into = into.subspan(static_cast<std::size_t>(got));
    offset += static_cast<std::uint64_t>(got);
  }
  return {};
}

}  // namespace zt::platform
