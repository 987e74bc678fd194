#include "platform/base64.h"

#include <gtest/gtest.h>

#include <string>

namespace zt::platform::base64 {
namespace {

std::string decodedText(std::string_view text, Form form) {
  const auto bytes = decode(text, form);
  return bytes ? std::string(bytes->begin(), bytes->end()) : "<none>";
}

TEST(Base64Decode, TheFormsDifferInBlanksPaddingAndUnusedBits) {
  struct Case {
    std::string_view text;
    std::string canonical, tolerant;
  };
  const Case cases[] = {
      {"TWE=", "Ma", "Ma"},
      {"TWE", "<none>", "Ma"},           // padding left out
      {"TW\r\n E=", "<none>", "Ma"},     // a folded line
      {"TWF=", "<none>", "Ma"},          // bits the padding says are unused
      {"TQ==TQ==", "<none>", "<none>"},  // data after the padding
      {"T===", "<none>", "<none>"},      // one digit holds no byte
      {"TW-=", "<none>", "<none>"},      // outside the alphabet
  };
  for (const Case& c : cases) {
    EXPECT_EQ(decodedText(c.text, Form::Canonical), c.canonical) << c.text;
    EXPECT_EQ(decodedText(c.text, Form::Tolerant), c.tolerant) << c.text;
  }
}

}  // namespace
}  // namespace zt::platform::base64
