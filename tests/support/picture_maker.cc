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

int encode(VipsImage* image, const PictureRecipe& recipe, void** buffer, std::size_t* length) {
  switch (recipe.format) {
    case PictureFormat::JPEG:
      return vips_jpegsave_buffer(image, buffer, length, "Q", recipe.jpegQuality, "strip", TRUE,
                                  nullptr);
    case PictureFormat::PNG:
      return vips_pngsave_buffer(image, buffer, length, nullptr);
    case PictureFormat::GIF:
      return vips_gifsave_buffer(image, buffer, length, nullptr);
    case PictureFormat::WebP:
      return vips_webpsave_buffer(image, buffer, length, "lossless", TRUE, "strip", TRUE, nullptr);
    case PictureFormat::TIFF:
      return vips_tiffsave_buffer(image, buffer, length, nullptr);
  }
  return -1;
}

}  // namespace

std::optional<Data> makePicture(const PictureRecipe& recipe) {
  // The image service starts the library once per process.
  if (!std::holds_alternative<std::unique_ptr<platform::ImageService>>(
          platform::makeImageService())) {
    return std::nullopt;
  }
  const int width = recipe.size.width, height = recipe.size.height;
  // Each step replaces the picture with the result of one libvips operation.
  Owned image;
  const auto step = [&image](auto operation) {
    VipsImage* out = nullptr;
    if (operation(image.get(), &out) != 0 || !out) return false;
    image.reset(out);
    return true;
  };
  // Flat: one colour; otherwise red grows to the right and green downwards.
  const bool flat = recipe.pattern == PicturePattern::Flat;
  double scale[] = {flat ? 0.0 : 255.0 / std::max(1, width),
                    flat ? 0.0 : 255.0 / std::max(1, height)};
  double offset[] = {flat ? 200.0 : 0.0, flat ? 120.0 : 0.0};
  bool made =
      step([&](VipsImage*, VipsImage** out) { return vips_xyz(out, width, height, nullptr); }) &&
      step([&](VipsImage* in, VipsImage** out) {
        return vips_linear(in, out, scale, offset, 2, nullptr);
      }) &&
      step([](VipsImage* in, VipsImage** out) {
        return vips_bandjoin_const1(in, out, 64.0, nullptr);
      });
  if (made && recipe.pattern == PicturePattern::Noise) {
    VipsImage* noise = nullptr;
    made = vips_gaussnoise(&noise, width, height, "mean", 0.0, "sigma", 48.0, nullptr) == 0;
    Owned noisy(noise);
    made = made && step([&](VipsImage* in, VipsImage** out) {
             return vips_add(in, noisy.get(), out, nullptr);
           });
  }
  made = made &&
         step([](VipsImage* in, VipsImage** out) { return vips_cast_uchar(in, out, nullptr); }) &&
         step([](VipsImage* in, VipsImage** out) {
           return vips_copy(in, out, "interpretation", VIPS_INTERPRETATION_sRGB, nullptr);
         });
  void* buffer = nullptr;
  std::size_t length = 0;
  if (!made || encode(image.get(), recipe, &buffer, &length) != 0) {
    vips_error_clear();
    return std::nullopt;
  }
  const auto* bytes = static_cast<const std::uint8_t*>(buffer);
  Data picture(bytes, bytes + length);
  g_free(buffer);
  return picture;
}

}  // namespace zt::test_support
