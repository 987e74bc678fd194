#include "platform/base64.h"

#include <gtest/gtest.h>

#include <string>
#include <tuple>

namespace zt::platform::base64 {
namespace {

std::string decodedText(std::string_view text, Form form) {
  const auto bytes = decode(text, form);
  return bytes ? std::string(bytes->begin(), bytes->end()) : "<none>";
}

TEST(Base64Decode, TheFormsDifferInBlanksPaddingAndUnusedBits) {
  const std::tuple<std::string_view, std::string, std::string> cases[] = {
      {"TWE=", "Ma", "Ma"},
      {"TWE", "<none>", "Ma"},           // padding left out
      {"TW\r\n E=", "<none>", "Ma"},     // a folded line
      {"TWF=", "<none>", "Ma"},          // bits the padding says are unused
      {"TQ==TQ==", "<none>", "<none>"},  // data after the padding
      {"T===", "<none>", "<none>"},      // one digit holds no byte
      {"TW-=", "<none>", "<none>"},      // outside the alphabet
  };
  for (const auto& [text, canonical, tolerant] : cases) {
    EXPECT_EQ(decodedText(text, Form::Canonical), canonical) << text;
    EXPECT_EQ(decodedText(text, Form::Tolerant), tolerant) << text;
  }
}

}  // namespace
}  // namespace zt::platform::base64
