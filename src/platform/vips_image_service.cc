// The image service over libvips, built as the module zt_vips_image_service that
// makeImageService() loads at the first picture to convert (see image_service.cc).
#include <vips/vips.h>

#include <algorithm>
#include <cmath>
#include <new>
#include <utility>

#include "platform/image_service.h"

namespace zt::platform {

namespace {

// One counted reference to a libvips image.
class ImageRef {
 public:
  ImageRef() = default;
  explicit ImageRef(VipsImage* image) : image_(image) {}
  ImageRef(const ImageRef& other) : image_(other.image_) {
    if (image_) g_object_ref(image_);
  }
  ImageRef& operator=(const ImageRef&) = delete;
  ImageRef& operator=(ImageRef&& other) noexcept {
    std::swap(image_, other.image_);
    return *this;
  }
  ~ImageRef() {
    if (image_) g_object_unref(image_);
  }

  VipsImage* get() const { return image_; }
  explicit operator bool() const { return image_ != nullptr; }
  // Replaces the image with the result of one operation; false (and nothing held) when the
  // operation failed.
  template <typename Operation>
  bool apply(Operation operation) {
    VipsImage* out = nullptr;
    const bool done = operation(image_, &out) == 0 && out != nullptr;
    if (image_) g_object_unref(image_);
    image_ = done ? out : nullptr;
    if (!done) vips_error_clear();
    return done;
  }

 private:
  VipsImage* image_ = nullptr;
};

// The formats contact photos come in, each read only by its own libvips loader. Everything
// else libvips can read is refused: its ImageMagick loader follows links in SVG files to any
// local file, its SVG and PDF loaders render documents of any size, and none of that is a
// photo.
enum class PhotoFormat { JPEG, PNG, GIF, WebP, HEIF, TIFF };

// What decoding one picture may cost is bounded by its width x height, read from the header
// before any pixel is decoded; a larger picture is refused as undecodable. Every loader reads
// the first page only, in one top-to-bottom pass, so memory follows a strip of the picture
// rather than the whole of it, except where a decoder holds the whole picture:
//  - JPEG decodes at 1/8 of its size for a contact picture; phone cameras write up to 50
//    megapixels, and the budget leaves room for twice that.
//  - HEIF and AVIF (the other format of phone cameras) are decoded whole unless an embedded
//    thumbnail is large enough, so the budget is just above the largest phone photos.
//  - WebP decodes at the reduced size, but lossless WebP still holds 4 bytes a pixel.
//  - PNG, GIF and TIFF have no reduced decoding, and GIF holds its frame at 4 bytes a pixel;
//    no contact's photo is a 16-megapixel GIF.
// Truncated data is decoded as far as it goes: it costs no more than a whole picture of its
// size, and a photo cut short still shows.
// Measured peak memory above the 34 MB of a process that has started libvips and holds the
// picture's bytes, and wall time on the build machine, for pictures at the budget: JPEG
// 10240 x 10240 (93 MB of noise) 25 MB, 1.7 s; AVIF 8160 x 6120 330 MB, 2.4 s; lossless WebP
// 8192 x 4096 130 MB, 0.4 s; PNG, TIFF 4096 x 4096 20 MB, 0.8 s; GIF 4096 x 4096 85 MB,
// 0.4 s. A 12-megapixel JPEG photo: under 1 MB, 0.3 s. Pictures over the budget cost their
// header only: 2 MB, 0.1 s, where a 65000 x 65000 GIF took 16.8 GB and 92 s, a 16383 x 16383
// WebP 2.1 GB and 9 s, and a 200000 x 200000 SVG was stopped after 5 minutes at 3.5 GB.
struct PhotoLoader {
  PhotoFormat format;
  const char* nickname;
  std::int64_t pixelBudget;
};

constexpr PhotoLoader kPhotoLoaders[] = {
    {PhotoFormat::JPEG, "jpegload_buffer", std::int64_t{10240} * 10240},
    {PhotoFormat::HEIF, "heifload_buffer", std::int64_t{8192} * 6144},
    {PhotoFormat::WebP, "webpload_buffer", std::int64_t{8192} * 4096},
    {PhotoFormat::PNG, "pngload_buffer", std::int64_t{4096} * 4096},
    {PhotoFormat::GIF, "gifload_buffer", std::int64_t{4096} * 4096},
    {PhotoFormat::TIFF, "tiffload_buffer", std::int64_t{4096} * 4096},
};

// At most CMYK with alpha at 16 bits a band: deeper pixels would make the budget of pixels
// no bound of memory, and no camera writes them.
constexpr std::size_t kLargestPixelBytes = 10;

// The loaders libvips must never run, whatever asks for them: blocked by name on top of
// libvips' own list of loaders unfit for untrusted data, which names them too.
constexpr const char* kBlockedLoaders[] = {"VipsForeignLoadMagick", "VipsForeignLoadMagick7",
                                           "VipsForeignLoadPdf", "VipsForeignLoadSvg"};

const PhotoLoader* photoLoaderFor(std::span<const std::uint8_t> bytes) {
  for (const PhotoLoader& loader : kPhotoLoaders) {
    if (vips_foreign_is_a_buffer(loader.nickname, bytes.data(), bytes.size())) return &loader;
  }
  // A loader this libvips was built without reports an error instead of a no.
  vips_error_clear();
  return nullptr;
}

// How the first page of the picture is read: in one top-to-bottom pass, at `scale` of its size
// where the format can decode smaller (1 for the full size). For HEIF, `thumbnail` asks for
// the embedded thumbnail instead of the picture.
struct LoadOptions {
  double scale = 1.0;
  bool thumbnail = false;
};

// The reduction the JPEG decoder makes while loading (1, 2, 4 or 8) for a picture to be shrunk
// by `ratio`: the largest that does not go below the target size. The decoder scales in the
// frequency domain, so what is left to resampling is less than a factor of two.
int jpegShrinkOnLoad(double ratio) {
  if (ratio >= 8.0) return 8;
  if (ratio >= 4.0) return 4;
  if (ratio >= 2.0) return 2;
  return 1;
}

// Reads the header only; the pixels are decoded when they are asked for.
ImageRef load(PhotoFormat format, std::span<const std::uint8_t> bytes, LoadOptions options) {
  void* data = const_cast<std::uint8_t*>(bytes.data());
  const std::size_t size = bytes.size();
  const VipsAccess access = VIPS_ACCESS_SEQUENTIAL;
  VipsImage* out = nullptr;
  int failed = -1;
  switch (format) {
    case PhotoFormat::JPEG:
      failed = vips_jpegload_buffer(data, size, &out, "access", access, "shrink",
                                    jpegShrinkOnLoad(1.0 / options.scale), nullptr);
      break;
    case PhotoFormat::HEIF:
      failed = vips_heifload_buffer(data, size, &out, "access", access, "n", 1, "thumbnail",
                                    options.thumbnail ? TRUE : FALSE, nullptr);
      break;
    case PhotoFormat::WebP:
      failed = vips_webpload_buffer(data, size, &out, "access", access, "n", 1, "scale",
                                    options.scale, nullptr);
      break;
    case PhotoFormat::PNG:
      failed = vips_pngload_buffer(data, size, &out, "access", access, nullptr);
      break;
    case PhotoFormat::GIF:
      failed = vips_gifload_buffer(data, size, &out, "access", access, "n", 1, nullptr);
      break;
    case PhotoFormat::TIFF:
      failed = vips_tiffload_buffer(data, size, &out, "access", access, "n", 1, nullptr);
      break;
  }
  if (failed != 0 || !out) {
    vips_error_clear();
    if (out) g_object_unref(out);
    return ImageRef();
  }
  return ImageRef(out);
}

class VipsPicture final : public Image {
 public:
  VipsPicture(ImageRef image, std::span<const std::uint8_t> source, const PhotoLoader* loader,
              double scale, PixelSize extent)
      : image_(std::move(image)),
        source_(source),
        loader_(loader),
        scale_(scale),
        extent_(extent) {}

  PixelSize extent() const override { return extent_; }

  const ImageRef& image() const { return image_; }
  std::span<const std::uint8_t> source() const { return source_; }
  // None for a rendered bitmap.
  const PhotoLoader* loader() const { return loader_; }
  double scale() const { return scale_; }

 private:
  ImageRef image_;
  std::span<const std::uint8_t> source_;
  const PhotoLoader* loader_;
  double scale_;
  PixelSize extent_;
};

// The picture decoded at the smallest size its format allows that is not below `size`; the
// full-size image when the format cannot decode smaller; none when loading failed.
ImageRef loadReduced(const VipsPicture& picture, PixelSize size) {
  const PhotoLoader* loader = picture.loader();
  if (!loader || picture.scale() >= 1.0) return picture.image();
  switch (loader->format) {
    case PhotoFormat::JPEG:
      // Decoding at a fraction of the size is where large photos save most of their time.
      if (jpegShrinkOnLoad(1.0 / picture.scale()) == 1) return picture.image();
      return load(loader->format, picture.source(), {.scale = picture.scale()});
    case PhotoFormat::WebP:
      return load(loader->format, picture.source(), {.scale = picture.scale()});
    case PhotoFormat::HEIF: {
      // Without a thumbnail, the loader answers with the picture itself.
      ImageRef thumbnail = load(loader->format, picture.source(), {.thumbnail = true});
      if (thumbnail && vips_image_get_width(thumbnail.get()) >= size.width &&
          vips_image_get_height(thumbnail.get()) >= size.height) {
        return thumbnail;
      }
      return picture.image();
    }
    case PhotoFormat::PNG:
    case PhotoFormat::GIF:
    case PhotoFormat::TIFF:
      break;
  }
  return picture.image();
}

// libvips reports damaged data through GLib warnings on the standard error stream, which
// belongs to the tool's own messages; a damaged picture is handled by its caller instead.
void ignoreWarning(const gchar*, GLogLevelFlags, const gchar*, gpointer) {}

class VipsImageService final : public ImageService {
 public:
  std::unique_ptr<Image> decode(std::span<const std::uint8_t> bytes) override {
    if (bytes.empty()) return nullptr;
    const PhotoLoader* loader = photoLoaderFor(bytes);
    if (!loader) return nullptr;
    ImageRef image = load(loader->format, bytes, {});
    if (!image) return nullptr;
    const PixelSize extent{vips_image_get_width(image.get()), vips_image_get_height(image.get())};
    if (std::int64_t{extent.width} * extent.height > loader->pixelBudget ||
        static_cast<std::size_t>(VIPS_IMAGE_SIZEOF_PEL(image.get())) > kLargestPixelBytes) {
      return nullptr;
    }
    return std::make_unique<VipsPicture>(std::move(image), bytes, loader, 1.0, extent);
  }

  std::unique_ptr<Image> scale(const Image& image, float factor) override {
    const auto* picture = dynamic_cast<const VipsPicture*>(&image);
    if (!picture || !std::isfinite(factor) || factor <= 0.0f) return nullptr;
    const PixelSize from = picture->extent();
    PixelSize to{std::max(1, static_cast<int>(std::lround(from.width * double{factor}))),
                 std::max(1, static_cast<int>(std::lround(from.height * double{factor})))};
    return std::make_unique<VipsPicture>(picture->image(), picture->source(), picture->loader(),
                                         picture->scale() * double{factor}, to);
  }

  std::unique_ptr<Image> render(const Image& image, PixelSize size) override {
    const auto* picture = dynamic_cast<const VipsPicture*>(&image);
    if (!picture || size.width <= 0 || size.height <= 0) return nullptr;

    ImageRef pixels = loadReduced(*picture, size);
    if (!pixels) return nullptr;
    if (vips_image_hasalpha(pixels.get()) && !pixels.apply([](VipsImage* in, VipsImage** out) {
          return vips_flatten(in, out, nullptr);
        })) {
      return nullptr;
    }
    if (!pixels.apply([](VipsImage* in, VipsImage** out) {
          return vips_colourspace(in, out, VIPS_INTERPRETATION_sRGB, nullptr);
        })) {
      return nullptr;
    }
    if (vips_image_get_bands(pixels.get()) > 3 && !pixels.apply([](VipsImage* in, VipsImage** out) {
          return vips_extract_band(in, out, 0, "n", 3, nullptr);
        })) {
      return nullptr;
    }
    const int width = vips_image_get_width(pixels.get());
    const int height = vips_image_get_height(pixels.get());
    if (width != size.width || height != size.height) {
      const double horizontal = double{1.0} * size.width / width;
      const double vertical = double{1.0} * size.height / height;
      if (!pixels.apply([&](VipsImage* in, VipsImage** out) {
            return vips_resize(in, out, horizontal, "vscale", vertical, nullptr);
          })) {
        return nullptr;
      }
      // Resampling rounds the new size; the region asked for is what is kept.
      const int cropWidth = std::min(size.width, vips_image_get_width(pixels.get()));
      const int cropHeight = std::min(size.height, vips_image_get_height(pixels.get()));
      if ((cropWidth != vips_image_get_width(pixels.get()) ||
           cropHeight != vips_image_get_height(pixels.get())) &&
          !pixels.apply([&](VipsImage* in, VipsImage** out) {
            return vips_extract_area(in, out, 0, 0, cropWidth, cropHeight, nullptr);
          })) {
        return nullptr;
      }
    }
    if (!pixels.apply(
            [](VipsImage* in, VipsImage** out) { return vips_cast_uchar(in, out, nullptr); })) {
      return nullptr;
    }
    ImageRef bitmap(vips_image_copy_memory(pixels.get()));
    if (!bitmap) {
      vips_error_clear();
      return nullptr;
    }
    PixelSize extent{vips_image_get_width(bitmap.get()), vips_image_get_height(bitmap.get())};
    return std::make_unique<VipsPicture>(std::move(bitmap), std::span<const std::uint8_t>(),
                                         nullptr, 1.0, extent);
  }

  std::optional<Data> encodeJPEG(const Image& bitmap) override {
    const auto* picture = dynamic_cast<const VipsPicture*>(&bitmap);
    if (!picture) return std::nullopt;
    void* buffer = nullptr;
    std::size_t length = 0;
    if (vips_jpegsave_buffer(picture->image().get(), &buffer, &length, "strip", TRUE, nullptr) !=
        0) {
      vips_error_clear();
      return std::nullopt;
    }
    const auto* bytes = static_cast<const std::uint8_t*>(buffer);
    Data jpeg(bytes, bytes + length);
    g_free(buffer);
    return jpeg;
  }
};

bool startLibrary() {
  static const bool started = [] {
    if (vips_init("zetosynctool") != 0) {
      vips_error_clear();
      return false;
    }
    // Cached operations would keep pointing at picture bytes the caller has since freed, and
    // a new picture at the same address could be answered from the cache.
    vips_cache_set_max(0);
    // Contact pictures come from anyone who can send the user a card.
    vips_block_untrusted_set(TRUE);
    for (const char* loader : kBlockedLoaders) vips_operation_block_set(loader, TRUE);
    g_log_set_handler("VIPS", G_LOG_LEVEL_WARNING, ignoreWarning, nullptr);
    return true;
  }();
  return started;
}

}  // namespace

}  // namespace zt::platform

// The module's one entry: a new service, or null with the reason in `failure`.
extern "C" __attribute__((visibility("default"))) zt::platform::ImageService*
zt_make_vips_image_service(zt::platform::ImageServiceFailure* failure) {
  using zt::platform::ImageServiceFailure;
  if (!zt::platform::startLibrary()) {
    *failure = ImageServiceFailure::NoRenderingContext;
    return nullptr;
  }
  try {
    return new zt::platform::VipsImageService();
  } catch (const std::bad_alloc&) {
    *failure = ImageServiceFailure::OutOfMemory;
    return nullptr;
  }
}
