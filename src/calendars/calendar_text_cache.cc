#include "calendars/calendar_text_cache.h"

#include <cstring>
#include <string_view>

#include "platform/sha256.h"
#include "platform/user_cache.h"

namespace zt::calendars {

namespace {

// An entry: the magic, the key, the text's length (8 bytes, little-endian), then the text.
constexpr std::string_view kMagic = "ZTCALTX1";
constexpr std::size_t kHeaderSize = kMagic.size() + 32 + 8;

}  // namespace

std::unique_ptr<CalendarTextCache> CalendarTextCache::openUserCache() {
  platform::Result<platform::FolderHandle> folder = platform::openUserCacheFolder("calendars");
  if (!folder) return nullptr;
  return std::unique_ptr<CalendarTextCache>(new CalendarTextCache(std::move(folder).value()));
}

CalendarTextCache::CalendarTextCache(platform::FolderHandle folder) : folder_(std::move(folder)) {}

std::optional<std::vector<std::uint8_t>> CalendarTextCache::find(const Key& key) {
  const std::string name = platform::hexOf(key);
  std::optional<std::vector<std::uint8_t>> entry =
      folder_.readFile(name, kHeaderSize + kSizeCap).valueOrNone();
  if (!entry || entry->size() < kHeaderSize ||
      std::memcmp(entry->data(), kMagic.data(), kMagic.size()) != 0 ||
      std::memcmp(entry->data() + kMagic.size(), key.data(), key.size()) != 0) {
    return std::nullopt;
  }
  std::uint64_t length = 0;
  for (int i = 0; i < 8; ++i) {
    length |= std::uint64_t{(*entry)[kMagic.size() + key.size() + i]} << (8 * i);
  }
  // A file cut short (a crash before its data reached the disk) is no entry.
  if (length != entry->size() - kHeaderSize) return std::nullopt;
  used_.insert(name);
  // The text is moved to the front in place: no second buffer of the calendar's size.
  entry->erase(entry->begin(), entry->begin() + kHeaderSize);
  return entry;
}

void CalendarTextCache::store(const Key& key, std::span<const std::uint8_t> text) {
  if (text.size() > kSizeCap) return;
  std::vector<std::uint8_t> entry;
  entry.reserve(kHeaderSize + text.size());
  entry.insert(entry.end(), kMagic.begin(), kMagic.end());
  entry.insert(entry.end(), key.begin(), key.end());
  for (int i = 0; i < 8; ++i) entry.push_back(static_cast<std::uint8_t>(text.size() >> (8 * i)));
  entry.insert(entry.end(), text.begin(), text.end());
  const std::string name = platform::hexOf(key);
  // Synced before it is named: after a crash a file system may keep the length of an unsynced
  // file but not its bytes, and the length check would then pass over zeros.
  if (folder_.atomicWrite(name, entry, platform::Durability::Synced)) used_.insert(name);
}

void CalendarTextCache::prune() {
  platform::Result<std::vector<std::string>> listed = folder_.entries();
  if (listed) {
    std::uint64_t total = 0;
    for (const std::string& name : *listed) {
      // Removal is best effort: what stays is tried again at the next run.
      if (!platform::isHexDigest(name)) {
        if (name.starts_with('.') && name.find(".tmp") != std::string::npos)
          (void)folder_.remove(name);
        continue;
      }
      if (!used_.contains(name)) {
        (void)folder_.remove(name);
        continue;
      }
      platform::Result<platform::FileAttributes> file = folder_.attributes(name);
      if (!file) continue;
      if (total + file->size > kSizeCap) {
        (void)folder_.remove(name);
        continue;
      }
      total += file->size;
    }
  }
  used_.clear();
}

}  // namespace zt::calendars
