#include "platform/sha256.h"

#include <openssl/evp.h>

#include <tuple>

namespace zt::platform {

struct Sha256::State {
  EVP_MD_CTX* context = EVP_MD_CTX_new();
  bool usable = context != nullptr && EVP_DigestInit_ex(context, EVP_sha256(), nullptr) == 1;
  ~State() { EVP_MD_CTX_free(context); }
};

Sha256::Sha256() : state_(std::make_unique<State>()) {}

Sha256::~Sha256() = default;

void Sha256::update(std::span<const std::uint8_t> bytes) {
  if (state_->usable)
    state_->usable = EVP_DigestUpdate(state_->context, bytes.data(), bytes.size()) == 1;
}

void Sha256::update(std::string_view text) {
  if (state_->usable)
    state_->usable = EVP_DigestUpdate(state_->context, text.data(), text.size()) == 1;
}

Sha256::Digest Sha256::finish() {
  Digest digest{};
  unsigned int length = 0;
  // A digest that could not be computed stays all zeros: a key nothing else has, and the
  // cache entry it names is checked against the whole key when read.
  if (state_->usable) EVP_DigestFinal_ex(state_->context, digest.data(), &length);
  state_->usable = false;
  return digest;
}

std::string hexOf(const Sha256::Digest& digest) {
  static constexpr char kHex[] = "0123456789abcdef";
  std::string text;
  text.reserve(2 * digest.size());
  for (std::uint8_t byte : digest) {
    text += kHex[byte >> 4];
    text += kHex[byte & 0xF];
  }
  return text;
}

bool isHexDigest(std::string_view name) {
  return name.size() == 2 * std::tuple_size_v<Sha256::Digest> &&
         name.find_first_not_of("0123456789abcdef") == std::string_view::npos;
}

}  // namespace zt::platform
