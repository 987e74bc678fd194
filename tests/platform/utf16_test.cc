#include "platform/utf16.h"

#include <gtest/gtest.h>

#include <string>
#include <tuple>
#include <utility>

namespace zt::platform::utf16 {
namespace {

// U+1F600 GRINNING FACE: four UTF-8 bytes, a surrogate pair in UTF-16.
const std::string kGrin = "\xF0\x9F\x98\x80";
const std::string kReplacement = "\xEF\xBF\xBD";

TEST(Utf16Conversion, RoundTripsAndMalformedInputBecomesReplacementCharacters) {
  const std::string text = "A\xC3\xA9\xEF\xBF\xBF" + kGrin + "\xF4\x8F\xBF\xBF";  // A é U+FFFF
  const std::u16string units = fromUtf8(text);
  EXPECT_EQ(units, (std::u16string{u'A', 0x00E9, 0xFFFF, 0xD83D, 0xDE00, 0xDBFF, 0xDFFF}));
  EXPECT_EQ(toUtf8(units), text);
  EXPECT_EQ(length(text), 7u);
  // Two high halves in a row: neither has its low half.
  EXPECT_EQ(toUtf8(std::u16string{0xD83D, u'x', 0xD83D, 0xD83D, 0xDE00}),
            kReplacement + "x" + kReplacement + kGrin);
  const std::pair<std::string, std::u16string> malformed[] = {
      {"\xC3(", u"\uFFFD("},                              // next character not swallowed
      {"\xC0\xAF", u"\uFFFD\uFFFD"},                      // overlong "/"
      {"\xED\xA0\x80", u"\uFFFD\uFFFD\uFFFD"},            // UTF-8 encoded surrogate D800
      {"\xF4\x90\x80\x80", u"\uFFFD\uFFFD\uFFFD\uFFFD"},  // above U+10FFFF
      {"\xE2\x82x", u"\uFFFDx"},                          // maximal subpart is one replacement
  };
  for (const auto& [input, expected] : malformed) {
    EXPECT_EQ(fromUtf8(input), expected) << testing::PrintToString(input);
    EXPECT_EQ(length(input), expected.size()) << testing::PrintToString(input);
  }
}

TEST(Utf16Fold, FoldsAtMultiplesOfTheLimitSplittingPairsCutInside) {
  std::string grins;
  for (int i = 0; i < 3; ++i) grins += kGrin;  // 6 units
  const std::tuple<std::string, std::size_t, std::string> cases[] = {
      {std::string(9, 'd'), 3, "ddd\r\n ddd\r\n ddd\r\n "},
      // A pair ending exactly at the limit is kept whole; one cut inside is split.
      {std::string(70, 'a') + kGrin + "b", 72, std::string(70, 'a') + kGrin + "\r\n b"},
      {std::string(71, 'a') + kGrin + "b", 72,
       std::string(71, 'a') + kReplacement + "\r\n " + kReplacement + "b"},
      {grins, 3, kGrin + kReplacement + "\r\n " + kReplacement + kGrin + "\r\n "},
      // Malformed bytes are kept and count as one unit.
      {"ab\xFF"
       "cd",
       3, "ab\xFF\r\n cd"},
  };
  for (auto [folded, limit, expected] : cases) {
    const std::string text = folded;
    fold(folded, limit);
    EXPECT_EQ(folded, expected) << testing::PrintToString(text);
  }
}

TEST(Utf16BigEndian, AppendsUnitsWithoutByteOrderMark) {
  std::string out = "p";
  appendBigEndian(out, "A" + kGrin + "\xE2\x82\xAC\x80");  // € then a stray byte
  EXPECT_EQ(out, std::string("p\x00\x41\xD8\x3D\xDE\x00\x20\xAC\xFF\xFD", 11));
}

}  // namespace
}  // namespace zt::platform::utf16
