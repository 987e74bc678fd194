#include "platform/utf16.h"

#include <gtest/gtest.h>

#include <string>

namespace zt::platform::utf16 {
namespace {

// U+1F600 GRINNING FACE: four UTF-8 bytes, a surrogate pair in UTF-16.
const std::string kGrin = "\xF0\x9F\x98\x80";
const std::string kReplacement = "\xEF\xBF\xBD";

TEST(Utf16Conversion, BasicPlaneRoundTrips) {
  const std::string text = "A\xC3\xA9\xE2\x82\xAC\xEF\xBF\xBF";  // A é € U+FFFF
  const std::u16string units = fromUtf8(text);
  EXPECT_EQ(units, (std::u16string{u'A', 0x00E9, 0x20AC, 0xFFFF}));
  EXPECT_EQ(toUtf8(units), text);
  EXPECT_EQ(length(text), 4u);
  EXPECT_EQ(fromUtf8(""), u"");
  EXPECT_EQ(toUtf8(u""), "");
}

TEST(Utf16Conversion, SupplementaryCharactersBecomeSurrogatePairs) {
  const std::string text = "a" + kGrin + "\xF4\x8F\xBF\xBF" + "\xF0\x90\x80\x80";
  const std::u16string units = fromUtf8(text);
  EXPECT_EQ(units, (std::u16string{u'a', 0xD83D, 0xDE00, 0xDBFF, 0xDFFF, 0xD800, 0xDC00}));
  EXPECT_EQ(toUtf8(units), text);
  EXPECT_EQ(length(text), 7u);
}

TEST(Utf16Conversion, LoneSurrogatesBecomeReplacementCharacters) {
  EXPECT_EQ(toUtf8(std::u16string{0xD83D}), kReplacement);
  EXPECT_EQ(toUtf8(std::u16string{0xD83D, u'x', 0xD83D}), kReplacement + "x" + kReplacement);
  // Two high halves in a row: neither has its low half.
  EXPECT_EQ(toUtf8(std::u16string{0xD83D, 0xD83D, 0xDE00}), kReplacement + kGrin);
}

TEST(Utf16Conversion, MalformedUtf8BecomesReplacementCharacters) {
  struct Case {
    std::string input;
    std::u16string expected;
  };
  const Case cases[] = {
      {"\x80", u"\uFFFD"},                                // stray continuation byte
      {"\xC3(", u"\uFFFD("},                              // next character not swallowed
      {"\xC0\xAF", u"\uFFFD\uFFFD"},                      // overlong "/"
      {"\xED\xA0\x80", u"\uFFFD\uFFFD\uFFFD"},            // UTF-8 encoded surrogate D800
      {"\xF4\x90\x80\x80", u"\uFFFD\uFFFD\uFFFD\uFFFD"},  // above U+10FFFF
      {"\xF0\x9F\x98", u"\uFFFD"},                        // truncated four-byte character
      {"\xE2\x82x", u"\uFFFDx"},                          // maximal subpart is one replacement
  };
  for (const Case& c : cases) {
    EXPECT_EQ(fromUtf8(c.input), c.expected) << testing::PrintToString(c.input);
    EXPECT_EQ(length(c.input), c.expected.size()) << testing::PrintToString(c.input);
  }
}

TEST(Utf16Fold, FoldsAtMultiplesOfTheLimitCountingUnits) {
  // Positions count units of the original text, not of the folded one.
  std::string three(9, 'd');
  fold(three, 3);
  EXPECT_EQ(three, "ddd\r\n ddd\r\n ddd\r\n ");
  // A surrogate pair ending exactly at the limit is kept whole.
  std::string pair = std::string(70, 'a') + kGrin + "b";
  fold(pair, 72);
  EXPECT_EQ(pair, std::string(70, 'a') + kGrin + "\r\n b");
}

TEST(Utf16Fold, CutInsideASurrogatePairSplitsTheCharacter) {
  std::string text = std::string(71, 'a') + kGrin + "b";
  fold(text, 72);
  EXPECT_EQ(text, std::string(71, 'a') + kReplacement + "\r\n " + kReplacement + "b");

  // A text of pairs only, with an odd limit: cuts alternate between inside and between pairs.
  std::string grins;
  for (int i = 0; i < 3; ++i) grins += kGrin;  // 6 units
  fold(grins, 3);
  EXPECT_EQ(grins, kGrin + kReplacement + "\r\n " + kReplacement + kGrin + "\r\n ");
}

TEST(Utf16Fold, EveryLineHoldsLimitUnitsOfTheOriginal) {
  std::string text;
  for (int i = 0; i < 60; ++i) text += "x\xC3\xA9\xE2\x82\xAC" + kGrin;  // 5 units each
  for (std::size_t limit : {72u, 75u}) {
    std::string folded = text;
    fold(folded, limit);
    std::size_t start = 0, lines = 0;
    for (std::size_t end; (end = folded.find("\r\n", start)) != std::string::npos; ++lines) {
      // A split pair leaves one U+FFFD per half, so units still match the original's.
      const std::size_t leadingSpace = start == 0 ? 0 : 1;
      EXPECT_EQ(length(std::string_view(folded).substr(start, end - start)) - leadingSpace, limit)
          << "limit " << limit << " line " << lines;
      start = end + 2;
    }
    EXPECT_EQ(lines, length(text) / limit) << "limit " << limit;
  }
}

TEST(Utf16Fold, MalformedBytesAreKeptAndCountAsOneUnit) {
  std::string text =
      "ab\xFF"
      "cd";
  fold(text, 3);
  EXPECT_EQ(text, "ab\xFF\r\n cd");
}

TEST(Utf16BigEndian, AppendsUnitsWithoutByteOrderMark) {
  std::string out = "prefix";
  appendBigEndian(out, "A");
  EXPECT_EQ(out, std::string("prefix\x00\x41", 8));

  out.clear();
  appendBigEndian(out, kGrin);
  EXPECT_EQ(out, std::string("\xD8\x3D\xDE\x00", 4));

  out.clear();
  appendBigEndian(out, "\xE2\x82\xAC\x80");  // € then a stray byte
  EXPECT_EQ(out, "\x20\xAC\xFF\xFD");
}

}  // namespace
}  // namespace zt::platform::utf16
