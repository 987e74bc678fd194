#include "contacts/photo_cache.h"

#include <fcntl.h>
#include <openssl/evp.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cstdlib>
#include <cstring>
#include <string_view>
#include <vector>

#include "contacts/contact_photo.h"

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

// The regular file `name` in the folder, never through a link; none when it is anything else
// or larger than any entry.
std::optional<platform::Data> readEntry(int folder, const std::string& name) {
  const int fd = openat(folder, name.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC | O_NONBLOCK);
  if (fd < 0) return std::nullopt;
  std::optional<platform::Data> bytes;
  struct stat status {};
  if (fstat(fd, &status) == 0 && S_ISREG(status.st_mode) &&
      static_cast<std::uint64_t>(status.st_size) <= kLargestEntry) {
    platform::Data data(static_cast<std::size_t>(status.st_size));
    std::size_t done = 0;
    while (done < data.size()) {
      const ssize_t got = read(fd, data.data() + done, data.size() - done);
      if (got <= 0) break;
      done += static_cast<std::size_t>(got);
    }
    if (done == data.size()) bytes = std::move(data);
  }
  close(fd);
  return bytes;
}

// Writes `name` through a temporary file renamed over it. A cache needs no fsync: an entry
// cut short by a crash fails its length check and is written again.
void writeEntry(int folder, const std::string& name, const platform::Data& bytes) {
  static std::atomic<unsigned> counter{0};
  const std::string temporary =
      "." + name + ".tmp" + std::to_string(getpid()) + "." + std::to_string(counter.fetch_add(1));
  const int fd =
      openat(folder, temporary.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
  if (fd < 0) return;
  std::size_t done = 0;
  while (done < bytes.size()) {
    const ssize_t wrote = write(fd, bytes.data() + done, bytes.size() - done);
    if (wrote <= 0) break;
    done += static_cast<std::size_t>(wrote);
  }
  const bool complete = close(fd) == 0 && done == bytes.size();
  if (!complete || renameat(folder, temporary.c_str(), folder, name.c_str()) != 0) {
    unlinkat(folder, temporary.c_str(), 0);
  }
}

}  // namespace

bool isLasting(const PhotoConversion& conversion) {
  using Outcome = PhotoConversion::Outcome;
  return conversion.outcome == Outcome::Invalid || conversion.outcome == Outcome::Larger ||
         conversion.outcome == Outcome::Reduced;
}

std::unique_ptr<PhotoCache> PhotoCache::openUserCache() {
  std::filesystem::path base;
  const char* xdg = std::getenv("XDG_CACHE_HOME");
  const char* home = std::getenv("HOME");
  if (xdg && xdg[0] == '/') {
    base = xdg;
  } else if (home && home[0] == '/') {
    base = std::filesystem::path(home) / ".cache";
  } else {
    return nullptr;
  }
  auto opened = platform::FolderHandle::open(base);
  if (std::holds_alternative<std::string>(opened)) {
    std::error_code ignored;
    if (!std::filesystem::create_directories(base, ignored)) return nullptr;
    opened = platform::FolderHandle::open(base);
  }
  auto* handle = std::get_if<platform::FolderHandle>(&opened);
  if (!handle) return nullptr;
  auto tool = handle->openChild("zetosynctool", platform::IfMissing::Create);
  auto* toolFolder = std::get_if<platform::FolderHandle>(&tool);
  if (!toolFolder) return nullptr;
  auto photos = toolFolder->openChild("photos", platform::IfMissing::Create);
  auto* photosFolder = std::get_if<platform::FolderHandle>(&photos);
  if (!photosFolder) return nullptr;
  return std::unique_ptr<PhotoCache>(new PhotoCache(std::move(*photosFolder), kDefaultSizeCap));
}

std::unique_ptr<PhotoCache> PhotoCache::open(const std::filesystem::path& folder,
                                             std::uint64_t sizeCap) {
  auto parent = platform::FolderHandle::open(folder.parent_path());
  auto* handle = std::get_if<platform::FolderHandle>(&parent);
  if (!handle) return nullptr;
  auto opened = handle->openChild(folder.filename().string(), platform::IfMissing::Create);
  auto* photos = std::get_if<platform::FolderHandle>(&opened);
  if (!photos) return nullptr;
  return std::unique_ptr<PhotoCache>(new PhotoCache(std::move(*photos), sizeCap));
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
  PhotoKey key{};
  unsigned int length = 0;
  EVP_MD_CTX* digest = EVP_MD_CTX_new();
  if (digest && EVP_DigestInit_ex(digest, EVP_sha256(), nullptr) == 1 &&
      EVP_DigestUpdate(digest, context.data(), context.size()) == 1 &&
      EVP_DigestUpdate(digest, picture.data(), picture.size()) == 1) {
    EVP_DigestFinal_ex(digest, key.data(), &length);
  }
  EVP_MD_CTX_free(digest);
  return key;
}

void PhotoCache::touch(const std::string& name) {
  std::lock_guard lock(mutex_);
  used_.insert(name);
}

std::optional<PhotoConversion> PhotoCache::find(const PhotoKey& key) {
  const std::string name = nameOf(key);
  std::optional<platform::Data> entry = readEntry(folder_.descriptor(), name);
  if (!entry) return std::nullopt;
  std::optional<PhotoConversion> conversion = decode(key, *entry);
  if (conversion) touch(name);
  return conversion;
}

void PhotoCache::store(const PhotoKey& key, const PhotoConversion& conversion) {
  if (!isLasting(conversion)) return;
  const std::string name = nameOf(key);
  writeEntry(folder_.descriptor(), name, encode(key, conversion));
  touch(name);
}

void PhotoCache::prune() {
  std::lock_guard lock(mutex_);
  auto listed = folder_.entries();
  if (auto* names = std::get_if<std::vector<std::string>>(&listed)) {
    std::uint64_t total = 0;
    for (const std::string& name : *names) {
      // Left-over temporaries are removed too: no other run writes this folder meanwhile,
      // or it only costs that run one conversion.
      if (!isEntryName(name)) {
        if (name.starts_with('.') && name.find(".tmp") != std::string::npos) folder_.remove(name);
        continue;
      }
      if (!used_.contains(name)) {
        folder_.remove(name);
        continue;
      }
      auto attributes = folder_.attributes(name);
      auto* file = std::get_if<platform::FileAttributes>(&attributes);
      if (!file) continue;
      if (total + file->size > sizeCap_) {
        folder_.remove(name);
        continue;
      }
      total += file->size;
    }
  }
  used_.clear();
}

}  // namespace zt::contacts
