#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string_view>
#include <variant>

#include "platform/value.h"

namespace zt::platform {

struct PixelSize {
  int width = 0;
  int height = 0;
  bool operator==(const PixelSize&) const = default;
};

// A picture held by the image service: decoded from bytes, scaled, or rendered into a bitmap.
// Decoding and scaling only describe the picture; the pixels are computed when it is
// rendered, so a large JPEG that is scaled down can be decoded at a reduced size.
class Image {
 public:
  virtual ~Image() = default;
  // Width and height in pixels, with the origin at (0, 0).
  virtual PixelSize extent() const = 0;
};

// Why the service could not be started.
enum class ImageServiceFailure { OutOfMemory, NoRenderingContext };

// Decoding of the common picture formats, uniform scaling, rendering into an 8-bit RGB bitmap
// without alpha, and JPEG encoding. Abstract so that tests can make any step fail; the real
// implementation is libvips (makeImageService).
class ImageService {
 public:
  virtual ~ImageService() = default;

  // Reads the picture's header. The bytes must outlive the image and every image made from
  // it. None when the bytes are no photo format the service reads (JPEG, HEIF/AVIF, WebP, PNG,
  // GIF, TIFF; never documents such as SVG or PDF), or when the header claims a picture larger
  // than its format's budget of pixels, so that no picture costs more than a bounded decode.
  virtual std::unique_ptr<Image> decode(std::span<const std::uint8_t> bytes) = 0;
  // The image scaled by `factor` on both axes; its extent is the scaled extent rounded to
  // whole pixels. None when the image cannot be scaled.
  virtual std::unique_ptr<Image> scale(const Image& image, float factor) = 0;
  // Computes the region of `size` pixels at the origin into a bitmap of 8-bit sRGB pixels;
  // transparent parts are laid over black. None when the pixels cannot be computed (damaged
  // data, unsupported colour space).
  virtual std::unique_ptr<Image> render(const Image& image, PixelSize size) = 0;
  // Baseline JPEG at the encoder's default quality, without metadata. None when the encoder
  // cannot be made.
  virtual std::optional<Data> encodeJPEG(const Image& bitmap) = 0;
};

// A libvips service. The library is started once per process, at the first call.
std::variant<std::unique_ptr<ImageService>, ImageServiceFailure> makeImageService();

// The library and version that makeImageService() decodes and encodes with, fixed when the
// tool is built: what a kept conversion depends on besides the picture.
std::string_view imageServiceIdentity();

}  // namespace zt::platform
