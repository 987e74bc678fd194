#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <span>
#include <string>
#include <variant>
#include <vector>

#include "platform/calendar_date.h"
#include "platform/result.h"

namespace zt::platform {

// What a name in a folder is. A symbolic link is a Link, whatever it points to.
enum class FileType { Regular, Directory, Link, Other };

struct FileAttributes {
  FileType type = FileType::Other;
  std::uint64_t size = 0;
  // Read at full precision, in GMT, so a date stored earlier compares equal to the one read
  // from the untouched file later; absent when the file system keeps none.
  std::optional<CalendarDate> modificationDate;
};

enum class IfMissing { Create, Fail };

// Whether a replaced file must survive a power loss (fsync of the file and its folder), or
// may be lost to one, as an entry of a cache may. FolderLater syncs the file before the
// rename and leaves the folder to one FolderHandle::sync() after the last of several files:
// until then a power loss may lose a rename, never leave half a file.
enum class Durability { Synced, Unsynced, FolderLater };

// One open folder, and every operation on the names in it made relative to its descriptor
// (openat(2), mkdirat(2), renameat(2), unlinkat(2), statx(2) with AT_SYMLINK_NOFOLLOW).
// Once open, the folder cannot be redirected: renaming it or putting a symbolic link in its
// place leaves the handle on the folder it opened, and no operation follows a link found in
// it. Names are single path components. Every failure is answered with a human-readable
// description naming the path and the system's reason ("Cannot remove /v/Calendars/x: ...").
class FolderHandle {
 public:
  // Opens the folder at `path`, following links on the way: this is the place the system
  // chose (a volume's mount point), not a name found on the volume.
  static Result<FolderHandle> open(const std::filesystem::path& path);

  FolderHandle(FolderHandle&& other) noexcept;
  FolderHandle& operator=(FolderHandle&& other) noexcept;
  FolderHandle(const FolderHandle&) = delete;
  FolderHandle& operator=(const FolderHandle&) = delete;
  ~FolderHandle();

  // The folder `name` in this one, never through a symbolic link (O_DIRECTORY|O_NOFOLLOW).
  // With IfMissing::Create a missing folder is created first.
  Result<FolderHandle> openChild(const std::string& name, IfMissing ifMissing) const;

  // The names of the entries (dot files included, "." and ".." not), sorted by byte value.
  Result<std::vector<std::string>> entries() const;
  // Type, size and modification date of the entry itself, a link not followed.
  Result<FileAttributes> attributes(const std::string& name) const;
  // Removes the entry: a link as a link, a folder with everything in it, descending only into
  // real folders.
  Result<void> remove(const std::string& name) const;

  // Replaces the file `name` with `bytes` so that readers, and the device after a power
  // loss, see either the old content or the whole new one (see AtomicFile). On failure the
  // old file is untouched and no temporary file is left.
  Result<void> atomicWrite(const std::string& name, std::span<const std::uint8_t> bytes,
                           Durability durability = Durability::Synced) const;
  // Makes the renames and removals done in the folder so far survive a power loss (fsync of
  // the folder; a file system that cannot sync a folder counts as done).
  Result<void> sync() const;
  // The content of the regular file `name`, never through a link; an error for anything else
  // and for a file larger than `largest` bytes.
  Result<std::vector<std::uint8_t>> readFile(const std::string& name, std::size_t largest) const;
  // Removes the regular files that an interrupted atomicWrite of `name` left behind. Only the
  // caller can know that no other writer of `name` is at work.
  Result<void> removeStaleTemporaries(const std::string& name) const;

  // The path the folder was opened by, for messages and logs.
  const std::filesystem::path& path() const { return path_; }
  // The folder's own descriptor, for the operations of AtomicFile; owned by the handle.
  int descriptor() const { return fd_; }

 private:
  FolderHandle(std::filesystem::path path, int fd);

  std::filesystem::path path_;
  int fd_ = -1;
};

}  // namespace zt::platform
