#include "tessel/record_json.h"

#include <gtest/gtest.h>

#include <string>
#include <tuple>
#include <vector>

#include "support/files.h"

namespace tessel {
namespace {

using zt::platform::CalendarDate;
using zt::platform::Dictionary;
using zt::platform::TimeZone;
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

// Each text reads as a value that writes back as the same text.
TEST(RecordJsonRoundTrip, TypedValuesWriteBackAsTheyWereRead) {
  for (const char* json :
       {"3", "3.0", "0.1", "9223372036854775807",
        R"({"$date":"2007-03-15T12:30:00","tz":"Europe/Paris"})",
        R"({"$date":"2030-01-02T03:04:05","tz":"local"})",
        R"({"$date":"2007-03-15T12:30:00.000000123","tz":"UTC"})",
        R"({"$date":"2007-03-15T12:30:00.5","tz":"GMT"})",
        R"({"$date":"2007-07-01T10:00:00","tz":{"std":3600,"dst":7200,"rule":"M3.5.0,M10.5.0/3"}})",
        R"({"$date":"2007-07-01T10:00:00","tz":{"std":-18000}})", R"({"$data":""})",
        R"({"$data":"Zg=="})", R"({"$data":"+/8="})"}) {
    EXPECT_EQ(valueToJson(valueFromJson(json)), json);
  }
  EXPECT_EQ(valueFromJson("1e3"), Value::real(1000.0));
  // The instant is the wall clock read in the zone: 10:00 in July under the rule is 08:00 GMT.
  const Value summer = valueFromJson(
      R"({"$date":"2007-07-01T10:00","tz":{"std":3600,"dst":7200,"rule":"M3.5.0,M10.5.0/3"}})");
  ASSERT_NE(summer.asDate(), nullptr);
  EXPECT_TRUE(summer.asDate()->isSameInstant(dateIn(TimeZone::gmt(), {2007, 7, 1, 8, 0, 0})));
}

// A line of JSON Lines reads as the same record as its text read whole: the quick scanner that
// takes the common lines and the thorough reader that takes the others agree.
TEST(RecordJsonRoundTrip, LinesReadAsTheirTextReadWhole) {
  for (
      const char* json : {
          R"({"id":"a","record":{"tessel.record.entity":"e","n":-0,"m":-12,"r":1.5e-3,"b":true)"
          R"(,"f":false,"big":123456789012345678,"x":1E2}})",
          R"( {"record" : {"tessel.record.entity" : "e" , "l" : [ ] , "d" : { } } , "id" : "b" } )",
          R"({"id":"c\"\\\/\b\f\n\r\t\u00e9\ud83d\ude00","record":{"tessel.record.entity":"é😀"}})",
          R"({"id":"d","record":{"tessel.record.entity":"e","k\u0065y":1,"h":1234567890123456789012}})",
          R"({"id":"f","record":{"tessel.record.entity":"e","a":[[1,[2]],{"b":"c"}],"s":"x\ty"}})",
          R"({"id":"e","record":{"tessel.record.entity":"e","u":{"$url":"http://x/"},)"
          R"("i":{"$data":"Zg=="},"w":[{"tz":"Europe/Paris","$date":"2007-03-15T12:30:00.5"},)"
          R"({"$date":"2030-01-02T03:04","tz":"local"},{"$date":"2007-03-15T12:30:00","tz":"UTC"}]}})",
          R"({"id":"g","record":{"tessel.record.entity":"e",)"
          R"("w":{"$date":"2007-07-01T10:00","tz":{"std":3600,"dst":7200,"rule":"M3.5.0,M10.5.0/3"}}}})",
      }) {
    const std::vector<Record> records = parseRecordLines(json);
    const Dictionary whole = recordFromJson(json);
    ASSERT_EQ(records.size(), 1u);
    EXPECT_EQ(records[0].id, *whole.stringAt("id")) << json;
    EXPECT_EQ(records[0].record, *whole.dictionaryAt("record")) << json;
  }
}

TEST(RecordJsonErrors, EachFaultNamesThePathAndWhatIsWrong) {
  const auto date = [](const std::string& text) {
    return R"({"start date":{"$date":)" + text + R"(,"tz":"UTC"}})";
  };
  const auto zone = [](const std::string& text) {
    return R"({"d":{"$date":"2007-03-15T12:30:00","tz":)" + text + "}}";
  };
  const std::vector<std::tuple<std::string, std::string, std::string>> cases = {
      {date(R"("2007-02-30T12:00:00")"), R"("start date".$date)", "day 30"},
      {date(R"("2007-03-15 12:30:00")"), R"("start date".$date)", "not of the form"},
      {date(R"("2007-03-15T12:30:00.1234567891")"), R"("start date".$date)", "nine fractional"},
      {date("1173961800"), R"("start date".$date)", "holds a string"},
      {zone(R"("Mars/Olympus")"), "d.tz", "unknown time zone \"Mars/Olympus\""},
      {zone(R"({"std":999999})"), "d.tz.std", "a day or more"},
      {zone(R"({"std":3600,"rule":"M3.5.0,M10.5.0/3"})"), "d.tz.rule", "needs a daylight offset"},
      {zone(R"({"std":3600,"dst":7200,"rule":"nonsense"})"), "d.tz.rule", "cannot be read"},
      {R"({"d":{"$date":"2007-03-15T12:30:00"}})", "d", "needs its time zone \"tz\""},
      {R"({"u":{"$uri":"x"}})", "u.$uri", ""},
      {R"({"$url":"x"})", "$url", "record key"},
      {R"({"image":{"$data":"Zg="}})", "image.$data", "multiple of 4"},
      {R"({"image":{"$data":"Zh=="}})", "image.$data", "stray bits"},
      {R"({"a":18446744073709551615})", "a", "64 signed bits"},
      {R"({"a":{"b":1,"b":2}})", "a.b", "twice"},
      {R"({"a":[1,[{"$date":"2007","tz":"UTC"}]]})", "a[1][0].$date", ""},
      {R"([1,2])", "", "not an array"},
      {"{\"a\":\"\xFF\"}", "", "invalid JSON"},
  };
  for (const auto& [json, path, reason] : cases) {
    const RecordJsonError e = recordError(json);
    EXPECT_EQ(e.path(), path) << json.substr(0, 80);
    EXPECT_CONTAINS(e.reason(), reason);
  }
  EXPECT_CONTAINS(recordError(std::string(100000, '[')).reason(), "nesting deeper");
  // A dictionary holding a `$` key would read back as a typed value, so it is not written.
  const Dictionary record{{"outer", Dictionary{{"$date", "x"}}}};
  EXPECT_EQ(errorOf([&] { recordToJson(record); }).path(), "outer.$date");
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
      {R"({"id":"b","record":{"tessel.record.entity":"e","n":01}})", "", "invalid JSON"},
      {R"({"id":"b","record":{"tessel.record.entity":"e","n":1.}})", "", "invalid JSON"},
      {R"({"id":"b","record":{"tessel.record.entity":"e","n":-}})", "", "invalid JSON"},
      {R"({"id":"b","record":{"tessel.record.entity":"e","n":1e999}})", "", "number overflow"},
      {R"({"id":"b","record":{"tessel.record.entity":"e","n":null}})", "record.n", "null"},
      {R"({"id":"b","record":{"tessel.record.entity":"e","n":tru}})", "", "invalid JSON"},
      {R"({"id":"b","record":{"tessel.record.entity":"e","n":"\x"}})", "", "invalid JSON"},
      {"{\"id\":\"b\",\"record\":{\"tessel.record.entity\":\"e\t\"}}", "", "invalid JSON"},
      {"{\"id\":\"b\",\"record\":{\"tessel.record.entity\":\"e\xC0\x80\"}}", "", "invalid JSON"},
      {R"({"id":"b","record":{"tessel.record.entity":"e"}} x)", "", "invalid JSON"},
      {R"({"id":"b","id":"c","record":{"tessel.record.entity":"e"}})", "id", "twice"},
      {R"({"id":"b","record":{"tessel.record.entity":""}})", R"(record."tessel.record.entity")",
       "non-empty"},
      {R"({"id":"b","record":{"tessel.record.entity":"e","d":{"$date":"2007-03-15T12:30","tz":"Mars"}}})",
       "record.d.tz", "unknown time zone"},
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
