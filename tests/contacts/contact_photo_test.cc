// Contact photos through the real libvips service (pictures made at test time) and through
// a fake service whose steps can fail.
#include "contacts/contact_photo.h"

#include <gtest/gtest.h>

#include <fstream>
#include <sstream>

#include "platform/log.h"
#include "platform/picture_maker.h"
#include "platform/scoped_environment.h"
#include "platform/temporary_folder.h"
#include "tessel/schema.h"

namespace zt::contacts {
namespace {

using platform::Data;
using platform::PictureFormat;
using platform::PicturePattern;
using platform::PixelSize;

Data picture(platform::PictureRecipe recipe) {
  std::optional<Data> bytes = platform::makePicture(recipe);
  EXPECT_TRUE(bytes) << "libvips could not make the test picture";
  return bytes.value_or(Data{});
}

// A small valid JPEG grown to `size` bytes with data after its end marker, which decoders
// ignore.
Data paddedJPEG(std::size_t size) {
  Data jpeg = picture({.size = {100, 100}, .pattern = PicturePattern::Gradient});
  EXPECT_LT(jpeg.size(), size);
  jpeg.resize(size, 0x00);
  return jpeg;
}

platform::Dictionary contact(Data image) {
  return platform::Dictionary{
      {tessel::TesselRecordEntityNameKey, tessel::TesselEntity_Contacts_Contact},
      {tessel::TesselAttribute_Contacts_Contact_FirstName, "Ann"},
      {tessel::TesselAttribute_Contacts_Contact_LastName, "Lee"},
      {tessel::TesselAttribute_Contacts_Contact_Image, std::move(image)},
  };
}

// A picture service that counts how often it is made.
class ContactPhoto : public ::testing::Test {
 protected:
  void SetUp() override {
    environment_.set("ZETOSYNCTOOL_LOG", (folder_ / "log").string());
    platform::Log::configureFromEnvironment();
    platform::Log::setDebugEnabled(true);
  }
  void TearDown() override {
    platform::Log::setDebugEnabled(false);
    environment_.unset("ZETOSYNCTOOL_LOG");
    platform::Log::configureFromEnvironment();
  }

  std::vector<std::string> log() const {
    std::ifstream in(folder_ / "log");
    std::vector<std::string> lines;
    for (std::string line; std::getline(in, line);) lines.push_back(line);
    return lines;
  }
  bool logged(std::string_view line) const {
    const std::vector<std::string> lines = log();
    return std::find(lines.begin(), lines.end(), line) != lines.end();
  }

  ContactPhotoPreparation preparation_{[this] {
    ++servicesMade_;
    return platform::makeImageService();
  }};
  int servicesMade_ = 0;

  platform::test_support::TemporaryFolder folder_;
  platform::test_support::ScopedEnvironment environment_;
};

PixelSize sizeOf(const Data& jpeg) {
  auto made = platform::makeImageService();
  auto& service = std::get<std::unique_ptr<platform::ImageService>>(made);
  std::unique_ptr<platform::Image> image = service->decode(jpeg);
  return image ? image->extent() : PixelSize{};
}

bool isJPEG(const Data& bytes) {
  return bytes.size() > 2 && bytes[0] == 0xFF && bytes[1] == 0xD8;
}

TEST_F(ContactPhoto, AJPEGOfAtMost20480BytesIsEmbeddedAsItIsWithoutImageWork) {
  const Data source = paddedJPEG(20480);
  EXPECT_EQ(preparation_.photoForContact(contact(source)), source);
  EXPECT_EQ(servicesMade_, 0);
  EXPECT_FALSE(logged("Creating Vuro context"));
}

TEST_F(ContactPhoto, AJPEGOf20481BytesIsDecodedAndReEncoded) {
  const Data source = paddedJPEG(20481);
  const std::optional<Data> photo = preparation_.photoForContact(contact(source));
  ASSERT_TRUE(photo);
  EXPECT_NE(*photo, source);
  EXPECT_TRUE(isJPEG(*photo));
  EXPECT_EQ(sizeOf(*photo), (PixelSize{100, 100}));
  EXPECT_TRUE(logged("Image size for \"Ann Lee\" is 20481l so it should be resized"));
  EXPECT_TRUE(logged("After reducing/converting the image, size is " +
                     std::to_string(photo->size()) + "l"));
}

TEST_F(ContactPhoto, ALargeJPEGIsScaledToFitIn256Pixels) {
  const Data source =
      picture({.size = {1024, 512}, .pattern = PicturePattern::Noise, .jpegQuality = 90});
  ASSERT_GT(source.size(), 20480u);
  const std::optional<Data> photo = preparation_.photoForContact(contact(source));
  ASSERT_TRUE(photo);
  EXPECT_TRUE(isJPEG(*photo));
  EXPECT_LT(photo->size(), source.size());
  EXPECT_EQ(sizeOf(*photo), (PixelSize{256, 128}));
  EXPECT_TRUE(logged("Resizing to 256lx256l (x0.250000)"));
}

TEST_F(ContactPhoto, OtherFormatsAreConvertedAndKeptEvenWhenLarger) {
  const Data source =
      picture({.size = {100, 100}, .format = PictureFormat::PNG, .pattern = PicturePattern::Flat});
  const std::optional<Data> photo = preparation_.photoForContact(contact(source));
  ASSERT_TRUE(photo);
  EXPECT_TRUE(isJPEG(*photo));
  EXPECT_GT(photo->size(), source.size()) << "the case needs a PNG smaller than its JPEG";
  EXPECT_EQ(sizeOf(*photo), (PixelSize{100, 100}));
  EXPECT_TRUE(logged("Image for \"Ann Lee\" is not a JPEG file. Converting it"));
  EXPECT_TRUE(logged("Not resizing (keeping size 100.000000x100.000000)"));
}

TEST_F(ContactPhoto, ALargeJPEGWhoseReEncodingIsLargerKeepsItsSource) {
  // Noise at a low quality: within 256 pixels, so only re-encoded, at a higher quality.
  const Data source =
      picture({.size = {256, 256}, .pattern = PicturePattern::Noise, .jpegQuality = 55});
  ASSERT_GT(source.size(), 20480u);
  const std::optional<Data> photo = preparation_.photoForContact(contact(source));
  EXPECT_EQ(photo, source);
  bool explained = false;
  for (const std::string& line : log()) {
    explained = explained || (line.starts_with("After reducing the image, size is ") &&
                              line.ends_with("l, so we better use the one in truth"));
  }
  EXPECT_TRUE(explained);
}

TEST_F(ContactPhoto, PicturesThatCannotBeReadAddNothing) {
  EXPECT_FALSE(preparation_.photoForContact(contact(Data{0xFF})));
  EXPECT_TRUE(logged("Image for Ann is invalid (less than 2 bytes!)"));
  EXPECT_FALSE(preparation_.photoForContact(contact(Data{'n', 'o', 't', ' ', 'a', 'n', 'y'})));
  EXPECT_TRUE(logged("Image is invalid, ignoring"));
  std::string card;
  preparation_.appendPhoto(card, contact(Data{0xFF}));
  EXPECT_EQ(card, "");
}

TEST_F(ContactPhoto, TheRenderingStateIsMadeOnce) {
  const Data png = picture({.size = {40, 40}, .format = PictureFormat::PNG});
  for (int i = 0; i < 3; ++i) ASSERT_TRUE(preparation_.photoForContact(contact(png)));
  EXPECT_EQ(servicesMade_, 1);
  const std::vector<std::string> lines = log();
  EXPECT_EQ(std::count(lines.begin(), lines.end(), "Creating Vuro context"), 1);
}

// ----- failing services -----

struct Failures {
  bool scale = false;
  bool render = false;
  bool encode = false;
};

class FakeImage final : public platform::Image {
 public:
  explicit FakeImage(PixelSize size) : size_(size) {}
  PixelSize extent() const override { return size_; }

 private:
  PixelSize size_;
};

class FakeService final : public platform::ImageService {
 public:
  explicit FakeService(Failures failures) : failures_(failures) {}
  std::unique_ptr<platform::Image> decode(std::span<const std::uint8_t>) override {
    return std::make_unique<FakeImage>(PixelSize{1000, 500});
  }
  std::unique_ptr<platform::Image> scale(const platform::Image& image, float factor) override {
    if (failures_.scale) return nullptr;
    return std::make_unique<FakeImage>(PixelSize{static_cast<int>(image.extent().width * factor),
                                                 static_cast<int>(image.extent().height * factor)});
  }
  std::unique_ptr<platform::Image> render(const platform::Image& image, PixelSize) override {
    if (failures_.render) return nullptr;
    return std::make_unique<FakeImage>(image.extent());
  }
  std::optional<Data> encodeJPEG(const platform::Image&) override {
    if (failures_.encode) return std::nullopt;
    return Data{0xFF, 0xD8, 0xFF, 0xD9};
  }

 private:
  Failures failures_;
};

TEST_F(ContactPhoto, AServiceThatCannotStartIsAskedAgainAtTheNextPicture) {
  platform::Log::setDebugEnabled(false);
  std::vector<platform::ImageServiceFailure> failures = {
      platform::ImageServiceFailure::NoRenderingContext,
      platform::ImageServiceFailure::OutOfMemory};
  int asked = 0;
  ContactPhotoPreparation preparation(
      [&]()
          -> std::variant<std::unique_ptr<platform::ImageService>, platform::ImageServiceFailure> {
        return failures[static_cast<std::size_t>(asked++)];
      });
  const Data png = picture({.size = {40, 40}, .format = PictureFormat::PNG});
  EXPECT_FALSE(preparation.photoForContact(contact(png)));
  EXPECT_FALSE(preparation.photoForContact(contact(png)));
  EXPECT_EQ(asked, 2);
  // Always written, debug logging or not.
  EXPECT_EQ(log(), (std::vector<std::string>{"Unable to create Dravo context",
                                             "Unable to allocate memory"}));
}

TEST_F(ContactPhoto, AnEncoderThatCannotBeMadeLeavesNoPhotoAndSaysSoAlways) {
  platform::Log::setDebugEnabled(false);
  ContactPhotoPreparation preparation(
      [] { return std::make_unique<FakeService>(Failures{.encode = true}); });
  EXPECT_FALSE(preparation.photoForContact(contact(Data{'P', 'N', 'G'})));
  EXPECT_EQ(log(), (std::vector<std::string>{"Cannot create image destination"}));
}

TEST_F(ContactPhoto, FailedScalingOrRenderingFallsBackToTheSourceBytes) {
  for (Failures failures : {Failures{.scale = true}, Failures{.render = true}}) {
    ContactPhotoPreparation preparation(
        [failures] { return std::make_unique<FakeService>(failures); });
    const Data source{'G', 'I', 'F', '8'};
    EXPECT_EQ(preparation.photoForContact(contact(source)), source);
  }
  EXPECT_TRUE(logged("Did not reduce image... using the one in truth"));
}

}  // namespace
}  // namespace zt::contacts
