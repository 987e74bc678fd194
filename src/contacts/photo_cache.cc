#include "contacts/photo_cache.h"

#include <atomic>
#include <cstring>
#include <string_view>
#include <vector>

#include "contacts/contact_photo.h"
#include "platform/sha256.h"
#include "platform/user_cache.h"

namespace zt::contacts {

namespace {

// An entry: the magic, the key, the outcome, width, height, factor bits, the re-encoded size,
// the length of the embedded bytes, then those bytes; numbers little-endian.
constexpr std::string_view kMagic = "ZTPHOTO1";
constexpr std::size_t kHeaderSize = kMagic.size() + 32 + 1 + 4 + 4 + 4 + 8 + 8;
// Far above any 256 x 256 JPEG: a larger file is no entry.
constexpr std::size_t kLargestEntry = std::size_t{4} << 20;

void putNumber(platform::Data& out, std::uint64_t value, int bytes) {
  for (int i = 0; i < bytes; ++i) out.push_back(static_cast<std::uint8_t>(value >> (8 * i)));
}

std::uint64_t getNumber(const std::uint8_t*& at, int bytes) {
  std::uint64_t value = 0;
  for (int i = 0; i < bytes; ++i) value |= std::uint64_t{at[i]} << (8 * i);
  at += bytes;
  return value;
}

std::string nameOf(const PhotoKey& key) {
  static constexpr char kHex[] = "0123456789abcdef";
  std::string name;
  for (std::uint8_t byte : key) {
    name += kHex[byte >> 4];
    name += kHex[byte & 0xF];
  }
  return name;
}

bool isEntryName(std::string_view name) {
  return name.size() == 64 && name.find_first_not_of("0123456789abcdef") == std::string::npos;
}

platform::Data encode(const PhotoKey& key, const PhotoConversion& conversion) {
  platform::Data out;
  out.reserve(kHeaderSize + conversion.reduced.size());
  for (char c : kMagic) out.push_back(static_cast<std::uint8_t>(c));
  for (std::uint8_t byte : key) out.push_back(byte);
  putNumber(out, static_cast<std::uint8_t>(conversion.outcome), 1);
  putNumber(out, static_cast<std::uint32_t>(conversion.extent.width), 4);
  putNumber(out, static_cast<std::uint32_t>(conversion.extent.height), 4);
  std::uint32_t factorBits = 0;
  std::memcpy(&factorBits, &conversion.factor, sizeof factorBits);
  putNumber(out, factorBits, 4);
  putNumber(out, conversion.reducedSize, 8);
  putNumber(out, conversion.reduced.size(), 8);
  out.insert(out.end(), conversion.reduced.begin(), conversion.reduced.end());
  return out;
}

std::optional<PhotoConversion> decode(const PhotoKey& key, const platform::Data& entry) {
  if (entry.size() < kHeaderSize || std::memcmp(entry.data(), kMagic.data(), kMagic.size()) != 0 ||
      std::memcmp(entry.data() + kMagic.size(), key.data(), key.size()) != 0) {
    return std::nullopt;
  }
  const std::uint8_t* at = entry.data() + kMagic.size() + key.size();
  PhotoConversion conversion;
  const auto outcome = getNumber(at, 1);
  if (outcome < 1 || outcome > static_cast<std::uint8_t>(PhotoConversion::Outcome::Reduced)) {
    return std::nullopt;
  }
  conversion.outcome = static_cast<PhotoConversion::Outcome>(outcome);
  conversion.extent.width = static_cast<int>(static_cast<std::uint32_t>(getNumber(at, 4)));
  conversion.extent.height = static_cast<int>(static_cast<std::uint32_t>(getNumber(at, 4)));
  const auto factorBits = static_cast<std::uint32_t>(getNumber(at, 4));
  std::memcpy(&conversion.factor, &factorBits, sizeof factorBits);
  conversion.reducedSize = getNumber(at, 8);
  const std::uint64_t length = getNumber(at, 8);
  const bool reduced = conversion.outcome == PhotoConversion::Outcome::Reduced;
  if (length != entry.size() - kHeaderSize || (reduced && length != conversion.reducedSize) ||
      (!reduced && length != 0) || !isLasting(conversion)) {
    return std::nullopt;
  }
  conversion.reduced.assign(at, at + length);
  return conversion;
}

}  // namespace

bool isLasting(const PhotoConversion& conversion) {
  using Outcome = PhotoConversion::Outcome;
  return conversion.outcome == Outcome::Invalid || conversion.outcome == Outcome::Larger ||
         conversion.outcome == Outcome::Reduced;
}

std::unique_ptr<PhotoCache> PhotoCache::openUserCache() {
  platform::Result<platform::FolderHandle> photos = platform::openUserCacheFolder("photos");
  if (!photos) return nullptr;
  return std::unique_ptr<PhotoCache>(new PhotoCache(std::move(photos).value(), kDefaultSizeCap));
}

std::unique_ptr<PhotoCache> PhotoCache::open(const std::filesystem::path& folder,
                                             std::uint64_t sizeCap) {
  platform::Result<platform::FolderHandle> parent =
      platform::FolderHandle::open(folder.parent_path());
  if (!parent) return nullptr;
  platform::Result<platform::FolderHandle> photos =
      parent->openChild(folder.filename().string(), platform::IfMissing::Create);
  if (!photos) return nullptr;
  return std::unique_ptr<PhotoCache>(new PhotoCache(std::move(photos).value(), sizeCap));
}

PhotoCache::PhotoCache(platform::FolderHandle folder, std::uint64_t sizeCap)
    : folder_(std::move(folder)), sizeCap_(sizeCap) {}

PhotoKey PhotoCache::keyFor(std::span<const std::uint8_t> picture) {
  // Everything the conversion depends on besides the bytes: its version, the side and the
  // threshold, and the libvips (and so JPEG encoder) it was built with.
  std::string context = "zetosynctool photo\n" + std::to_string(kConversionVersion) + "\n" +
                        std::to_string(ContactPhotoPreparation::kSide) + "\n" +
                        std::to_string(ContactPhotoPreparation::kLargestEmbeddedJPEG) + "\n" +
                        std::string(platform::imageServiceIdentity()) + "\n";
  platform::Sha256 digest;
  digest.update(context);
  digest.update(picture);
  return digest.finish();
}

void PhotoCache::touch(const std::string& name) {
  std::lock_guard lock(mutex_);
  used_.insert(name);
}

std::optional<PhotoConversion> PhotoCache::find(const PhotoKey& key) {
  const std::string name = nameOf(key);
  // A cache entry is small; anything else in its place is no entry.
  std::optional<platform::Data> entry = folder_.readFile(name, kLargestEntry).valueOrNone();
  if (!entry) return std::nullopt;
  std::optional<PhotoConversion> conversion = decode(key, *entry);
  if (conversion) touch(name);
  return conversion;
}

void PhotoCache::store(const PhotoKey& key, const PhotoConversion& conversion) {
  if (!isLasting(conversion)) return;
  const std::string name = nameOf(key);
  // No fsync: an entry cut short by a crash fails its length check and is written again.
  (void)folder_.atomicWrite(name, encode(key, conversion), platform::Durability::Unsynced);
  touch(name);
}

void PhotoCache::prune() {
  std::lock_guard lock(mutex_);
  platform::Result<std::vector<std::string>> listed = folder_.entries();
  if (listed) {
    std::uint64_t total = 0;
    for (const std::string& name : *listed) {
      // Left-over temporaries are removed too: no other run writes this folder meanwhile,
      // or it only costs that run one conversion. Removal is best effort: what stays is
      // tried again at the next run.
      if (!isEntryName(name)) {
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
      if (total + file->size > sizeCap_) {
        (void)folder_.remove(name);
        continue;
      }
      total += file->size;
    }
  }
  used_.clear();
}

}  // namespace zt::contacts
