#pragma once

#include <optional>

#include "platform/image_service.h"
#include "platform/value.h"

namespace zt::test_support {

using platform::Data;
using platform::PixelSize;

// WebP is written lossless, TIFF uncompressed.
enum class PictureFormat { JPEG, PNG, GIF, WebP, TIFF };
// Flat pictures compress to almost nothing; noisy ones are as large as photographs get.
enum class PicturePattern { Flat, Gradient, Noise };

struct PictureRecipe {
  PixelSize size;
  PictureFormat format = PictureFormat::JPEG;
  PicturePattern pattern = PicturePattern::Gradient;
  int jpegQuality = 75;
};

// The encoded bytes of a synthetic picture, made with libvips, for tests and benchmarks that
// need pictures of known sizes and formats. None when libvips cannot start or encode.
std::optional<Data> makePicture(const PictureRecipe& recipe);

}  // namespace zt::test_support
