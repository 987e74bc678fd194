#include "platform/linux/device_locks.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <utility>

#include "platform/device_library.h"
#include "platform/linux/unique_id.h"
#include "platform/log.h"

namespace zt::platform {
namespace {

// The lock folders are usually world-writable and sticky, so anyone may have put something
// under the name first. O_NOFOLLOW refuses a planted symbolic link; an existing file is
// opened read-only, which is all flock needs and which fs.protected_regular still allows on
// another user's file, where it refuses O_CREAT; O_NONBLOCK keeps a planted FIFO from
// hanging the open. A missing one is made with O_EXCL and made
// readable to all, so that every user's syncs can lock it.
int openLockFile(const std::string& path) {
  for (int attempt = 0; attempt < 8; ++attempt) {
    int fd = open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC);
    if (fd >= 0 || errno != ENOENT) return fd;
    fd =
        open(path.c_str(), O_RDONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, 0644);
    if (fd >= 0) {
      fchmod(fd, 0644);  // whatever the umask took away
      return fd;
    }
    if (errno != EEXIST) return -1;
    // Someone made it between the two opens: open theirs.
  }
  errno = EAGAIN;
  return -1;
}

bool isDirectory(const char* path) {
  struct stat info {};
  return stat(path, &info) == 0 && S_ISDIR(info.st_mode);
}

}  // namespace

DeviceLocks::DeviceLocks(std::string folder) : folder_(std::move(folder)) {}

DeviceLocks::~DeviceLocks() {
  for (const auto& [id, fd] : held_) close(fd);  // closing drops the flock
}

std::string DeviceLocks::machineFolder() {
  for (const char* folder : {"/run/lock", "/var/lock"}) {
    if (isDirectory(folder)) return folder;
  }
  return "/tmp";
}

std::string DeviceLocks::lockPathFor(std::uint64_t uniqueId) const {
  return folder_ + "/zeto-" + formatUniqueId(uniqueId) + ".lock";
}

std::int32_t DeviceLocks::acquire(std::uint64_t uniqueId) {
  if (holds(uniqueId)) return kZetoErrorLockBusy;
  std::string path = lockPathFor(uniqueId);
  int fd = openLockFile(path);
  if (fd < 0) {
    Log::debug("Can't open the lock file %s: %s", path, std::strerror(errno));
    return kZetoErrorFailed;
  }
  struct stat info {};
  if (fstat(fd, &info) != 0 || !S_ISREG(info.st_mode)) {
    // A FIFO or device planted under the name is no lock of ours.
    Log::debug("The lock file %s is not a regular file", path);
    close(fd);
    return kZetoErrorFailed;
  }
  if (flock(fd, LOCK_EX | LOCK_NB) != 0) {
    int error = errno;
    close(fd);
    if (error == EWOULDBLOCK) return kZetoErrorLockBusy;
    Log::debug("Can't lock %s: %s", path, std::strerror(error));
    return kZetoErrorFailed;
  }
  held_.emplace(uniqueId, fd);
  return kZetoSuccess;
}

std::int32_t DeviceLocks::release(std::uint64_t uniqueId) {
  auto it = held_.find(uniqueId);
  if (it == held_.end()) return kZetoErrorNotLocked;
  flock(it->second, LOCK_UN);
  close(it->second);
  held_.erase(it);
  return kZetoSuccess;
}

}  // namespace zt::platform
