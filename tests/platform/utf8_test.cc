#include "platform/utf8.h"

#include <gtest/gtest.h>

#include <string_view>
#include <utility>

namespace zt::platform::utf8 {
namespace {

TEST(Utf8, SequenceLengthsAndTheFormsThatAreNotUtf8) {
  const std::pair<std::string_view, std::size_t> cases[] = {
      {"A", 1},
      {"\xC3\xA9", 2},          // é
      {"\xE2\x82\xAC", 3},      // €
      {"\xF0\x9F\x98\x80", 4},  // U+1F600
      {"\xC0\xAF", 0},          // overlong "/"
      {"\xED\xA0\x80", 0},      // a surrogate
      {"\xF4\x90\x80\x80", 0},  // past U+10FFFF
      {"\xE2\x82", 0},          // cut short by the end
      {"\xE2\x28\xA1", 0},      // a continuation byte missing
  };
  for (const auto& [bytes, length] : cases) {
    EXPECT_EQ(sequenceLength(bytes, 0), length) << testing::PrintToString(bytes);
    EXPECT_EQ(isValid(bytes), length != 0) << testing::PrintToString(bytes);
  }
  EXPECT_TRUE(isValid(""));
  EXPECT_FALSE(isValid("ok \xC3"));
}

}  // namespace
}  // namespace zt::platform::utf8
