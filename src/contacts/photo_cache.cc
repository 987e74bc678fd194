#include "contacts/photo_cache.h"

#include <algorithm>
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
// Far above any 256 x 256 JPEG: a larger entry is no entry.
constexpr std::size_t kLargestEntry = std::size_t{4} << 20;

// The pack: its entries one after the other, then the index (per entry its key, offset and
// length), then the trailer: the offset of the index, the number of entries and the magic.
constexpr std::string_view kPackName = "pack";
constexpr std::string_view kPackMagic = "ZTPACK01";
constexpr std::size_t kIndexEntrySize = 32 + 8 + 8;
constexpr std::size_t kTrailerSize = 8 + 8 + kPackMagic.size();

// The keys by origin: the magic, their number, each origin's digest and key, then the SHA-256
// of everything before it.
constexpr std::string_view kKeysName = "keys";
constexpr std::string_view kKeysMagic = "ZTKEYS01";
constexpr std::size_t kLargestKeysFile = std::size_t{64} << 20;

void putNumber(platform::Data& out, std::uint64_t value, int bytes) {
  for (int i = 0; i < bytes; ++i) out.push_back(static_cast<std::uint8_t>(value >> (8 * i)));
}

std::uint64_t getNumber(const std::uint8_t*& at, int bytes) {
  std::uint64_t value = 0;
  for (int i = 0; i < bytes; ++i) value |= std::uint64_t{at[i]} << (8 * i);
  at += bytes;
  return value;
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

// Everything the conversion depends on besides the bytes: its version, the side and the
// threshold, and the libvips (and so JPEG encoder) it was built with.
std::string conversionContext() {
  return "zetosynctool photo\n" + std::to_string(PhotoCache::kConversionVersion) + "\n" +
         std::to_string(ContactPhotoPreparation::kSide) + "\n" +
         std::to_string(ContactPhotoPreparation::kLargestEmbeddedJPEG) + "\n" +
         std::string(platform::imageServiceIdentity()) + "\n";
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
    : folder_(std::move(folder)), sizeCap_(sizeCap) {
  load();
  loadRemembered();
}

void PhotoCache::loadRemembered() {
  remembered_.clear();
  std::optional<platform::Data> file =
      folder_.readFile(std::string(kKeysName), kLargestKeysFile).valueOrNone();
  constexpr std::size_t kFixed = kKeysMagic.size() + 8 + 32;
  if (!file || file->size() < kFixed ||
      std::memcmp(file->data(), kKeysMagic.data(), kKeysMagic.size()) != 0) {
    return;
  }
  const std::uint8_t* at = file->data() + kKeysMagic.size();
  const std::uint64_t count = getNumber(at, 8);
  if ((file->size() - kFixed) % 64 != 0 || count != (file->size() - kFixed) / 64) return;
  platform::Sha256 digest;
  digest.update(std::span<const std::uint8_t>(file->data(), file->size() - 32));
  const std::array<std::uint8_t, 32> sum = digest.finish();
  if (std::memcmp(sum.data(), file->data() + file->size() - 32, 32) != 0) return;
  for (std::uint64_t i = 0; i < count; ++i) {
    OriginDigest origin;
    PhotoKey key;
    std::memcpy(origin.data(), at, origin.size());
    std::memcpy(key.data(), at + origin.size(), key.size());
    at += 64;
    remembered_.insert_or_assign(origin, key);
  }
}

void PhotoCache::saveRemembered() {
  if (rememberedNow_ == remembered_) return;
  if (rememberedNow_.empty()) {
    (void)folder_.remove(std::string(kKeysName));
    return;
  }
  platform::Data file;
  file.reserve(kKeysMagic.size() + 8 + rememberedNow_.size() * 64 + 32);
  for (char c : kKeysMagic) file.push_back(static_cast<std::uint8_t>(c));
  putNumber(file, rememberedNow_.size(), 8);
  for (const auto& [origin, key] : rememberedNow_) {
    file.insert(file.end(), origin.begin(), origin.end());
    file.insert(file.end(), key.begin(), key.end());
  }
  platform::Sha256 digest;
  digest.update(file);
  const std::array<std::uint8_t, 32> sum = digest.finish();
  file.insert(file.end(), sum.begin(), sum.end());
  (void)folder_.atomicWrite(std::string(kKeysName), file, platform::Durability::Unsynced);
}

PhotoKey PhotoCache::rememberedKeyFor(std::span<const std::uint8_t> picture,
                                      const PictureOrigin& origin) {
  // A key made under another conversion is never handed out.
  std::string text = "zetosynctool photo origin\n" + conversionContext();
  for (std::string_view field : {origin.store, origin.record}) {
    text += std::to_string(field.size()) + ":";
    text += field;
    text += "\n";
  }
  text += std::to_string(origin.generation) + "\n" + std::to_string(picture.size()) + "\n";
  platform::Sha256 digest;
  digest.update(text);
  const OriginDigest found = digest.finish();
  {
    std::lock_guard lock(mutex_);
    if (auto it = remembered_.find(found); it != remembered_.end()) {
      rememberedNow_.insert_or_assign(found, it->second);
      return it->second;
    }
  }
  const PhotoKey key = keyFor(picture);
  std::lock_guard lock(mutex_);
  rememberedNow_.insert_or_assign(found, key);
  return key;
}

void PhotoCache::load() {
  pack_.reset();
  packed_.clear();
  earlierEntries_ = false;
  if (platform::Result<std::vector<std::string>> listed = folder_.entries()) {
    earlierEntries_ = std::any_of(listed->begin(), listed->end(), [](const std::string& name) {
      return platform::isHexDigest(name);
    });
  }
  platform::Result<platform::FileReader> opened =
      platform::FileReader::open(folder_, std::string(kPackName));
  if (!opened) return;
  const std::uint64_t size = opened->size();
  if (size < kTrailerSize) return;
  platform::Data trailer(kTrailerSize);
  if (!opened->readAt(size - kTrailerSize, trailer)) return;
  if (std::memcmp(trailer.data() + 16, kPackMagic.data(), kPackMagic.size()) != 0) return;
  const std::uint8_t* at = trailer.data();
  const std::uint64_t indexOffset = getNumber(at, 8);
  const std::uint64_t count = getNumber(at, 8);
  if (indexOffset > size - kTrailerSize ||
      count != (size - kTrailerSize - indexOffset) / kIndexEntrySize ||
      (size - kTrailerSize - indexOffset) % kIndexEntrySize != 0) {
    return;
  }
  platform::Data index(static_cast<std::size_t>(count * kIndexEntrySize));
  if (!opened->readAt(indexOffset, index)) return;
  std::map<PhotoKey, Slot> slots;
  at = index.data();
  for (std::uint64_t i = 0; i < count; ++i) {
    PhotoKey key;
    std::memcpy(key.data(), at, key.size());
    at += key.size();
    Slot slot;
    slot.offset = getNumber(at, 8);
    slot.length = getNumber(at, 8);
    // An index that points outside the entries is no index: the whole pack is ignored.
    if (slot.length < kHeaderSize || slot.length > kLargestEntry || slot.offset > indexOffset ||
        slot.length > indexOffset - slot.offset) {
      return;
    }
    slots.insert_or_assign(key, slot);
  }
  pack_ = std::move(opened).value();
  packed_ = std::move(slots);
}

PhotoKey PhotoCache::keyFor(std::span<const std::uint8_t> picture) {
  platform::Sha256 digest;
  digest.update(conversionContext());
  digest.update(picture);
  return digest.finish();
}

std::optional<PhotoConversion> PhotoCache::find(const PhotoKey& key) {
  std::lock_guard lock(mutex_);
  const platform::FileReader* reader = nullptr;
  Slot* slot = nullptr;
  if (auto it = stored_.find(key); it != stored_.end()) {
    // Stored earlier in this run: read back from the next pack.
    if (!nextReader_ && next_) {
      nextReader_ = platform::FileReader::open(folder_, next_->temporaryPath().filename().string())
                        .valueOrNone();
    }
    reader = nextReader_ ? &*nextReader_ : nullptr;
    slot = &it->second;
  } else if (auto found = packed_.find(key); found != packed_.end() && pack_) {
    reader = &*pack_;
    slot = &found->second;
  }
  if (!reader) {
    if (!earlierEntries_) return std::nullopt;
    // A picture kept by the cache's earlier form, one file per picture, goes into the next
    // pack instead of being converted again.
    std::optional<platform::Data> earlier =
        folder_.readFile(platform::hexOf(key), kLargestEntry).valueOrNone();
    std::optional<PhotoConversion> conversion;
    if (earlier) conversion = decode(key, *earlier);
    if (conversion) storeLocked(key, *conversion);
    return conversion;
  }
  platform::Data entry(static_cast<std::size_t>(slot->length));
  if (!reader->readAt(slot->offset, entry)) return std::nullopt;
  // The entry names its key and length itself: a damaged pack gives no other picture's
  // conversion.
  std::optional<PhotoConversion> conversion = decode(key, entry);
  if (conversion) slot->used = true;
  return conversion;
}

void PhotoCache::store(const PhotoKey& key, const PhotoConversion& conversion) {
  if (!isLasting(conversion)) return;
  std::lock_guard lock(mutex_);
  storeLocked(key, conversion);
}

void PhotoCache::storeLocked(const PhotoKey& key, const PhotoConversion& conversion) {
  // A damaged entry of the old pack is replaced, never copied.
  packed_.erase(key);
  if (stored_.contains(key) || nextFailed_) return;
  const platform::Data entry = encode(key, conversion);
  if (nextSize_ + entry.size() > sizeCap_) return;
  if (!next_) {
    next_ = platform::AtomicFile::create(folder_, std::string(kPackName)).valueOrNone();
    if (!next_) {
      nextFailed_ = true;
      return;
    }
  }
  if (!next_->write(entry)) {
    // Nothing more is kept this run; the temporary file is already gone.
    next_.reset();
    nextReader_.reset();
    stored_.clear();
    nextFailed_ = true;
    return;
  }
  stored_.insert_or_assign(key, Slot{nextSize_, entry.size(), true});
  nextSize_ += entry.size();
}

void PhotoCache::replacePack() {
  std::uint64_t packedSize = 0;
  bool allUsed = true;
  for (const auto& [key, slot] : packed_) {
    packedSize += slot.length;
    allUsed = allUsed && slot.used;
  }
  // A run that found every entry and made none leaves the pack as it is.
  if (!next_ && !nextFailed_ && allUsed && packedSize <= sizeCap_) return;
  std::vector<std::pair<PhotoKey, Slot>> kept(stored_.begin(), stored_.end());
  // The entries found in the old pack follow those made in this run, as long as they fit.
  std::vector<std::pair<PhotoKey, Slot>> found;
  for (const auto& [key, slot] : packed_) {
    if (slot.used) found.emplace_back(key, slot);
  }
  std::sort(found.begin(), found.end(),
            [](const auto& a, const auto& b) { return a.second.offset < b.second.offset; });
  if (!nextFailed_ && pack_) {
    platform::Data entry;
    for (const auto& [key, slot] : found) {
      if (nextSize_ + slot.length > sizeCap_) continue;
      entry.resize(static_cast<std::size_t>(slot.length));
      if (!pack_->readAt(slot.offset, entry)) continue;
      if (!next_) {
        next_ = platform::AtomicFile::create(folder_, std::string(kPackName)).valueOrNone();
        if (!next_) break;
      }
      if (!next_->write(entry)) {
        next_.reset();
        break;
      }
      kept.emplace_back(key, Slot{nextSize_, slot.length, true});
      nextSize_ += slot.length;
    }
  }
  if (next_ && !kept.empty()) {
    platform::Data tail;
    tail.reserve(kept.size() * kIndexEntrySize + kTrailerSize);
    for (const auto& [key, slot] : kept) {
      tail.insert(tail.end(), key.begin(), key.end());
      putNumber(tail, slot.offset, 8);
      putNumber(tail, slot.length, 8);
    }
    putNumber(tail, nextSize_, 8);
    putNumber(tail, kept.size(), 8);
    for (char c : kPackMagic) tail.push_back(static_cast<std::uint8_t>(c));
    // Synced before it is named: after a crash a file system may keep the length of an unsynced
    // file but not its bytes, and an index over zeros would hand out zeros as pictures.
    if (next_->write(tail)) (void)next_->commit(platform::Durability::Synced);
  } else if (!nextFailed_) {
    (void)folder_.remove(std::string(kPackName));
  }
  next_.reset();
}

void PhotoCache::prune() {
  std::lock_guard lock(mutex_);
  replacePack();
  saveRemembered();
  remembered_ = std::move(rememberedNow_);
  rememberedNow_.clear();
  nextReader_.reset();
  stored_.clear();
  nextSize_ = 0;
  nextFailed_ = false;
  if (platform::Result<std::vector<std::string>> listed = folder_.entries()) {
    for (const std::string& name : *listed) {
      // Entries of the cache's earlier form and temporaries left by killed runs go: no other
      // run writes this folder meanwhile, or it only costs that run its conversions. Removal
      // is best effort: what stays is tried again at the next run.
      if (platform::isHexDigest(name) ||
          (name.starts_with('.') && name.find(".tmp") != std::string::npos)) {
        (void)folder_.remove(name);
      }
    }
  }
  load();
}

}  // namespace zt::contacts
