#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <span>
#include <string>
#include <variant>

namespace zt::platform {

// A new content for a file, prepared beside it and put in place in one step.
//
// The content goes to a temporary file in the target's folder (".<name>.tmpXXXXXX", so the
// rename never crosses file systems), which commit() fsyncs, renames over the target and
// follows with an fsync of the folder, so the new name survives a power loss too. Until
// commit() succeeds the target is untouched; the destructor removes an uncommitted temporary
// file and never commits, so an early return or an exception leaves nothing behind.
class AtomicFile {
 public:
  // Creates the temporary file, or answers why it cannot be created.
  static std::variant<AtomicFile, std::string> create(const std::filesystem::path& target);

  AtomicFile(AtomicFile&& other) noexcept;
  AtomicFile& operator=(AtomicFile&& other) noexcept;
  AtomicFile(const AtomicFile&) = delete;
  AtomicFile& operator=(const AtomicFile&) = delete;
  ~AtomicFile();

  // Appends all of `bytes` (short and interrupted writes are continued).
  std::optional<std::string> write(std::span<const std::uint8_t> bytes);
  // Puts the written content in place. After a failure the temporary file is gone and the
  // target holds its old content, unless only the final fsync of the folder failed.
  std::optional<std::string> commit();

  const std::filesystem::path& target() const { return target_; }
  const std::filesystem::path& temporaryPath() const { return temporary_; }

 private:
  AtomicFile(std::filesystem::path target, std::filesystem::path temporary, int fd);
  void discard();

  std::filesystem::path target_;
  std::filesystem::path temporary_;
  int fd_ = -1;
};

}  // namespace zt::platform
