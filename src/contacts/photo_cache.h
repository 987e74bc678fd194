#pragma once

#include <array>
#include <cstdint>
#include <filesystem>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "platform/atomic_file.h"
#include "platform/file_reader.h"
#include "platform/folder_handle.h"
#include "platform/image_service.h"
#include "platform/value.h"

namespace zt::contacts {

// What converting one picture gave, and the values its log lines are formatted from, so that
// a picture converted in an earlier run (or on another thread) logs the very lines a
// conversion made now would log.
struct PhotoConversion {
  enum class Outcome : std::uint8_t {
    Invalid = 1,   // not decodable, or no pixels: nothing embedded
    ScaleFailed,   // the picture itself embedded
    RenderFailed,  // the picture itself embedded
    EncodeFailed,  // nothing embedded
    Larger,        // the re-encoded JPEG was larger: the picture itself embedded
    Reduced,       // `reduced` embedded
  };

  Outcome outcome = Outcome::Invalid;
  platform::PixelSize extent;
  // The single-precision scale factor (1 when the picture was not scaled).
  float factor = 1.0f;
  // The size of the re-encoded JPEG, for Larger and Reduced.
  std::uint64_t reducedSize = 0;
  // The re-encoded JPEG, for Reduced only.
  platform::Data reduced;

  bool operator==(const PhotoConversion&) const = default;
};

// Whether the outcome is the same whenever the same bytes are converted again, so that it
// may be kept: the failures of the encoder and of scaling may be passing ones.
bool isLasting(const PhotoConversion& conversion);

using PhotoKey = std::array<std::uint8_t, 32>;

// Where a picture comes from: one record of one store at one generation, which within that
// store file always holds the same bytes.
struct PictureOrigin {
  std::string_view store;  // the store file's identity (platform::fileIdentity)
  std::string_view record;
  std::int64_t generation = 0;
};

// Converted pictures kept between runs in one pack file in one folder, each entry found by
// the SHA-256 of the picture's bytes and of everything else the conversion depends on. The
// pack is read a piece at a time, never through a symbolic link; an entry whose bytes do not
// hold the key and length that the pack's index says is treated as missing and converted
// again, and a pack whose index cannot be read counts as empty. What a run stores goes to
// the next pack, a temporary file beside it; at the end of a run that used the cache, prune()
// adds the entries the run found in the old pack, up to the size cap, and puts the next pack
// in place in one rename: entries the run did not use are forgotten. The keys of the pictures
// are kept too, by origin, in a file checked whole by its own digest. Every method may be
// called from several threads at once.
class PhotoCache {
 public:
  // The cache under $XDG_CACHE_HOME (or ~/.cache) in zetosynctool/photos, created when
  // missing; none when it cannot be opened, and photos are then converted every time.
  static std::unique_ptr<PhotoCache> openUserCache();
  // The cache in `folder`, created when missing (its parent must exist).
  static std::unique_ptr<PhotoCache> open(const std::filesystem::path& folder,
                                          std::uint64_t sizeCap = kDefaultSizeCap);

  // The key of `picture` for this build's conversion.
  static PhotoKey keyFor(std::span<const std::uint8_t> picture);

  // The key of `picture` from `origin`: the one kept from an earlier run for the same store,
  // record, generation and picture size, else keyFor(picture), then kept for the next run.
  // It spares reading every picture's bytes on every push.
  PhotoKey rememberedKeyFor(std::span<const std::uint8_t> picture, const PictureOrigin& origin);

  std::optional<PhotoConversion> find(const PhotoKey& key);
  // Keeps a lasting conversion; failures to write are ignored.
  void store(const PhotoKey& key, const PhotoConversion& conversion);
  // Removes the entries neither found nor stored since the cache was opened or last pruned,
  // and then entries until the rest fits the size cap.
  void prune();

  const std::filesystem::path& path() const { return folder_.path(); }

  static constexpr std::uint64_t kDefaultSizeCap = std::uint64_t{256} << 20;
  // Raised whenever the conversion changes what it makes from the same bytes.
  static constexpr std::uint32_t kConversionVersion = 1;

 private:
  // Where an entry lies in a pack, and whether this run found it there.
  struct Slot {
    std::uint64_t offset = 0;
    std::uint64_t length = 0;
    bool used = false;
  };

  PhotoCache(platform::FolderHandle folder, std::uint64_t sizeCap);
  // Reads the index of the pack in place; a pack that cannot be read counts as empty.
  void load();
  using OriginDigest = std::array<std::uint8_t, 32>;
  // The keys kept by the last run; one that cannot be read in full is no key at all.
  void loadRemembered();
  void saveRemembered();

  // store() with the lock held.
  void storeLocked(const PhotoKey& key, const PhotoConversion& conversion);
  // Writes the index and puts the next pack in place, or removes the pack when nothing is
  // kept.
  void replacePack();

  platform::FolderHandle folder_;
  std::uint64_t sizeCap_;
  std::mutex mutex_;
  // The pack in place when the cache was opened or last pruned, and its index.
  std::optional<platform::FileReader> pack_;
  std::map<PhotoKey, Slot> packed_;
  // The next pack, made at the first store(), and what this run put in it.
  std::optional<platform::AtomicFile> next_;
  std::optional<platform::FileReader> nextReader_;
  std::map<PhotoKey, Slot> stored_;
  std::uint64_t nextSize_ = 0;
  bool nextFailed_ = false;
  // Picture keys by origin: those of the last run, and those this run used or made.
  std::map<OriginDigest, PhotoKey> remembered_;
  std::map<OriginDigest, PhotoKey> rememberedNow_;
  // Whether the folder held entries of the cache's earlier form, one file per picture.
  bool earlierEntries_ = false;
};

}  // namespace zt::contacts
