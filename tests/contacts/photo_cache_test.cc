// Converted photos kept between runs and converted ahead on several threads: whatever the
// path, a card gets the same bytes and the same log lines as a conversion made there and then.
#include "contacts/photo_cache.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <vector>

#include "contacts/contact_photo.h"
#include "support/captured_log.h"
#include "support/temporary_folder.h"
#include "support/test_picture.h"
#include "tessel/schema.h"

namespace zt::contacts {
namespace {

namespace fs = std::filesystem;
using platform::Data;
using test_support::picture;
using test_support::PictureFormat;
using test_support::PicturePattern;

platform::Dictionary contact(std::string name, Data image) {
  return platform::Dictionary{
      {tessel::TesselRecordEntityNameKey, tessel::TesselEntity_Contacts_Contact},
      {tessel::TesselAttribute_Contacts_Contact_FirstName, std::move(name)},
      {tessel::TesselAttribute_Contacts_Contact_Image, std::move(image)},
  };
}

// One picture of each way a conversion ends, and one that needs none.
std::vector<platform::Dictionary> contacts() {
  return {
      contact("Scaled",
              picture({.size = {900, 600}, .pattern = PicturePattern::Noise, .jpegQuality = 95})),
      contact("Png", picture({.size = {40, 30}, .format = PictureFormat::PNG})),
      contact("Larger",
              picture({.size = {256, 256}, .pattern = PicturePattern::Noise, .jpegQuality = 55})),
      contact("Garbage", Data(30000, 0x42)),
      contact("Small", picture({.size = {20, 20}})),
  };
}

// The photos and the log of one run over the contacts.
struct PhotoRun {
  std::vector<std::optional<Data>> photos;
  std::vector<std::string> log;
  int servicesMade = 0;
};

enum class Prefetch { No, Yes };
using Threads = ContactPhotoPreparation::Threads;

PhotoRun run(const std::vector<platform::Dictionary>& cards, std::unique_ptr<PhotoCache> cache,
             Prefetch prefetch, Threads threads, bool serviceFails = false,
             std::span<const PictureOrigin> origins = {}) {
  PhotoRun result;
  test_support::CapturedLog log;
  ContactPhotoPreparation preparation(
      [&]()
          -> std::variant<std::unique_ptr<platform::ImageService>, platform::ImageServiceFailure> {
        ++result.servicesMade;
        if (serviceFails) return platform::ImageServiceFailure::NoRenderingContext;
        return platform::makeImageService();
      },
      std::move(cache), threads);
  if (prefetch == Prefetch::Yes) {
    std::vector<const Data*> pictures;
    for (const auto& card : cards)
      pictures.push_back(card.dataAt(tessel::TesselAttribute_Contacts_Contact_Image));
    preparation.prefetch(pictures, origins);
  }
  for (const auto& card : cards) result.photos.push_back(preparation.photoForContact(card));
  preparation.finishRun();
  result.log = log.lines();
  return result;
}

std::vector<fs::path> entriesIn(const fs::path& folder) {
  std::vector<fs::path> entries;
  for (const auto& entry : fs::directory_iterator(folder)) entries.push_back(entry.path());
  return entries;
}

class PhotoCacheTest : public ::testing::Test {
 protected:
  std::unique_ptr<PhotoCache> cache() { return PhotoCache::open(folder_.path() / "photos"); }
  fs::path pack() const { return folder_.path() / "photos" / "pack"; }
  // How many of the cards' pictures a fresh cache holds.
  std::size_t kept(const std::vector<platform::Dictionary>& cards) {
    std::unique_ptr<PhotoCache> fresh = cache();
    std::size_t count = 0;
    for (const auto& card : cards) {
      const Data* image = card.dataAt(tessel::TesselAttribute_Contacts_Contact_Image);
      count += fresh->find(PhotoCache::keyFor(*image)) ? 1 : 0;
    }
    return count;
  }

  test_support::TemporaryFolder folder_;
  const std::vector<platform::Dictionary> cards_ = contacts();
  const PhotoRun converted_ = run(cards_, nullptr, Prefetch::No, Threads::One);
};

TEST_F(PhotoCacheTest, EveryPathGivesTheBytesAndLinesOfAConversion) {
  ASSERT_EQ(converted_.servicesMade, 1);
  ASSERT_TRUE(converted_.photos[0]);
  ASSERT_EQ(converted_.photos[2],
            *cards_[2].dataAt(tessel::TesselAttribute_Contacts_Contact_Image));
  ASSERT_FALSE(converted_.photos[3]);

  const PhotoRun first = run(cards_, cache(), Prefetch::Yes, Threads::AllCores);
  EXPECT_EQ(first.photos, converted_.photos);
  EXPECT_EQ(first.log, converted_.log);
  // Scaled, Png, Larger and Garbage, in one file.
  EXPECT_EQ(kept(cards_), 4u);
  EXPECT_EQ(entriesIn(folder_.path() / "photos"), std::vector<fs::path>{pack()});

  for (Prefetch prefetch : {Prefetch::No, Prefetch::Yes}) {
    const PhotoRun again = run(cards_, cache(), prefetch, Threads::AllCores);
    EXPECT_EQ(again.photos, converted_.photos);
    EXPECT_EQ(again.log, converted_.log);
    EXPECT_EQ(again.servicesMade, 0) << "every picture comes from the cache";
  }
}

TEST_F(PhotoCacheTest, AKeyRememberedByOriginNeverGivesAnotherPicture) {
  const std::vector<PictureOrigin> origins{{"store", "r0", 7}, {"store", "r1", 7}};
  const std::vector<platform::Dictionary> two(cards_.begin(), cards_.begin() + 2);
  const PhotoRun first = run(two, cache(), Prefetch::Yes, Threads::One, false, origins);
  EXPECT_EQ(first.photos, std::vector(converted_.photos.begin(), converted_.photos.begin() + 2));
  EXPECT_EQ(run(two, cache(), Prefetch::Yes, Threads::One, false, origins).servicesMade, 0);
  // The same records and generations now hold each other's pictures (a store made again).
  const std::vector<platform::Dictionary> swapped{cards_[1], cards_[0]};
  const PhotoRun again = run(swapped, cache(), Prefetch::Yes, Threads::One, false, origins);
  EXPECT_EQ(again.photos, (std::vector{converted_.photos[1], converted_.photos[0]}));
}

TEST_F(PhotoCacheTest, DamagedPacksAndLinksAreConvertedAgainAndReplaced) {
  run(cards_, cache(), Prefetch::No, Threads::One);
  // One entry's key damaged: that picture alone is converted again.
  {
    std::fstream file(pack(), std::ios::in | std::ios::out | std::ios::binary);
    file.seekp(8);
    file.put('\xA5');
  }
  const PhotoRun damaged = run(cards_, cache(), Prefetch::Yes, Threads::AllCores);
  EXPECT_EQ(damaged.photos, converted_.photos);
  EXPECT_EQ(damaged.log, converted_.log);
  EXPECT_EQ(kept(cards_), 4u);

  // A pack cut short, and one that is a link to a file outside the folder, count as empty.
  fs::resize_file(pack(), fs::file_size(pack()) - 1);
  EXPECT_EQ(kept(cards_), 0u);
  const fs::path outside = folder_.path() / "outside";
  fs::copy_file(pack(), outside);
  const auto outsideBytes = fs::file_size(outside);
  fs::remove(pack());
  fs::create_symlink(outside, pack());
  const PhotoRun again = run(cards_, cache(), Prefetch::Yes, Threads::AllCores);
  EXPECT_EQ(again.photos, converted_.photos);
  EXPECT_EQ(again.log, converted_.log);
  EXPECT_EQ(again.servicesMade, 1);
  EXPECT_TRUE(fs::is_regular_file(fs::symlink_status(pack())));
  EXPECT_EQ(fs::file_size(outside), outsideBytes);
  EXPECT_EQ(run(cards_, cache(), Prefetch::No, Threads::One).servicesMade, 0);
}

TEST_F(PhotoCacheTest, ARunKeepsOnlyThePicturesItUsedWithinTheCap) {
  run(cards_, cache(), Prefetch::No, Threads::One);
  // Left by a killed run, and an entry of the cache's earlier form, one file per picture.
  std::ofstream(folder_.path() / "photos" / ".pack.tmp99aZ") << "left by a killed run";
  std::ofstream(folder_.path() / "photos" / std::string(64, 'a')) << "ZTPHOTO1";
  const std::vector<platform::Dictionary> fewer(cards_.begin(), cards_.begin() + 2);
  run(fewer, cache(), Prefetch::Yes, Threads::One);
  EXPECT_EQ(kept(fewer), 2u);
  EXPECT_EQ(kept(cards_), 2u);
  EXPECT_EQ(entriesIn(folder_.path() / "photos"), std::vector<fs::path>{pack()});

  run(fewer, PhotoCache::open(folder_.path() / "photos", 1), Prefetch::No, Threads::One);
  EXPECT_TRUE(entriesIn(folder_.path() / "photos").empty());
}

TEST_F(PhotoCacheTest, WithoutAServiceAPrefetchedRunLogsTheSameFailures) {
  const PhotoRun plain = run(cards_, nullptr, Prefetch::No, Threads::One,
                             /*serviceFails=*/true);
  const PhotoRun prefetched = run(cards_, cache(), Prefetch::Yes, Threads::AllCores,
                                  /*serviceFails=*/true);
  EXPECT_EQ(prefetched.photos, plain.photos);
  EXPECT_EQ(prefetched.log, plain.log);
  EXPECT_TRUE(entriesIn(folder_.path() / "photos").empty());
}

}  // namespace
}  // namespace zt::contacts
