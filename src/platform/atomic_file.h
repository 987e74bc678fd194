#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <variant>

#include "platform/folder_handle.h"
#include "platform/result.h"

namespace zt::platform {

// A new content for a file, prepared beside it and put in place in one step.
//
// The content goes to a temporary file in the target's folder (".<name>.tmpXXXXXX", so the
// rename never crosses file systems), created relative to the folder's descriptor with
// O_CREAT|O_EXCL|O_NOFOLLOW. commit() fsyncs it, renames it over the target with renameat(2)
// and follows with an fsync of the folder, so the new name survives a power loss too. Until
// commit() succeeds the target is untouched; the destructor removes an uncommitted temporary
// file and never commits, so an early return or an exception leaves nothing behind.
class AtomicFile {
 public:
  // Creates the temporary file for `name` in `folder`, or answers why it cannot be created.
  // The file keeps its own descriptor of the folder: the handle may go first.
  static Result<AtomicFile> create(const FolderHandle& folder, const std::string& name);

  // Whether `entry` is a name create() may give a temporary file for `name`.
  static bool isTemporaryName(std::string_view entry, const std::string& name);

  AtomicFile(AtomicFile&& other) noexcept;
  AtomicFile& operator=(AtomicFile&& other) noexcept;
  AtomicFile(const AtomicFile&) = delete;
  AtomicFile& operator=(const AtomicFile&) = delete;
  ~AtomicFile();

  // Appends all of `bytes` (short and interrupted writes are continued).
  Result<void> write(std::span<const std::uint8_t> bytes);
  // Puts the written content in place. After a failure the temporary file is gone and the
  // target holds its old content, unless only the final fsync of the folder failed.
  Result<void> commit(Durability durability = Durability::Synced);

  std::filesystem::path target() const { return folderPath_ / name_; }
  std::filesystem::path temporaryPath() const { return folderPath_ / temporary_; }

 private:
  AtomicFile(int folderFd, std::filesystem::path folderPath, std::string name,
             std::string temporary, int fd);
  void discard();

  int folderFd_ = -1;
  std::filesystem::path folderPath_;
  std::string name_;
  std::string temporary_;
  int fd_ = -1;
};

}  // namespace zt::platform
