#include "support/picture_maker.h"

#include <vips/vips.h>

#include <algorithm>
#include <memory>

namespace zt::test_support {

namespace {

struct Unref {
  void operator()(VipsImage* image) const { g_object_unref(image); }
};
using Owned = std::unique_ptr<VipsImage, Unref>;

// Runs one libvips operation on `image`, replacing it with the result; false on failure.
template <typename Operation>
bool step(Owned& image, Operation operation) {
  VipsImage* out = nullptr;
  if (operation(image.get(), &out) != 0 || !out) {
    vips_error_clear();
    return false;
  }
  image.reset(out);
  return true;
}

}  // namespace

std::optional<Data> makePicture(const PictureRecipe& recipe) {
  // The image service starts the library once per process.
  if (!std::holds_alternative<std::unique_ptr<platform::ImageService>>(
          platform::makeImageService())) {
    return std::nullopt;
  }
  const int width = recipe.size.width;
  const int height = recipe.size.height;
  VipsImage* start = nullptr;
  if (vips_xyz(&start, width, height, nullptr) != 0) {
    vips_error_clear();
    return std::nullopt;
  }
  Owned image(start);
  const bool made = [&] {
    if (recipe.pattern == PicturePattern::Flat) {
      double scale[] = {0.0, 0.0};
      double offset[] = {200.0, 120.0};
      if (!step(image, [&](VipsImage* in, VipsImage** out) {
            return vips_linear(in, out, scale, offset, 2, nullptr);
          })) {
        return false;
      }
    } else {
      // Red grows to the right, green downwards.
      double scale[] = {255.0 / std::max(1, width), 255.0 / std::max(1, height)};
      double offset[] = {0.0, 0.0};
      if (!step(image, [&](VipsImage* in, VipsImage** out) {
            return vips_linear(in, out, scale, offset, 2, nullptr);
          })) {
        return false;
      }
    }
    if (!step(image, [](VipsImage* in, VipsImage** out) {
          return vips_bandjoin_const1(in, out, 64.0, nullptr);
        })) {
      return false;
    }
    if (recipe.pattern == PicturePattern::Noise) {
      VipsImage* noise = nullptr;
      if (vips_gaussnoise(&noise, width, height, "mean", 0.0, "sigma", 48.0, nullptr) != 0) {
        vips_error_clear();
        return false;
      }
      Owned noisy(noise);
      if (!step(image, [&](VipsImage* in, VipsImage** out) {
            return vips_add(in, noisy.get(), out, nullptr);
          })) {
        return false;
      }
    }
    const bool alphaFormat = recipe.format == PictureFormat::PNG ||
                             recipe.format == PictureFormat::WebP ||
                             recipe.format == PictureFormat::TIFF;
    if (alphaFormat && recipe.alpha == PictureAlpha::HalfTransparent &&
        !step(image, [](VipsImage* in, VipsImage** out) {
          return vips_bandjoin_const1(in, out, 128.0, nullptr);
        })) {
      return false;
    }
    if (!step(image,
              [](VipsImage* in, VipsImage** out) { return vips_cast_uchar(in, out, nullptr); })) {
      return false;
    }
    return step(image, [](VipsImage* in, VipsImage** out) {
      return vips_copy(in, out, "interpretation", VIPS_INTERPRETATION_sRGB, nullptr);
    });
  }();
  if (!made) return std::nullopt;

  void* buffer = nullptr;
  std::size_t length = 0;
  const int failed = [&] {
    switch (recipe.format) {
      case PictureFormat::JPEG:
        return vips_jpegsave_buffer(image.get(), &buffer, &length, "Q", recipe.jpegQuality, "strip",
                                    TRUE, nullptr);
      case PictureFormat::PNG:
        return vips_pngsave_buffer(image.get(), &buffer, &length, nullptr);
      case PictureFormat::GIF:
        return vips_gifsave_buffer(image.get(), &buffer, &length, nullptr);
      case PictureFormat::WebP:
        return vips_webpsave_buffer(image.get(), &buffer, &length, "lossless", TRUE, "strip", TRUE,
                                    nullptr);
      case PictureFormat::TIFF:
        return vips_tiffsave_buffer(image.get(), &buffer, &length, nullptr);
    }
    return -1;
  }();
  if (failed != 0) {
    vips_error_clear();
    return std::nullopt;
  }
  const auto* bytes = static_cast<const std::uint8_t*>(buffer);
  Data picture(bytes, bytes + length);
  g_free(buffer);
  return picture;
}

}  // namespace zt::test_support
