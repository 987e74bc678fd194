#include "platform/value.h"

#include <gtest/gtest.h>

namespace zt::platform {
namespace {

TEST(Dictionary, KeepsInsertionOrderAndReplacesInPlace) {
  Dictionary d;
  d.set("zeta", "1");
  d.set("alpha", Value::integer(2));
  d.set("mid", Value::boolean(true));
  d.set("zeta", "replaced");
  std::vector<std::string> keys;
  for (const auto& [key, value] : d) keys.push_back(key);
  EXPECT_EQ(keys, (std::vector<std::string>{"zeta", "alpha", "mid"}));
  EXPECT_EQ(*d.find("zeta")->asString(), "replaced");
  EXPECT_TRUE(d.erase("alpha"));
  EXPECT_FALSE(d.erase("alpha"));
  EXPECT_EQ(d.size(), 2u);
  EXPECT_EQ(d.find("alpha"), nullptr);
}

TEST(Dictionary, KeyOrderIsPartOfEquality) {
  Dictionary a{{"x", "1"}, {"y", "2"}};
  Dictionary b{{"y", "2"}, {"x", "1"}};
  EXPECT_FALSE(a == b);
  EXPECT_EQ(a, (Dictionary{{"x", "1"}, {"y", "2"}}));
}

TEST(Dictionary, TypedLookupsAnswerOnlyTheirKind) {
  const Dictionary d{{"name", "Ada"}, {"ids", Value(Array{"a", Value::integer(1), "b"})}};
  EXPECT_EQ(*d.stringAt("name"), "Ada");
  EXPECT_EQ(d.stringAt("ids"), nullptr);
  EXPECT_EQ(d.numberAt("name"), nullptr);
  EXPECT_EQ(d.arrayAt("missing"), nullptr);
  EXPECT_EQ(d.arrayAt("ids")->size(), 3u);
  // A relationship's identifiers: the strings of a list, in order; nothing else counts.
  EXPECT_EQ(stringsIn(d.find("ids")), (std::vector<std::string>{"a", "b"}));
  EXPECT_TRUE(stringsIn(d.find("name")).empty());
  EXPECT_TRUE(stringsIn(nullptr).empty());
}

TEST(Number, KindsAreKeptAndConvertLikeC) {
  EXPECT_EQ(Number::boolean(true).kind(), Number::Kind::Boolean);
  EXPECT_FALSE(Number::integer(1) == Number::boolean(true));
  EXPECT_FALSE(Number::integer(2) == Number::real(2.0));
  EXPECT_EQ(Number::real(-2.9).int32Value(), -2);
  EXPECT_EQ(Number::integer(0x1'0000'0005).int32Value(), 5);
  EXPECT_TRUE(Number::real(0.5).boolValue());
  EXPECT_FALSE(Number::integer(0).boolValue());
  EXPECT_EQ(Number::real(0.1).description(), "0.1");
  EXPECT_EQ(Number::boolean(true).description(), "1");
}

TEST(Value, ValuesOfDifferentKindsAreNeverEqual) {
  EXPECT_FALSE(Value("https://example.org/x") == Value(Url{"https://example.org/x"}));
  EXPECT_FALSE(Value(Data{1, 2}) == Value(Array{Value::integer(1), Value::integer(2)}));
}

TEST(Value, DescriptionsAreReadable) {
  Dictionary record{{"name", "Ann"},
                    {"tags", Array{"a", Value::integer(2)}},
                    {"photo", Data{0xde, 0xad, 0xbe, 0xef, 0x01}},
                    {"when", CalendarDate(std::chrono::sys_days{std::chrono::year{2007} / 3 / 15},
                                          *TimeZone::named("Europe/Paris"))}};
  EXPECT_EQ(Value(record).description(),
            "{name = Ann; tags = (a, 2); photo = <deadbeef 01>; "
            "when = 2007-03-15 01:00:00 +0100;}");
}

}  // namespace
}  // namespace zt::platform
