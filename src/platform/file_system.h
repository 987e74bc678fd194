#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <span>
#include <string>
#include <variant>
#include <vector>

#include "platform/calendar_date.h"

namespace zt::platform {

enum class Intermediates { Create, DoNotCreate };

enum class FileType { Regular, Directory, Other };

struct FileSystemStatistics {
  std::uint64_t type = 0;  // the f_type magic number
  std::uint64_t blockSize = 0;
  std::uint64_t totalBlocks = 0;
  std::uint64_t freeBlocks = 0;
  std::uint64_t availableBlocks = 0;  // to an unprivileged user
  std::uint64_t totalNodes = 0;
  std::uint64_t freeNodes = 0;
  // The source of the mount that holds the path ("/dev/sdb1"), from /proc/self/mountinfo.
  std::optional<std::string> mountedFrom;
};

struct FileAttributes {
  FileType type = FileType::Other;
  std::uint64_t size = 0;
  // Read at full precision, in GMT; absent when the file system keeps none.
  std::optional<CalendarDate> modificationDate;
};

// The file operations of a sync, on real folders: a player's volume, real or virtual, is a
// mounted folder either way. Every failure is answered with a human-readable description
// that names the path and the system's reason ("Cannot create the folder /v/Contacts: Not a
// directory"). Symbolic links are followed except by exists() and remove().
class FileSystem {
 public:
  std::optional<FileSystemStatistics> statistics(const std::filesystem::path& mountPath) const;

  // Whether anything, even a dangling symbolic link, is at the path.
  bool exists(const std::filesystem::path& path) const;
  bool isDirectory(const std::filesystem::path& path) const;
  bool isRegularFile(const std::filesystem::path& path) const;

  // Creates the folder with default permissions. With Intermediates::Create missing parent
  // folders are created too and an existing folder is success; with DoNotCreate the parent
  // must exist and the folder must not. Answers the failure's description, nothing on success.
  std::optional<std::string> createDirectory(const std::filesystem::path& path,
                                             Intermediates intermediates) const;

  // The names of the folder's entries (dot files included), sorted by byte value.
  std::variant<std::vector<std::string>, std::string> contentsOfDirectory(
      const std::filesystem::path& folder) const;

  // Removes a file, a link, or a folder with everything in it.
  std::optional<std::string> remove(const std::filesystem::path& path) const;

  // Type, size and modification date, or the description of why they cannot be read.
  std::variant<FileAttributes, std::string> attributes(const std::filesystem::path& path) const;
  // The modification date to the nanosecond, so a date stored earlier compares equal to the
  // one read from the untouched file later.
  std::optional<CalendarDate> modificationDate(const std::filesystem::path& path) const;

  // Replaces the file at `path` with `bytes` so that readers, and the device after a power
  // loss, see either the old content or the whole new one (see AtomicFile). On failure the
  // old file is untouched and no temporary file is left.
  std::optional<std::string> atomicWrite(const std::filesystem::path& path,
                                         std::span<const std::uint8_t> bytes) const;
};

}  // namespace zt::platform
