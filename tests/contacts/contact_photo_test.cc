// Contact photos through the real libvips service (pictures made at test time) and through
// a fake service whose steps can fail.
#include "contacts/contact_photo.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <fstream>

#include "platform/log.h"
#include "support/captured_log.h"
#include "support/test_picture.h"
#include "tessel/schema.h"

namespace zt::contacts {
namespace {

using platform::Data;
using platform::PixelSize;
using test_support::picture;
using test_support::PictureFormat;
using test_support::PicturePattern;

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
  std::vector<std::string> log() const { return log_.lines(); }
  bool logged(std::string_view line) const { return log_.has(line); }

  zt::test_support::CapturedLog log_;
  zt::test_support::TemporaryFolder folder_;
  ContactPhotoPreparation preparation_{[this] {
    ++servicesMade_;
    return platform::makeImageService();
  }};
  int servicesMade_ = 0;
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

// Pictures that become a JPEG of the given size, with the line that says why.
TEST_F(ContactPhoto, PicturesAreReEncodedScaledOrConvertedToJPEG) {
  const struct {
    const char* name;
    Data source;
    PixelSize size;
    std::string line;
    int growth = 0;  // 1: the photo must be larger than its source, -1: smaller
  } cases[] = {
      {"JPEG of 20481 bytes",
       paddedJPEG(20481),
       {100, 100},
       "Image size for \"Ann Lee\" is 20481l so it should be resized"},
      {"large JPEG",
       picture({.size = {1024, 512}, .pattern = PicturePattern::Noise, .jpegQuality = 90}),
       {256, 128},
       "Resizing to 256lx256l (x0.250000)"},
      // Converted and kept even when larger than the source.
      {"small PNG",
       picture({.size = {100, 100}, .format = PictureFormat::PNG, .pattern = PicturePattern::Flat}),
       {100, 100},
       "Image for \"Ann Lee\" is not a JPEG file. Converting it",
       1},
      {"GIF",
       picture({.size = {64, 48}, .format = PictureFormat::GIF}),
       {64, 48},
       "Not resizing (keeping size 64.000000x48.000000)"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    const std::optional<Data> photo = preparation_.photoForContact(contact(c.source));
    ASSERT_TRUE(photo);
    EXPECT_NE(*photo, c.source);
    EXPECT_TRUE(isJPEG(*photo));
    EXPECT_EQ(sizeOf(*photo), c.size);
    if (c.growth != 0) {
      EXPECT_EQ(photo->size() > c.source.size(), c.growth > 0);
    }
    EXPECT_TRUE(logged(c.line));
    EXPECT_TRUE(logged("After reducing/converting the image, size is " +
                       std::to_string(photo->size()) + "l"));
  }
  // The rendering state is made once for all the pictures.
  EXPECT_EQ(servicesMade_, 1);
  EXPECT_EQ(std::ranges::count(log(), "Creating Vuro context"), 1);
}

TEST_F(ContactPhoto, ALargeJPEGWhoseReEncodingIsLargerKeepsItsSource) {
  // Noise at a low quality: within 256 pixels, so only re-encoded, at a higher quality.
  const Data source =
      picture({.size = {256, 256}, .pattern = PicturePattern::Noise, .jpegQuality = 55});
  ASSERT_GT(source.size(), 20480u);
  EXPECT_EQ(preparation_.photoForContact(contact(source)), source);
  EXPECT_TRUE(std::ranges::any_of(log(), [](const std::string& line) {
    return line.starts_with("After reducing the image, size is ") &&
           line.ends_with("l, so we better use the one in truth");
  }));
}

TEST_F(ContactPhoto, APictureOfOneByteAddsNothing) {
  EXPECT_FALSE(preparation_.photoForContact(contact(Data{0xFF})));
  EXPECT_TRUE(logged("Image for Ann is invalid (less than 2 bytes!)"));
}

// ----- pictures from the outside world -----

void putBigEndian(Data& bytes, std::size_t at, std::uint32_t value, int width) {
  for (int i = 0; i < width; ++i)
    bytes[at + static_cast<std::size_t>(i)] =
        static_cast<std::uint8_t>(value >> (8 * (width - 1 - i)));
}

Data text(std::string_view characters) {
  return Data(characters.begin(), characters.end());
}

// A small JPEG whose baseline frame claims `size`, large enough not to be embedded unread.
Data jpegClaiming(PixelSize size) {
  Data jpeg = picture({.size = {16, 16}, .pattern = PicturePattern::Flat});
  for (std::size_t at = 0; at + 9 < jpeg.size(); ++at) {
    if (jpeg[at] == 0xFF && jpeg[at + 1] == 0xC0) {  // height, then width
      putBigEndian(jpeg, at + 5, static_cast<std::uint32_t>(size.height), 2);
      putBigEndian(jpeg, at + 7, static_cast<std::uint32_t>(size.width), 2);
      break;
    }
  }
  jpeg.resize(ContactPhotoPreparation::kLargestEmbeddedJPEG + 1, 0x00);
  return jpeg;
}

// The header chunk comes first: its type at 12, width at 16, height at 20, checksum at 29.
Data pngClaiming(std::uint32_t side) {
  Data png = picture({.size = {16, 16}, .format = PictureFormat::PNG});
  putBigEndian(png, 16, side, 4);
  putBigEndian(png, 20, side, 4);
  std::uint32_t crc = 0xFFFFFFFFu;
  for (std::size_t at = 12; at < 29; ++at) {
    crc ^= png[at];
    for (int bit = 0; bit < 8; ++bit) crc = (crc >> 1) ^ (0xEDB88320u & (0u - (crc & 1u)));
  }
  putBigEndian(png, 29, ~crc, 4);
  return png;
}

// One pixel of data behind a screen and a frame of 0xFDE8 (65000) pixels a side.
Data gifClaiming() {
  return Data{'G',  'I',  'F',  '8',  '9', 'a', 0xE8, 0xFD, 0xE8, 0xFD, 0x80, 0,
              0,    0,    0,    0,    255, 255, 255,  ',',  0,    0,    0,    0,
              0xE8, 0xFD, 0xE8, 0xFD, 0,   2,   2,    0x44, 0x01, 0,    ';'};
}

// Little-endian, one uncompressed-grey strip of two PackBits bytes after a directory of nine
// entries (type 3: short, 4: long) claiming `side` pixels a side.
Data tiffClaiming(std::uint32_t side) {
  Data tiff{'I', 'I', 42, 0, 8, 0, 0, 0, 9, 0};
  const std::uint32_t entries[9][3] = {{256, 4, side},  {257, 4, side}, {258, 3, 8},
                                       {259, 3, 32773}, {262, 3, 1},    {273, 4, 122},
                                       {277, 3, 1},     {278, 4, side}, {279, 4, 2}};
  for (const auto& [tag, type, value] : entries) {
    for (const auto& [number, width] : std::initializer_list<std::pair<std::uint32_t, int>>{
             {tag, 2}, {type, 2}, {1, 4}, {value, 4}})
      for (int i = 0; i < width; ++i) tiff.push_back(static_cast<std::uint8_t>(number >> (8 * i)));
  }
  tiff.insert(tiff.end(), {0, 0, 0, 0, 0x81, 0x00});
  return tiff;
}

// A lossless WebP of one colour costs no bits per pixel, so its size can be set up to the
// format's largest, 16384 pixels a side, in the bitstream and in the extended header if any.
Data webpClaiming(std::uint32_t side) {
  Data webp =
      picture({.size = {16, 16}, .format = PictureFormat::WebP, .pattern = PicturePattern::Flat});
  for (std::size_t at = 12; at + 18 < webp.size(); ++at) {
    if (std::memcmp(&webp[at], "VP8X", 4) == 0) {
      for (int i = 0; i < 3; ++i)
        webp[at + 12 + i] = webp[at + 15 + i] = static_cast<std::uint8_t>((side - 1) >> (8 * i));
    }
    if (std::memcmp(&webp[at], "VP8L", 4) == 0 && webp[at + 8] == 0x2F) {
      std::uint32_t bits = 0;
      for (int i = 0; i < 4; ++i) bits |= std::uint32_t{webp[at + 9 + i]} << (8 * i);
      bits = (bits & 0xF0000000u) | (side - 1) | (side - 1) << 14;
      for (int i = 0; i < 4; ++i) webp[at + 9 + i] = static_cast<std::uint8_t>(bits >> (8 * i));
      return webp;
    }
  }
  ADD_FAILURE() << "libvips wrote no lossless WebP";
  return webp;
}

// Pictures whose decoding would take gigabytes and minutes, and formats a photo is never in,
// whose loaders read other files or render documents of any size: each is refused before any
// pixel work, as a picture that cannot be decoded.
TEST_F(ContactPhoto, PictureBombsAndForeignFormatsAreRefusedAsUndecodable) {
  const Data secret = picture({.size = {64, 64}, .format = PictureFormat::PNG});
  std::ofstream(folder_ / "private.png", std::ios::binary)
      .write(reinterpret_cast<const char*>(secret.data()),
             static_cast<std::streamsize>(secret.size()));
  const std::pair<const char*, Data> bombs[] = {
      {"JPEG", jpegClaiming({65000, 65000})},
      {"PNG", pngClaiming(65000)},
      {"GIF", gifClaiming()},
      {"TIFF", tiffClaiming(65000)},
      {"WebP", webpClaiming(16383)},
      {"SVG", text("<svg xmlns=\"http://www.w3.org/2000/svg\" width=\"200000\" height=\"200000\">"
                   "<rect width=\"100%\" height=\"100%\"/></svg>")},
      {"PDF", text("%PDF-1.0\n1 0 obj<</Type/Catalog/Pages 2 0 R>>endobj\n"
                   "2 0 obj<</Type/Pages/Kids[3 0 R]/Count 1>>endobj\n"
                   "3 0 obj<</Type/Page/MediaBox[0 0 14400 14400]/Parent 2 0 R>>endobj\n"
                   "trailer<</Root 1 0 R>>\n")},
      // A prefixed root element is not what the SVG loader looks for; other loaders followed
      // the link and brought a local picture into the card.
      {"namespaced SVG link",
       text("<svg:svg xmlns:svg=\"http://www.w3.org/2000/svg\" "
            "xmlns:xlink=\"http://www.w3.org/1999/xlink\" width=\"64\" height=\"64\">"
            "<svg:image width=\"64\" height=\"64\" xlink:href=\"" +
            (folder_ / "private.png").string() + "\"/></svg:svg>")},
  };
  for (const auto& [name, bytes] : bombs) {
    SCOPED_TRACE(name);
    std::string card;
    preparation_.appendPhoto(card, contact(bytes));
    EXPECT_EQ(card, "");
    EXPECT_EQ(log().back(), "Image is invalid, ignoring");
  }
  // 50 megapixels, as the largest phone cameras write, is within the budget and scaled (the
  // data is cut short, which the decoder fills in).
  EXPECT_TRUE(preparation_.photoForContact(contact(jpegClaiming({8160, 6120}))));
  EXPECT_TRUE(logged("Resizing to 256lx256l (x0.031373)"));
}

// ----- failing services -----

struct Failures {
  bool scale = false, render = false, encode = false;
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
  const platform::ImageServiceFailure failures[] = {
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

// An encoder that cannot be made leaves no photo and says so always; failed scaling or
// rendering falls back to the source bytes.
TEST_F(ContactPhoto, FailingStepsOfTheService) {
  platform::Log::setDebugEnabled(false);
  const Data source{'G', 'I', 'F', '8'};
  for (Failures failures :
       {Failures{.encode = true}, Failures{.scale = true}, Failures{.render = true}}) {
    ContactPhotoPreparation preparation(
        [failures] { return std::make_unique<FakeService>(failures); });
    EXPECT_EQ(preparation.photoForContact(contact(source)),
              failures.encode ? std::nullopt : std::optional(source));
  }
  EXPECT_EQ(log(), (std::vector<std::string>{"Cannot create image destination"}));
}

}  // namespace
}  // namespace zt::contacts
