#include "platform/identity.h"

#include <elf.h>
#include <fcntl.h>
#include <link.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <string_view>

namespace zt::platform {

namespace {

// Where the OS time-zone database keeps its rules in one file; the zone files beside it come
// from the same package update.
constexpr const char* kTimeZoneRules = "/usr/share/zoneinfo/tzdata.zi";

std::string hex(const unsigned char* bytes, std::size_t size) {
  static constexpr char kDigits[] = "0123456789abcdef";
  std::string text;
  text.reserve(2 * size);
  for (std::size_t i = 0; i < size; ++i) {
    text += kDigits[bytes[i] >> 4];
    text += kDigits[bytes[i] & 0xF];
  }
  return text;
}

// The NT_GNU_BUILD_ID note of the first object dl_iterate_phdr reports: the program itself.
int findBuildId(dl_phdr_info* info, std::size_t /*size*/, void* data) {
  auto* found = static_cast<std::string*>(data);
  for (ElfW(Half) i = 0; i < info->dlpi_phnum; ++i) {
    const ElfW(Phdr)& header = info->dlpi_phdr[i];
    if (header.p_type != PT_NOTE) continue;
    const auto* at = reinterpret_cast<const unsigned char*>(info->dlpi_addr + header.p_vaddr);
    const unsigned char* end = at + header.p_memsz;
    // ELF notes: name size, description size, type, then name and description, each padded
    // to four bytes.
    while (at + sizeof(ElfW(Nhdr)) <= end) {
      ElfW(Nhdr) note;
      std::memcpy(&note, at, sizeof note);
      const unsigned char* name = at + sizeof note;
      const unsigned char* description = name + ((note.n_namesz + 3) & ~3u);
      const unsigned char* next = description + ((note.n_descsz + 3) & ~3u);
      if (next > end) break;
      if (note.n_type == NT_GNU_BUILD_ID && note.n_namesz == 4 &&
          std::memcmp(name, "GNU", 4) == 0 && note.n_descsz > 0) {
        *found = hex(description, note.n_descsz);
        return 1;
      }
      at = next;
    }
  }
  return 1;  // only the program itself is asked
}

Result<struct statx> fileStatus(const char* path) {
  struct statx status {};
  if (statx(AT_FDCWD, path, 0, STATX_INO | STATX_BTIME | STATX_SIZE | STATX_MTIME, &status) != 0) {
    return Error{std::string("Cannot read the status of ") + path + ": " + std::strerror(errno)};
  }
  if (!(status.stx_mask & STATX_BTIME)) {
    return Error{std::string("The file system of ") + path + " keeps no birth time"};
  }
  return status;
}

std::string placement(const struct statx& status) {
  return std::to_string(status.stx_dev_major) + ":" + std::to_string(status.stx_dev_minor) + ":" +
         std::to_string(status.stx_ino) + ":" + std::to_string(status.stx_btime.tv_sec) + "." +
         std::to_string(status.stx_btime.tv_nsec);
}

// A setting file's identity with its size and modification time, or "none" when missing.
std::string settingFile(const char* path) {
  struct statx status {};
  if (statx(AT_FDCWD, path, AT_SYMLINK_NOFOLLOW, STATX_INO | STATX_SIZE | STATX_MTIME | STATX_TYPE,
            &status) != 0) {
    return "none";
  }
  std::string text =
      std::to_string(status.stx_dev_major) + ":" + std::to_string(status.stx_dev_minor) + ":" +
      std::to_string(status.stx_ino) + ":" + std::to_string(status.stx_size) + ":" +
      std::to_string(status.stx_mtime.tv_sec) + "." + std::to_string(status.stx_mtime.tv_nsec);
  if (S_ISLNK(status.stx_mode)) {
    char target[4096];
    const ssize_t length = ::readlink(path, target, sizeof target);
    if (length > 0) text += ">" + std::string(target, static_cast<std::size_t>(length));
  }
  return text;
}

}  // namespace

Result<std::string> localTimeZoneSettingIdentity() {
  const char* tz = std::getenv("TZ");
  return std::string("TZ=") + (tz ? "set:" + std::string(tz) : "unset") +
         ";localtime=" + settingFile("/etc/localtime") +
         ";timezone=" + settingFile("/etc/timezone");
}

Result<std::string> programBuildIdentity() {
  static const std::string identity = [] {
    std::string found;
    dl_iterate_phdr(findBuildId, &found);
    return found;
  }();
  if (identity.empty()) return Error{"The program carries no build ID"};
  return identity;
}

Result<std::string> fileIdentity(const std::filesystem::path& path) {
  Result<struct statx> status = fileStatus(path.c_str());
  if (!status) return Error{status.error()};
  return placement(*status);
}

Result<std::string> timeZoneDatabaseIdentity() {
  Result<struct statx> status = fileStatus(kTimeZoneRules);
  if (!status) return Error{status.error()};
  return placement(*status) + ":" + std::to_string(status->stx_size) + ":" +
         std::to_string(status->stx_mtime.tv_sec) + "." + std::to_string(status->stx_mtime.tv_nsec);
}

}  // namespace zt::platform
