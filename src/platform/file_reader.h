#pragma once

#include <cstdint>
#include <filesystem>
#include <span>
#include <string>

#include "platform/folder_handle.h"
#include "platform/result.h"

namespace zt::platform {

// A regular file of a folder opened for reading at any offset, never through a symbolic link,
// so that a large file is read a piece at a time. Reads may come from several threads at once.
class FileReader {
 public:
  // The regular file `name` in `folder`; an error for a link or anything but a regular file.
  static Result<FileReader> open(const FolderHandle& folder, const std::string& name);

  FileReader(FileReader&& other) noexcept;
  FileReader& operator=(FileReader&& other) noexcept;
  FileReader(const FileReader&) = delete;
  FileReader& operator=(const FileReader&) = delete;
  ~FileReader();

  // The file's size when it was opened.
  std::uint64_t size() const { return size_; }
  // Fills all of `into` from `offset`; an error when the file ends first.
  Result<void> readAt(std::uint64_t offset, std::span<std::uint8_t> into) const;

 private:
  FileReader(std::filesystem::path path, int fd, std::uint64_t size);

  std::filesystem::path path_;
  int fd_ = -1;
  std::uint64_t size_ = 0;
};

}  // namespace zt::platform
