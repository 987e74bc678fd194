#include "platform/linux/device_locks.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "platform/device_library.h"
#include "platform/linux/unique_id.h"
#include "platform/log.h"

namespace zt::platform {
namespace {

bool usableFolder(const std::string& path) {
  if (mkdir(path.c_str(), 0700) == 0) return true;
  struct stat info {};
  return errno == EEXIST && stat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

}  // namespace

DeviceLocks::~DeviceLocks() {
  for (const auto& [id, fd] : held_) close(fd);  // closing drops the flock
}

std::string DeviceLocks::lockPathFor(std::uint64_t uniqueId) {
  const char* runtime = std::getenv("XDG_RUNTIME_DIR");
  if (runtime && *runtime) {
    std::string folder = std::string(runtime) + "/zeto";
    if (usableFolder(folder)) return folder + "/" + formatUniqueId(uniqueId) + ".lock";
  }
  return "/run/lock/zeto-" + formatUniqueId(uniqueId) + ".lock";
}

std::int32_t DeviceLocks::acquire(std::uint64_t uniqueId) {
  if (holds(uniqueId)) return kZetoErrorLockBusy;
  std::string path = lockPathFor(uniqueId);
  int fd = open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644);
  if (fd < 0) {
    Log::debug("Can't open the lock file %s: %s", path, std::strerror(errno));
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
