#include "tessel/record_json.h"

#include <gtest/gtest.h>

#include <string>

namespace tessel {
namespace {

using zt::platform::Array;
using zt::platform::CalendarDate;
using zt::platform::Data;
using zt::platform::Dictionary;
using zt::platform::TimeZone;
using zt::platform::Url;
using zt::platform::Value;

CalendarDate dateIn(const TimeZone& zone, CalendarDate::Fields fields) {
  return CalendarDate::fromFields(fields, zone);
}

// Reads `json` expecting a fault and answers it, so that tests can check line, path and reason.
template <typename F>
RecordJsonError errorOf(F&& read) {
  try {
    read();
  } catch (const RecordJsonError& e) {
    return e;
  }
  ADD_FAILURE() << "no RecordJsonError";
  return RecordJsonError(std::nullopt, "", "");
}

RecordJsonError recordError(const std::string& json) {
  return errorOf([&] { recordFromJson(json); });
}

// ----- round trips ---------------------------------------------------------------------------

TEST(RecordJsonRoundTrip, EveryValueKindComesBackEqualAndTheTextIsStable) {
  const Dictionary record{
      {"tessel.record.entity", "tessel.calendars.Event"},
      {"summary", "Caf\xC3\xA9 \"quoted\" \\ line\nbreak"},
      {"priority", Value::integer(-9007199254740993)},
      {"ratio", Value::real(2.0)},
      {"all day", Value::boolean(true)},
      {"rsvp", Value::boolean(false)},
      {"url", Url{"https://example.org/x?a=1&b=2"}},
      {"image", Data{0x00, 0xFF, 0x10, 0x80}},
      {"start date", dateIn(*TimeZone::named("Europe/Paris"), {2007, 3, 15, 12, 30, 0})},
      {"exception dates", Array{dateIn(TimeZone::gmt(), {2007, 3, 22, 12, 0, 0}),
                                dateIn(TimeZone::utc(), {2007, 3, 29, 12, 0, 0})}},
      {"floating", dateIn(TimeZone::local(), {2030, 1, 2, 3, 4, 5})},
      {"attendees", Array{"a1", "a2"}},
      {"nested", Dictionary{{"z", Value::integer(1)}, {"a", Array{}}, {"m", Dictionary{}}}},
      {"empty", ""},
  };
  const std::string json = recordToJson(record);
  const Dictionary back = recordFromJson(json);
  EXPECT_EQ(back, record);
  EXPECT_EQ(recordToJson(back), json);
}

TEST(RecordJsonRoundTrip, NumbersKeepTheirKind) {
  EXPECT_EQ(valueFromJson("3"), Value::integer(3));
  EXPECT_EQ(valueFromJson("3.0"), Value::real(3.0));
  EXPECT_EQ(valueFromJson("1e3"), Value::real(1000.0));
  EXPECT_EQ(valueToJson(Value::real(3.0)), "3.0");
  EXPECT_EQ(valueToJson(Value::real(0.1)), "0.1");
  EXPECT_EQ(valueFromJson("9223372036854775807"), Value::integer(INT64_MAX));
}

TEST(RecordJsonRoundTrip, DatesAreWrittenAsWallClockInTheirZone) {
  const CalendarDate paris = dateIn(*TimeZone::named("Europe/Paris"), {2007, 3, 15, 12, 30, 0});
  EXPECT_EQ(valueToJson(paris), R"({"$date":"2007-03-15T12:30:00","tz":"Europe/Paris"})");
  EXPECT_EQ(valueToJson(dateIn(TimeZone::gmt(), {2007, 3, 15, 12, 0, 0})),
            R"({"$date":"2007-03-15T12:00:00","tz":"GMT"})");
  EXPECT_EQ(valueToJson(dateIn(TimeZone::local(), {2030, 1, 2, 3, 4, 5})),
            R"({"$date":"2030-01-02T03:04:05","tz":"local"})");

  // The instant is the wall clock read in the zone: 12:30 in Paris in March is 11:30 GMT.
  const Value read = valueFromJson(R"({"$date":"2007-03-15T12:30","tz":"Europe/Paris"})");
  ASSERT_NE(read.asDate(), nullptr);
  EXPECT_TRUE(read.asDate()->isSameInstant(dateIn(TimeZone::gmt(), {2007, 3, 15, 11, 30, 0})));
  EXPECT_EQ(*read.asDate(), paris);
}

TEST(RecordJsonRoundTrip, FractionalSecondsKeepTheirNanoseconds) {
  const Value read = valueFromJson(R"({"$date":"2007-03-15T12:30:00.000000123","tz":"UTC"})");
  ASSERT_NE(read.asDate(), nullptr);
  EXPECT_EQ(read.asDate()->nanoseconds(), 123u);
  EXPECT_EQ(valueToJson(read), R"({"$date":"2007-03-15T12:30:00.000000123","tz":"UTC"})");

  const Value half = valueFromJson(R"({"$date":"2007-03-15T12:30:00.5","tz":"UTC"})");
  EXPECT_EQ(half.asDate()->nanoseconds(), 500000000u);
  EXPECT_EQ(valueToJson(half), R"({"$date":"2007-03-15T12:30:00.5","tz":"UTC"})");
}

TEST(RecordJsonRoundTrip, UnnamedZonesKeepOffsetsAndDaylightRule) {
  const std::string withRule =
      R"({"$date":"2007-07-01T10:00:00","tz":{"std":3600,"dst":7200,"rule":"M3.5.0,M10.5.0/3"}})";
  const Value summer = valueFromJson(withRule);
  ASSERT_NE(summer.asDate(), nullptr);
  const TimeZone& zone = summer.asDate()->timeZone();
  EXPECT_EQ(zone.kind(), TimeZone::Kind::Unnamed);
  EXPECT_EQ(zone.standardOffset(), 3600);
  EXPECT_EQ(zone.daylightOffset(), 7200);
  EXPECT_EQ(zone.daylightRule(), "M3.5.0,M10.5.0/3");
  // Daylight time is in force in July: 10:00 wall clock is 08:00 GMT.
  EXPECT_TRUE(summer.asDate()->isSameInstant(dateIn(TimeZone::gmt(), {2007, 7, 1, 8, 0, 0})));
  EXPECT_EQ(valueToJson(summer), withRule);

  const std::string fixed = R"({"$date":"2007-07-01T10:00:00","tz":{"std":-18000}})";
  EXPECT_EQ(valueToJson(valueFromJson(fixed)), fixed);
}

TEST(RecordJsonRoundTrip, DataOfEveryPaddingLength) {
  for (const auto& [bytes, text] : std::vector<std::pair<Data, std::string>>{
           {{}, ""}, {{'f'}, "Zg=="}, {{0xFB, 0xFF}, "+/8="}}) {
    const std::string json = R"({"$data":")" + text + R"("})";
    EXPECT_EQ(valueToJson(Value(bytes)), json);
    EXPECT_EQ(valueFromJson(json), Value(bytes)) << text;
  }
}

TEST(RecordJsonRoundTrip, JsonLinesKeepIdAndRecord) {
  const Dictionary record{{"tessel.record.entity", "tessel.contacts.Contact"},
                          {"first name", "Ada"}};
  const std::string line = recordToJsonLine("c1", record);
  EXPECT_EQ(
      line,
      R"({"id":"c1","record":{"tessel.record.entity":"tessel.contacts.Contact","first name":"Ada"}})");
  const auto lines = parseRecordLines(line + "\n\n  \r\n" + recordToJsonLine("c2", record));
  ASSERT_EQ(lines.size(), 2u);
  EXPECT_EQ(lines[0].id, "c1");
  EXPECT_EQ(lines[0].record, record);
  EXPECT_EQ(lines[1].id, "c2");
}

// ----- faults ---------------------------------------------------------------------------------

TEST(RecordJsonErrors, BadDatesNameTheKeyAndWhatIsWrong) {
  const std::vector<std::pair<std::string, std::string>> cases = {
      {R"("2007-02-30T12:00:00")", "day 30"},
      {R"("2007-03-15T24:00:00")", "hour 24"},
      {R"("2007-03-15 12:30:00")", "not of the form"},
      {R"("2007-03-15T12:30:00.1234567891")", "nine fractional digits"},
      {"1173961800", "holds a string"},
  };
  for (const auto& [date, reason] : cases) {
    const RecordJsonError e = recordError(R"({"start date":{"$date":)" + date + R"(,"tz":"UTC"}})");
    EXPECT_EQ(e.path(), R"("start date".$date)") << date;
    EXPECT_NE(e.reason().find(reason), std::string::npos) << date << ": " << e.what();
  }
  EXPECT_NO_THROW(recordFromJson(R"({"d":{"$date":"2008-02-29T00:00","tz":"UTC"}})"));
}

TEST(RecordJsonErrors, ZonesMustBeKnownAndWellFormed) {
  const std::vector<std::tuple<std::string, std::string, std::string>> cases = {
      {R"("Mars/Olympus")", "d.tz", "unknown time zone \"Mars/Olympus\""},
      {"3600", "d.tz", "not an integer"},
      {R"({"dst":7200})", "d.tz", "standard offset"},
      {R"({"std":"3600"})", "d.tz.std", "integer number of seconds"},
      {R"({"std":999999})", "d.tz.std", "a day or more"},
      {R"({"std":3600,"rule":"M3.5.0,M10.5.0/3"})", "d.tz.rule", "needs a daylight offset"},
      {R"({"std":3600,"dst":7200,"rule":"nonsense"})", "d.tz.rule", "cannot be read"},
  };
  for (const auto& [zone, path, reason] : cases) {
    const RecordJsonError e =
        recordError(R"({"d":{"$date":"2007-03-15T12:30:00","tz":)" + zone + "}}");
    EXPECT_EQ(e.path(), path) << zone;
    EXPECT_NE(e.reason().find(reason), std::string::npos) << zone << ": " << e.what();
  }
  EXPECT_EQ(recordError(R"({"d":{"$date":"2007-03-15T12:30:00"}})").reason(),
            "a date needs its time zone \"tz\"");
}

TEST(RecordJsonErrors, DollarKeysAreOnlyTheThreeTypedForms) {
  EXPECT_EQ(recordError(R"({"u":{"$uri":"x"}})").path(), "u.$uri");
  EXPECT_EQ(recordError(R"({"u":{"$url":"x","title":"y"}})").path(), "u.title");
  EXPECT_EQ(recordError(R"({"$url":"x"})").path(), "$url");
  EXPECT_NE(recordError(R"({"$url":"x"})").reason().find("record key"), std::string::npos);

  // A dictionary holding a `$` key would read back as a typed value, so it is not written.
  const Dictionary record{{"outer", Dictionary{{"$date", "x"}}}};
  const RecordJsonError e = errorOf([&] { recordToJson(record); });
  EXPECT_EQ(e.path(), "outer.$date");
}

TEST(RecordJsonErrors, BadBase64IsRefused) {
  const std::vector<std::pair<std::string, std::string>> cases = {
      {"Zg=", "multiple of 4"},
      {"Z!==", "invalid base64 character"},
      {"Zh==", "stray bits"},
  };
  for (const auto& [text, reason] : cases) {
    const RecordJsonError e = recordError(R"({"image":{"$data":")" + text + R"("}})");
    EXPECT_EQ(e.path(), "image.$data") << text;
    EXPECT_NE(e.reason().find(reason), std::string::npos) << text << ": " << e.what();
  }
}

TEST(RecordJsonErrors, ValuesJsonHasButRecordsDoNot) {
  EXPECT_EQ(recordError(R"({"a":[1,null]})").path(), "a[1]");
  EXPECT_NE(recordError(R"({"a":18446744073709551615})").reason().find("64 signed bits"),
            std::string::npos);
  EXPECT_NE(recordError(R"({"a":1e999})").reason().find("number overflow"), std::string::npos);
  EXPECT_EQ(recordError(R"({"a":{"b":1,"b":2}})").path(), "a.b");
  EXPECT_EQ(recordError(R"({"a":[1,[{"$date":"2007","tz":"UTC"}]]})").path(), "a[1][0].$date");
  EXPECT_NE(recordError(R"({"a":{"b":1,"b":2}})").reason().find("twice"), std::string::npos);
  EXPECT_NE(recordError(R"([1,2])").reason().find("not an array"), std::string::npos);
  EXPECT_NE(recordError("{\"a\":\"\xFF\"}").reason().find("invalid JSON"), std::string::npos);
  EXPECT_NE(recordError(std::string(100000, '[')).reason().find("nesting deeper"),
            std::string::npos);
}

TEST(RecordJsonErrors, JsonLinesNameTheLine) {
  const std::string good = R"({"id":"a","record":{"tessel.record.entity":"e"}})";
  const std::vector<std::tuple<std::string, std::string, std::string>> cases = {
      {R"([1])", "", "not an array"},
      {R"({"id":"b"})", "", "no \"record\""},
      {R"({"id":"","record":{"tessel.record.entity":"e"}})", "id", "non-empty string"},
      {R"({"id":"b","record":{"tessel.record.entity":"e"},"x":1})", "x", "unexpected key"},
      {R"({"id":"b","record":{"first name":"Ada"}})", "record", "no entity name"},
      {R"({"id":"b","record":{"tessel.record.entity":"e"})", "", "invalid JSON"},
      {R"({"id":"a","record":{"tessel.record.entity":"e"}})", "id", "already given on line 1"},
  };
  for (const auto& [bad, path, reason] : cases) {
    const std::string lines = good + "\n\n" + bad + "\n" + good;
    const RecordJsonError e = errorOf([&] { parseRecordLines(lines); });
    EXPECT_EQ(e.line(), 3u) << bad;
    EXPECT_EQ(e.path(), path) << bad;
    EXPECT_NE(e.reason().find(reason), std::string::npos) << bad << ": " << e.what();
    EXPECT_EQ(std::string(e.what()).rfind("line 3: ", 0), 0u) << e.what();
  }
}

}  // namespace
}  // namespace tessel
