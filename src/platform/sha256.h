#pragma once

#include <array>
#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <string_view>

namespace zt::platform {

// A SHA-256 digest (FIPS 180-4) fed in pieces, for keys that must change whenever any byte of
// what they stand for does.
class Sha256 {
 public:
  using Digest = std::array<std::uint8_t, 32>;

  Sha256();
  ~Sha256();
  Sha256(const Sha256&) = delete;
  Sha256& operator=(const Sha256&) = delete;

  void update(std::span<const std::uint8_t> bytes);
  void update(std::string_view text);
  // The digest of everything fed so far; the object is spent afterwards.
  Digest finish();

 private:
  struct State;
  std::unique_ptr<State> state_;
};

// A digest as 64 lower-case hexadecimal digits, as the caches name their entries.
std::string hexOf(const Sha256::Digest& digest);
// Whether `name` is such a text.
bool isHexDigest(std::string_view name);

}  // namespace zt::platform
