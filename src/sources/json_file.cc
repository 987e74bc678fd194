#include "sources/json_file.h"

#include <cstdint>
#include <system_error>

#include "platform/folder_handle.h"

namespace tessel::sources {

namespace {
// Both files are a few kilobytes; a larger one is not ours.
constexpr std::size_t kLargest = std::size_t{16} << 20;
}  // namespace

zt::platform::Result<std::optional<nlohmann::json>> readJsonFile(
    const std::filesystem::path& file) {
  std::error_code error;
  if (!std::filesystem::exists(file, error)) return std::optional<nlohmann::json>();
  auto folder = zt::platform::FolderHandle::open(file.parent_path());
  if (!folder) return zt::platform::Error{folder.error()};
  auto bytes = folder->readFile(file.filename().string(), kLargest);
  if (!bytes) return zt::platform::Error{bytes.error()};
  nlohmann::json parsed = nlohmann::json::parse(bytes->begin(), bytes->end(), nullptr, false);
  if (parsed.is_discarded() || !parsed.is_object())
    return zt::platform::Error{file.string() + " is not a JSON object; fix or remove it"};
  return std::optional<nlohmann::json>(std::move(parsed));
}

zt::platform::Result<void> writeJsonFile(const std::filesystem::path& file,
                                         const nlohmann::json& content) {
  std::error_code error;
  std::filesystem::create_directories(file.parent_path(), error);
  if (error)
    return zt::platform::Error{"cannot create " + file.parent_path().string() + ": " +
                               error.message()};
  auto folder = zt::platform::FolderHandle::open(file.parent_path());
  if (!folder) return zt::platform::Error{folder.error()};
  const std::string text = content.dump(2) + '\n';
  const auto* begin = reinterpret_cast<const std::uint8_t*>(text.data());
  return folder->atomicWrite(file.filename().string(), {begin, text.size()});
}

}  // namespace tessel::sources
