#include "contacts/vcard_text.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <vector>

namespace zt::contacts {
namespace {

std::string block(std::size_t size) {
  std::vector<std::uint8_t> bytes(size);
  for (std::size_t i = 0; i < size; ++i) bytes[i] = static_cast<std::uint8_t>(i * 7 + 3);
  std::string out = "PHOTO;BASE64:\r\n";
  appendBase64Block(out, bytes);
  return out.substr(15);
}

TEST(VCardBase64, LinesOfSeventySixCharactersBehindASpace) {
  std::string man;
  appendBase64Block(man, std::vector<std::uint8_t>{0x4D, 0x61, 0x6E});
  EXPECT_EQ(man, " TWFu\r\n");

  std::string padded;
  appendBase64Block(padded, std::vector<std::uint8_t>{0x4D});
  EXPECT_EQ(padded, " TQ==\r\n");

  std::string empty;
  appendBase64Block(empty, {});
  EXPECT_EQ(empty, "\r\n");

  // 57 bytes fill exactly one line; one more byte opens a second line of four characters.
  const std::string one = block(57);
  ASSERT_EQ(one.size(), 1u + 76u + 2u);
  EXPECT_EQ(one.front(), ' ');
  EXPECT_EQ(one.substr(77), "\r\n");
  const std::string two = block(58);
  ASSERT_EQ(two.size(), 79u + 1u + 4u + 2u);
  EXPECT_EQ(two.substr(0, 79), one);
  EXPECT_EQ(two.substr(84), "\r\n");
  EXPECT_EQ(two.substr(82, 2), "==");
}

}  // namespace
}  // namespace zt::contacts
