#include "platform/atomic_file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <fstream>
#include <string_view>
#include <utility>

#include "platform/error_text.h"

namespace zt::platform {
namespace {

constexpr std::size_t kMaximumNameLength = 255;
constexpr std::string_view kTemporarySuffix = ".tmp";
constexpr std::string_view kUniqueSuffix = "XXXXXX";

// ".<name>.tmpXXXXXX". A name close to the limit is shortened (at a UTF-8 character
// boundary) so that every name the target itself may have still gets a temporary file.
std::string temporaryTemplate(const std::string& name) {
  const std::size_t room = kMaximumNameLength - 1 - kTemporarySuffix.size() - kUniqueSuffix.size();
  std::size_t length = std::min(name.size(), room);
  while (length > 0 && length < name.size() &&
         (static_cast<unsigned char>(name[length]) & 0xC0) == 0x80)
    --length;
  return "." + name.substr(0, length) + std::string(kTemporarySuffix) + std::string(kUniqueSuffix);
}

// The mode a plainly created file would get. umask(2) cannot be read without changing it,
// which would race with other threads, so it is read from /proc.
mode_t defaultFileMode() {
  mode_t mask = 022;
  std::ifstream status("/proc/self/status");
  for (std::string line; std::getline(status, line);) {
    if (line.rfind("Umask:", 0) == 0) {
      mask = static_cast<mode_t>(std::strtoul(line.c_str() + 6, nullptr, 8));
      break;
    }
  }
  return static_cast<mode_t>(0666 & ~mask);
}

std::filesystem::path folderOf(const std::filesystem::path& target) {
  const std::filesystem::path parent = target.parent_path();
  return parent.empty() ? std::filesystem::path(".") : parent;
}

}  // namespace

std::variant<AtomicFile, std::string> AtomicFile::create(const std::filesystem::path& target) {
  const std::filesystem::path folder = folderOf(target);
  std::string pattern = (folder / temporaryTemplate(target.filename().string())).string();
  const int fd = ::mkostemp(pattern.data(), O_CLOEXEC);
  if (fd < 0) return errorText("create a temporary file for", target, errno);
  // mkstemp makes the file private (0600); the target gets the usual permissions. File
  // systems without permissions (FAT on players) refuse, which does not matter.
  (void)::fchmod(fd, defaultFileMode());
  return AtomicFile(target, pattern, fd);
}

AtomicFile::AtomicFile(std::filesystem::path target, std::filesystem::path temporary, int fd)
    : target_(std::move(target)), temporary_(std::move(temporary)), fd_(fd) {}

AtomicFile::AtomicFile(AtomicFile&& other) noexcept
    : target_(std::move(other.target_)),
      temporary_(std::exchange(other.temporary_, {})),
      fd_(std::exchange(other.fd_, -1)) {}

AtomicFile& AtomicFile::operator=(AtomicFile&& other) noexcept {
  if (this != &other) {
    discard();
    target_ = std::move(other.target_);
    temporary_ = std::exchange(other.temporary_, {});
    fd_ = std::exchange(other.fd_, -1);
  }
  return *this;
}

AtomicFile::~AtomicFile() {
  discard();
}

void AtomicFile::discard() {
  if (fd_ >= 0) ::close(fd_);
  fd_ = -1;
  if (!temporary_.empty()) ::unlink(temporary_.c_str());
  temporary_.clear();
}

std::optional<std::string> AtomicFile::write(std::span<const std::uint8_t> bytes) {
  if (fd_ < 0) return errorText("write", target_, EBADF);
  while (!bytes.empty()) {
    const ssize_t written = ::write(fd_, bytes.data(), bytes.size());
    if (written < 0) {
      if (errno == EINTR) continue;
      const int error = errno;
      discard();
      return errorText("write", target_, error);
    }
    bytes = bytes.subspan(static_cast<std::size_t>(written));
  }
  return std::nullopt;
}

std::optional<std::string> AtomicFile::commit() {
  if (fd_ < 0) return errorText("write", target_, EBADF);
  // Durable content first: otherwise a crash after the rename could leave an empty file
  // under the target's name.
  if (::fsync(fd_) != 0) {
    const int error = errno;
    discard();
    return errorText("write", target_, error);
  }
  // close() of a network or FUSE file can report a deferred write error.
  const int closed = ::close(std::exchange(fd_, -1));
  if (closed != 0 && errno != EINTR) {
    const int error = errno;
    discard();
    return errorText("write", target_, error);
  }
  if (::rename(temporary_.c_str(), target_.c_str()) != 0) {
    const int error = errno;
    discard();
    return errorText("replace", target_, error);
  }
  temporary_.clear();

  const std::filesystem::path folder = folderOf(target_);
  const int folderFd = ::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (folderFd < 0) return errorText("open the folder of", target_, errno);
  int error = ::fsync(folderFd) == 0 ? 0 : errno;
  ::close(folderFd);
  // Some file systems cannot fsync a folder at all; the rename is then as durable as they get.
  if (error == EINVAL || error == ENOTSUP) error = 0;
  if (error != 0) return errorText("flush the folder of", target_, error);
  return std::nullopt;
}

}  // namespace zt::platform
