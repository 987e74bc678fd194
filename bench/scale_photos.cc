// Photos for the scale benchmark (bench/scale).
//
//   scale_photos make DIR COUNT SEED   writes COUNT decodable pictures, JPEG and PNG, of 30 to
//                                      300 KB each, into DIR: gradients under seeded noise,
//                                      the same bytes for the same seed on every run
//   scale_photos prepare DIR           converts every picture in DIR through the card writer's
//                                      photo code (ContactPhotoPreparation), in one process,
//                                      and prints "photos N seconds S bytes B"
#include <vips/vips.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "contacts/contact_photo.h"
#include "platform/image_service.h"
#include "platform/value.h"
#include "tessel/schema.h"

namespace {

namespace fs = std::filesystem;
using zt::platform::Data;
using zt::platform::Dictionary;

constexpr std::size_t kSmallest = 30 * 1024;
constexpr std::size_t kLargest = 300 * 1024;

// xorshift64*: small, seeded, the same on every machine.
struct Random {
  std::uint64_t state;
  explicit Random(std::uint64_t seed) : state(seed * 0x9E3779B97F4A7C15ULL + 1) {}
  std::uint64_t next() {
    state ^= state >> 12;
    state ^= state << 25;
    state ^= state >> 27;
    return state * 0x2545F4914F6CDD1DULL;
  }
  double unit() { return static_cast<double>(next() >> 11) / 9007199254740992.0; }
};

// Encodes a width x height RGB picture: a diagonal gradient in two colours under noise of
// the given amplitude. Empty on failure.
Data encode(int width, int height, int amplitude, std::uint64_t seed, bool png) {
  Random random(seed);
  const double r0 = random.unit() * 255, g0 = random.unit() * 255, b0 = random.unit() * 255;
  const double r1 = random.unit() * 255, g1 = random.unit() * 255, b1 = random.unit() * 255;
  std::vector<std::uint8_t> pixels(static_cast<std::size_t>(width) * height * 3);
  std::size_t at = 0;
  for (int y = 0; y < height; ++y) {
    for (int x = 0; x < width; ++x) {
      const double t = (static_cast<double>(x) / width + static_cast<double>(y) / height) / 2;
      const double base[3] = {r0 + (r1 - r0) * t, g0 + (g1 - g0) * t, b0 + (b1 - b0) * t};
      for (double channel : base) {
        const int noise = static_cast<int>(random.next() % (2 * amplitude + 1)) - amplitude;
        pixels[at++] =
            static_cast<std::uint8_t>(std::clamp(static_cast<int>(channel) + noise, 0, 255));
      }
    }
  }
  VipsImage* image =
      vips_image_new_from_memory(pixels.data(), pixels.size(), width, height, 3, VIPS_FORMAT_UCHAR);
  if (image == nullptr) return {};
  void* buffer = nullptr;
  std::size_t length = 0;
  const int failed =
      png ? vips_pngsave_buffer(image, &buffer, &length, "compression", 6, nullptr)
          : vips_jpegsave_buffer(image, &buffer, &length, "Q", 85, "strip", TRUE, nullptr);
  g_object_unref(image);
  if (failed != 0) return {};
  Data bytes(static_cast<std::uint8_t*>(buffer), static_cast<std::uint8_t*>(buffer) + length);
  g_free(buffer);
  return bytes;
}

int make(const fs::path& folder, int count, std::uint64_t seed) {
  fs::create_directories(folder);
  // Bytes per pixel, learnt as pictures are made, so that most need one encoding only.
  double perPixel[2] = {1.0, 1.5};
  for (int i = 0; i < count; ++i) {
    Random random(seed * 1000003 + static_cast<std::uint64_t>(i));
    const bool png = random.unit() < 0.35;
    // Sizes spread evenly on a log scale between the smallest and the largest.
    const double low = kSmallest * 1.1, high = kLargest * 0.9;
    const double target = low * std::pow(high / low, random.unit());
    const double shape = 0.75 + random.unit() * 0.6;
    const int amplitude = 6 + static_cast<int>(random.next() % 30);
    const std::uint64_t pictureSeed = random.next();
    double pixels = target / perPixel[png];
    Data bytes;
    for (int attempt = 0; attempt < 12; ++attempt) {
      const int width = std::max(16, static_cast<int>(std::sqrt(pixels * shape)));
      const int height = std::max(16, static_cast<int>(pixels / width));
      bytes = encode(width, height, amplitude, pictureSeed, png);
      if (bytes.empty()) {
        std::fprintf(stderr, "libvips could not encode a picture: %s\n", vips_error_buffer());
        return 1;
      }
      const double made = static_cast<double>(bytes.size());
      perPixel[png] = made / (static_cast<double>(width) * height);
      if (bytes.size() >= kSmallest && bytes.size() <= kLargest) break;
      pixels = target / perPixel[png];
    }
    if (bytes.size() < kSmallest || bytes.size() > kLargest) {
      std::fprintf(stderr, "picture %d: %zu bytes, outside the range\n", i, bytes.size());
      return 1;
    }
    char name[32];
    std::snprintf(name, sizeof name, "photo%05d.%s", i, png ? "png" : "jpg");
    std::ofstream(folder / name, std::ios::binary)
        .write(reinterpret_cast<const char*>(bytes.data()),
               static_cast<std::streamsize>(bytes.size()));
  }
  return 0;
}

int prepare(const fs::path& folder) {
  std::vector<fs::path> names;
  for (const auto& entry : fs::directory_iterator(folder)) names.push_back(entry.path());
  std::sort(names.begin(), names.end());
  std::vector<Dictionary> contacts;
  for (const fs::path& name : names) {
    std::ifstream in(name, std::ios::binary);
    Data bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    contacts.push_back(Dictionary{{tessel::TesselAttribute_Contacts_Contact_Image, bytes}});
  }
  zt::contacts::ContactPhotoPreparation preparation(zt::platform::makeImageService);
  std::size_t prepared = 0, bytes = 0;
  const auto start = std::chrono::steady_clock::now();
  for (const Dictionary& contact : contacts) {
    if (std::optional<Data> photo = preparation.photoForContact(contact)) {
      ++prepared;
      bytes += photo->size();
    }
  }
  const double seconds =
      std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
  std::printf("photos %zu seconds %.3f bytes %zu\n", prepared, seconds, bytes);
  return prepared == contacts.size() ? 0 : 1;
}

}  // namespace

int main(int argc, char** argv) {
  if (VIPS_INIT(argv[0]) != 0) return 1;
  if (argc == 5 && std::strcmp(argv[1], "make") == 0) {
    return make(argv[2], std::atoi(argv[3]), std::strtoull(argv[4], nullptr, 10));
  }
  if (argc == 3 && std::strcmp(argv[1], "prepare") == 0) return prepare(argv[2]);
  std::fprintf(stderr, "usage: scale_photos make DIR COUNT SEED | prepare DIR\n");
  return 2;
}
