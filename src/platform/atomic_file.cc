#include "platform/atomic_file.h"

#include <fcntl.h>
#include <sys/random.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "platform/error_text.h"

namespace zt::platform {
namespace {

constexpr std::size_t kMaximumNameLength = 255;
constexpr std::string_view kTemporarySuffix = ".tmp";
constexpr std::size_t kUniqueLength = 6;
// The characters mkstemp(3) uses for its XXXXXX.
constexpr std::string_view kUniqueCharacters =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789";
// As glibc's mkstemp: enough that only a full folder or a broken random source exhausts them.
constexpr int kAttempts = 62 * 62 * 62;

// ".<name>.tmp". A name close to the limit is shortened (at a UTF-8 character boundary) so
// that every name the target itself may have still gets a temporary file.
std::string temporaryPrefix(const std::string& name) {
  const std::size_t room = kMaximumNameLength - 1 - kTemporarySuffix.size() - kUniqueLength;
  std::size_t length = std::min(name.size(), room);
  while (length > 0 && length < name.size() &&
         (static_cast<unsigned char>(name[length]) & 0xC0) == 0x80)
    --length;
  return "." + name.substr(0, length) + std::string(kTemporarySuffix);
}

std::string uniqueCharacters() {
  unsigned char random[kUniqueLength] = {};
  std::size_t filled = 0;
  while (filled < sizeof random) {
    const ssize_t got = ::getrandom(random + filled, sizeof random - filled, 0);
    if (got > 0)
      filled += static_cast<std::size_t>(got);
    else if (errno != EINTR)
      break;  // the bytes left as they are still make a name
  }
  std::string text;
  for (unsigned char byte : random) text += kUniqueCharacters[byte % kUniqueCharacters.size()];
  return text;
}

}  // namespace

bool AtomicFile::isTemporaryName(std::string_view entry, const std::string& name) {
  const std::string prefix = temporaryPrefix(name);
  return entry.size() == prefix.size() + kUniqueLength && entry.starts_with(prefix) &&
         entry.substr(prefix.size()).find_first_not_of(kUniqueCharacters) == std::string::npos;
}

Result<AtomicFile> AtomicFile::create(const FolderHandle& folder, const std::string& name) {
  const std::filesystem::path target = folder.path() / name;
  const int folderFd = ::fcntl(folder.descriptor(), F_DUPFD_CLOEXEC, 0);
  if (folderFd < 0) return errorText("create a temporary file for", target, errno);
  const std::string prefix = temporaryPrefix(name);
  int error = EEXIST;
  for (int attempt = 0; attempt < kAttempts && error == EEXIST; ++attempt) {
    std::string temporary = prefix + uniqueCharacters();
    // The umask applies to 0666 as to any new file; file systems without permissions (FAT on
    // players) ignore it.
    const int fd = ::openat(folderFd, temporary.c_str(),
                            O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0666);
    if (fd >= 0) return AtomicFile(folderFd, folder.path(), name, std::move(temporary), fd);
    error = errno;
  }
  ::close(folderFd);
  return errorText("create a temporary file for", target, error);
}

AtomicFile::AtomicFile(int folderFd, std::filesystem::path folderPath, std::string name,
                       std::string temporary, int fd)
    : folderFd_(folderFd),
      folderPath_(std::move(folderPath)),
      name_(std::move(name)),
      temporary_(std::move(temporary)),
      fd_(fd) {}

AtomicFile::AtomicFile(AtomicFile&& other) noexcept
    : folderFd_(std::exchange(other.folderFd_, -1)),
      folderPath_(std::move(other.folderPath_)),
      name_(std::move(other.name_)),
      temporary_(std::exchange(other.temporary_, {})),
      fd_(std::exchange(other.fd_, -1)) {}

AtomicFile& AtomicFile::operator=(AtomicFile&& other) noexcept {
  if (this != &other) {
    discard();
    if (folderFd_ >= 0) ::close(folderFd_);
    folderFd_ = std::exchange(other.folderFd_, -1);
    folderPath_ = std::move(other.folderPath_);
    name_ = std::move(other.name_);
    temporary_ = std::exchange(other.temporary_, {});
    fd_ = std::exchange(other.fd_, -1);
  }
  return *this;
}

AtomicFile::~AtomicFile() {
  discard();
  if (folderFd_ >= 0) ::close(folderFd_);
}

void AtomicFile::discard() {
  if (fd_ >= 0) ::close(fd_);
  fd_ = -1;
  if (!temporary_.empty()) ::unlinkat(folderFd_, temporary_.c_str(), 0);
  temporary_.clear();
}

Result<void> AtomicFile::write(std::span<const std::uint8_t> bytes) {
  if (fd_ < 0) return errorText("write", target(), EBADF);
  while (!bytes.empty()) {
    const ssize_t written = ::write(fd_, bytes.data(), bytes.size());
    if (written < 0) {
      if (errno == EINTR) continue;
      const int error = errno;
      discard();
      return errorText("write", target(), error);
    }
    bytes = bytes.subspan(static_cast<std::size_t>(written));
  }
  return {};
}

Result<void> AtomicFile::commit(Durability durability) {
  if (fd_ < 0) return errorText("write", target(), EBADF);
  // Durable content first: otherwise a crash after the rename could leave an empty file
  // under the target's name.
  if (durability != Durability::Unsynced && ::fsync(fd_) != 0) {
    const int error = errno;
    discard();
    return errorText("write", target(), error);
  }
  // close() of a network or FUSE file can report a deferred write error.
  const int closed = ::close(std::exchange(fd_, -1));
  if (closed != 0 && errno != EINTR) {
    const int error = errno;
    discard();
    return errorText("write", target(), error);
  }
  if (::renameat(folderFd_, temporary_.c_str(), folderFd_, name_.c_str()) != 0) {
    const int error = errno;
    discard();
    return errorText("replace", target(), error);
  }
  temporary_.clear();

  if (durability != Durability::Synced) return {};
  int error = ::fsync(folderFd_) == 0 ? 0 : errno;
  // Some file systems cannot fsync a folder at all; the rename is then as durable as they get.
  if (error == EINVAL || error == ENOTSUP) error = 0;
  if (error != 0) return errorText("flush the folder of", target(), error);
  return {};
}

}  // namespace zt::platform
