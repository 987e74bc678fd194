#include "importers/stable_hash.h"

#include <cstdint>

namespace tessel::importers {

std::string stableHash(std::string_view text) {
  std::uint64_t hash = 0xcbf29ce484222325ULL;
  for (char c : text) {
    hash ^= static_cast<unsigned char>(c);
    hash *= 0x100000001b3ULL;
  }
  static constexpr char kHex[] = "0123456789abcdef";
  std::string hex(16, '0');
  for (std::size_t i = hex.size(); i-- > 0; hash >>= 4) hex[i] = kHex[hash & 0xF];
  return hex;
}

}  // namespace tessel::importers
