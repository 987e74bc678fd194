// The image service over libvips.
#include "platform/image_service.h"

#include <vips/vips.h>

#include <algorithm>
#include <cmath>
#include <new>
#include <string_view>
#include <utility>

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

class VipsPicture final : public Image {
 public:
  VipsPicture(ImageRef image, std::span<const std::uint8_t> source, bool jpeg, double scale,
              PixelSize extent)
      : image_(std::move(image)), source_(source), jpeg_(jpeg), scale_(scale), extent_(extent) {}

  PixelSize extent() const override { return extent_; }

  const ImageRef& image() const { return image_; }
  std::span<const std::uint8_t> source() const { return source_; }
  bool jpeg() const { return jpeg_; }
  double scale() const { return scale_; }

 private:
  ImageRef image_;
  std::span<const std::uint8_t> source_;
  bool jpeg_;
  double scale_;
  PixelSize extent_;
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

// libvips reports damaged data through GLib warnings on the standard error stream, which
// belongs to the tool's own messages; a damaged picture is handled by its caller instead.
void ignoreWarning(const gchar*, GLogLevelFlags, const gchar*, gpointer) {}

class VipsImageService final : public ImageService {
 public:
  std::unique_ptr<Image> decode(std::span<const std::uint8_t> bytes) override {
    if (bytes.empty()) return nullptr;
    const char* loader = vips_foreign_find_load_buffer(bytes.data(), bytes.size());
    if (!loader) {
      vips_error_clear();
      return nullptr;
    }
    ImageRef image(vips_image_new_from_buffer(bytes.data(), bytes.size(), "", "access",
                                              VIPS_ACCESS_SEQUENTIAL, nullptr));
    if (!image) {
      vips_error_clear();
      return nullptr;
    }
    const bool jpeg = std::string_view(loader) == "VipsForeignLoadJpegBuffer";
    PixelSize extent{vips_image_get_width(image.get()), vips_image_get_height(image.get())};
    return std::make_unique<VipsPicture>(std::move(image), bytes, jpeg, 1.0, extent);
  }

  std::unique_ptr<Image> scale(const Image& image, float factor) override {
    const auto* picture = dynamic_cast<const VipsPicture*>(&image);
    if (!picture || !std::isfinite(factor) || factor <= 0.0f) return nullptr;
    const PixelSize from = picture->extent();
    PixelSize to{std::max(1, static_cast<int>(std::lround(from.width * double{factor}))),
                 std::max(1, static_cast<int>(std::lround(from.height * double{factor})))};
    return std::make_unique<VipsPicture>(picture->image(), picture->source(), picture->jpeg(),
                                         picture->scale() * double{factor}, to);
  }

  std::unique_ptr<Image> render(const Image& image, PixelSize size) override {
    const auto* picture = dynamic_cast<const VipsPicture*>(&image);
    if (!picture || size.width <= 0 || size.height <= 0) return nullptr;

    ImageRef pixels = picture->image();
    const int shrink = picture->jpeg() ? jpegShrinkOnLoad(1.0 / picture->scale()) : 1;
    if (shrink > 1) {
      // Decoding at a fraction of the size is where large photos save most of their time.
      std::span<const std::uint8_t> source = picture->source();
      VipsImage* shrunk = nullptr;
      if (vips_jpegload_buffer(const_cast<std::uint8_t*>(source.data()), source.size(), &shrunk,
                               "shrink", shrink, "access", VIPS_ACCESS_SEQUENTIAL, nullptr) != 0) {
        vips_error_clear();
        return nullptr;
      }
      pixels = ImageRef(shrunk);
    }
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
    return std::make_unique<VipsPicture>(std::move(bitmap), std::span<const std::uint8_t>(), false,
                                         1.0, extent);
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
    g_log_set_handler("VIPS", G_LOG_LEVEL_WARNING, ignoreWarning, nullptr);
    return true;
  }();
  return started;
}

}  // namespace

std::variant<std::unique_ptr<ImageService>, ImageServiceFailure> makeImageService() {
  if (!startLibrary()) return ImageServiceFailure::NoRenderingContext;
  try {
    return std::make_unique<VipsImageService>();
  } catch (const std::bad_alloc&) {
    return ImageServiceFailure::OutOfMemory;
  }
}

}  // namespace zt::platform
