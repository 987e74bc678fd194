#include "icalendar/icalendar_export.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <tuple>

#include "platform/log.h"
#include "platform/value.h"
#include "support/captured_log.h"

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

TEST(FoldingTest, FoldsEverySeventyTwoUtf16CodeUnitsOfTheUnfoldedLine) {
  const std::string a71(71, 'a'), a72(72, 'a');
  EXPECT_EQ(line(a71), a71 + "\r\n");
  // An exact multiple of 72 ends in a fold, so an empty continuation line follows.
  EXPECT_EQ(line(a72), a72 + "\r\n \r\n");
  EXPECT_EQ(line(std::string(145, 'a')), a72 + "\r\n " + a72 + "\r\n a\r\n");
  std::string e40;
  for (int i = 0; i < 40; ++i) e40 += "\xC3\xA9";  // 80 bytes, 40 code units
  EXPECT_EQ(line(e40), e40 + "\r\n");
  EXPECT_EQ(line(a71 + "\xC3\xA9\xC3\xA9"), a71 + "\xC3\xA9\r\n \xC3\xA9\r\n");
}

// The exporter folds the end of its output buffer in place; that must give what folding a
// copy gives, whatever character the fold falls next to.
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

TEST(EscapingTest, ValuesParametersAndQuotes) {
  EXPECT_EQ(iCalendarEscapeValue("a;b,c\\d"), "a\\;b\\,c\\\\d");
  EXPECT_EQ(iCalendarEscapeValue("x\ry\nz \"hi\" 10:30"), "x\\ny\\nz \\\"hi\\\" 10:30");
  EXPECT_EQ(iCalendarEscapeParameterValue("a\\;:,\n\""), "a\\\\\\;\\:\\,\\n\\\"");
  // Parameter values the writer passes on are left alone.
  EXPECT_EQ(iCalendarParameterValue("a:b;c"), "a:b;c");
  EXPECT_EQ(iCalendarQuoted("\"Ann\""), "\"Ann\"");
  EXPECT_EQ(iCalendarQuoted("\"Ann"), "\"\"Ann\"");
}

TEST(NumberFormsTest, OffsetsDurationsBooleansAndDecimals) {
  const std::tuple<std::int64_t, std::string, std::string> cases[] = {{-1800, "-0030", "-PT30M"},
                                                                      {3661, "+010101", "PT1H1M1S"},
                                                                      {90000, "+0100", "P1DT1H"},
                                                                      {0, "+0000", "PT0S"}};
  for (const auto& [seconds, expectedOffset, duration] : cases) {
    SCOPED_TRACE(seconds);
    std::string offset;
    appendRFC2445UTCOffsetRepresentationTo(Number::integer(seconds), offset);
    EXPECT_EQ(offset, expectedOffset);
    EXPECT_EQ(iCalendarDurationRepresentation(Number::integer(seconds)), duration);
  }
  std::string buffer;
  appendRFC2445BoolRepresentationTo(Number::boolean(false), buffer);
  appendRFC2445BoolRepresentationTo(Number::integer(-3), buffer);
  EXPECT_EQ(buffer, "FALSETRUE");
  EXPECT_EQ(iCalendarRepresentation(Value::real(2.9)), "2");
  EXPECT_EQ(iCalendarRepresentationPartStat("NeedsAction"), "NEEDSACTION");
}

TEST(ValueFormsTest, KindsWithoutAFormAreLoggedAndWrittenByDescription) {
  zt::test_support::CapturedLog log(false);
  const Value record = platform::Dictionary{{"k", "v"}};
  EXPECT_EQ(iCalendarRepresentation(record), record.description());
  EXPECT_EQ(iCalendarRepresentation(Value(Array{record})), record.description());
  const std::string warning =
      "WARNING appendRFC2445RepresentationTo was called on RootObject - dictionary " +
      record.description() + "\n";
  EXPECT_EQ(log.text(), warning + warning);
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
