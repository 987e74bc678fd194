#include "icalendar/icalendar_export.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <fstream>
#include <sstream>
#include <string>

#include "platform/log.h"
#include "platform/value.h"
#include "support/scoped_environment.h"
#include "support/temporary_folder.h"

namespace zt::icalendar {
namespace {

using platform::Array;
using platform::Number;
using platform::Value;

std::string line(std::string_view text) {
  std::string buffer;
  appendRFC2445Line(buffer, text);
  return buffer;
}

TEST(FoldingTest, FoldsEverySeventyTwoCodeUnitsOfTheUnfoldedLine) {
  const std::string a71(71, 'a'), a72(72, 'a'), a100(100, 'a'), a145(145, 'a');
  EXPECT_EQ(line(a71), a71 + "\r\n");
  // An exact multiple of 72 ends in a fold, so an empty continuation line follows.
  EXPECT_EQ(line(a72), a72 + "\r\n \r\n");
  EXPECT_EQ(line(a100), a72 + "\r\n " + std::string(28, 'a') + "\r\n");
  EXPECT_EQ(line(a145), a72 + "\r\n " + a72 + "\r\n a\r\n");
}

TEST(FoldingTest, CountsUtf16CodeUnitsNotBytes) {
  std::string e40;
  for (int i = 0; i < 40; ++i) e40 += "\xC3\xA9";  // 80 bytes, 40 code units
  EXPECT_EQ(line(e40), e40 + "\r\n");

  std::string e73 = std::string(71, 'a') + "\xC3\xA9\xC3\xA9";  // 73 code units
  EXPECT_EQ(line(e73), std::string(71, 'a') + "\xC3\xA9\r\n \xC3\xA9\r\n");
}

TEST(FoldingTest, StringFoldCopiesBufferFoldWorksInPlace) {
  std::string buffer(73, 'x');
  EXPECT_EQ(fold(std::string_view(buffer)), std::string(72, 'x') + "\r\n x");
  EXPECT_EQ(buffer.size(), 73U);
  fold(buffer);
  EXPECT_EQ(buffer, std::string(72, 'x') + "\r\n x");
}

TEST(FoldingTest, FoldingTheEndOfABufferInPlaceGivesTheFoldOfACopy) {
  for (const std::string unit : {"a", "\xC3\xA9", "\xF0\x9F\x98\x80"}) {
    for (std::size_t length = 0; length <= 220; ++length) {
      std::string text(length, 'x');
      if (length > 0) text.replace(length / 2, 1, unit);
      std::string buffer = "PREFIX:" + text;
      foldRFC2445From(buffer, 7);
      EXPECT_EQ(buffer, "PREFIX:" + fold(std::string_view(text))) << length << " " << unit;
    }
  }
}

TEST(EscapingTest, ValueEscapingFollowsTheReplacementOrder) {
  EXPECT_EQ(iCalendarEscapeValue("a;b,c\\d"), "a\\;b\\,c\\\\d");
  EXPECT_EQ(iCalendarEscapeValue("x\ry\nz"), "x\\ny\\nz");
  EXPECT_EQ(iCalendarEscapeValue("say \"hi\""), "say \\\"hi\\\"");
  EXPECT_EQ(iCalendarEscapeValue("10:30"), "10:30");
}

TEST(EscapingTest, ParameterEscapingAlsoEscapesColons) {
  EXPECT_EQ(iCalendarEscapeParameterValue("10:30"), "10\\:30");
  EXPECT_EQ(iCalendarEscapeParameterValue("a\\;:,\n\""), "a\\\\\\;\\:\\,\\n\\\"");
  // Parameter values the writer passes on are left alone.
  EXPECT_EQ(iCalendarParameterValue("a:b;c"), "a:b;c");
}

TEST(EscapingTest, QuotingWrapsUnlessBothEndsAreQuotes) {
  std::string buffer;
  appendQuotedString(buffer, "\"Ann\"");
  EXPECT_EQ(buffer, "\"Ann\"");
  EXPECT_EQ(iCalendarQuoted("Ann Smith"), "\"Ann Smith\"");
  EXPECT_EQ(iCalendarQuoted("\"Ann"), "\"\"Ann\"");

  std::string value = "Bob";
  quoteRFC2445Value(value);
  EXPECT_EQ(value, "\"Bob\"");
}

TEST(NumberFormsTest, UtcOffsets) {
  const struct {
    std::int64_t seconds;
    const char* text;
  } cases[] = {{-1800, "-0030"}, {19800, "+0530"}, {3661, "+010101"}, {90000, "+0100"}};
  for (const auto& c : cases) {
    std::string buffer;
    appendRFC2445UTCOffsetRepresentationTo(Number::integer(c.seconds), buffer);
    EXPECT_EQ(buffer, c.text) << c.seconds;
  }
}

TEST(NumberFormsTest, Durations) {
  const struct {
    std::int64_t seconds;
    const char* text;
  } cases[] = {{-900, "-PT15M"}, {86400, "P1D"}, {90061, "P1DT1H1M1S"}, {0, "PT0S"}};
  for (const auto& c : cases) {
    EXPECT_EQ(iCalendarDurationRepresentation(Number::integer(c.seconds)), c.text) << c.seconds;
  }
}

TEST(NumberFormsTest, BooleansAndDecimals) {
  std::string buffer;
  appendRFC2445BoolRepresentationTo(Number::boolean(false), buffer);
  appendRFC2445BoolRepresentationTo(Number::integer(-3), buffer);
  EXPECT_EQ(buffer, "FALSETRUE");
  EXPECT_EQ(iCalendarRepresentation(Value::real(2.9)), "2");
}

TEST(PartStatTest, TwoWordsAreHyphenatedOthersUpperCased) {
  EXPECT_EQ(iCalendarRepresentationPartStat("needsaction"), "NEEDS-ACTION");
  EXPECT_EQ(iCalendarRepresentationPartStat("tentative"), "TENTATIVE");
  EXPECT_EQ(iCalendarRepresentationPartStat("NEEDS-ACTION"), "NEEDS-ACTION");
  EXPECT_EQ(iCalendarRepresentationPartStat("NeedsAction"), "NEEDSACTION");
}

TEST(ValueFormsTest, ArraysJoinTheirElementsForms) {
  const Value months = Array{Value::integer(1), Value::integer(6), Value::integer(12)};
  EXPECT_EQ(iCalendarRepresentation(months), "1,6,12");
  EXPECT_EQ(iCalendarRepresentation(Value(platform::Url{"https://example.org/a,b"})),
            "https://example.org/a,b");

  std::string buffer;
  appendRFC2445ParameterArrayRepresentationTo(Array{"a:b", "c", Value::integer(3)}, buffer);
  EXPECT_EQ(buffer, "a\\:b,c,3");
}

TEST(ValueFormsTest, KindsWithoutAFormAreLoggedAndWrittenByDescription) {
  zt::test_support::TemporaryFolder folder;
  const std::string log = folder / "log";
  const Value record = platform::Dictionary{{"k", "v"}};
  {
    zt::test_support::ScopedEnvironment environment;
    environment.set("ZETOSYNCTOOL_LOG", log);
    platform::Log::configureFromEnvironment();
    EXPECT_EQ(iCalendarRepresentation(record), record.description());
    EXPECT_EQ(iCalendarRepresentation(Value(Array{record})), record.description());
  }
  platform::Log::configureFromEnvironment();

  std::ifstream in(log);
  std::stringstream logged;
  logged << in.rdbuf();
  const std::string warning =
      "WARNING appendRFC2445RepresentationTo was called on RootObject - dictionary " +
      record.description() + "\n";
  EXPECT_EQ(logged.str(), warning + warning);
}

TEST(DatePropertyLineTest, NonDatesAreEscapedAndNeverFolded) {
  std::string buffer;
  const std::string longText(80, 'x');
  appendDatePropertyLine(buffer, "X-NOTE", Value("a;b"));
  appendDatePropertyLine(buffer, "X-LONG", Value(longText));
  EXPECT_EQ(buffer, "X-NOTE:a\\;b\r\nX-LONG:" + longText + "\r\n");
}

}  // namespace
}  // namespace zt::icalendar
