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
  // Key order is part of equality.
  EXPECT_FALSE((Dictionary{{"x", "1"}, {"y", "2"}}) == (Dictionary{{"y", "2"}, {"x", "1"}}));
}

TEST(Dictionary, TypedLookupsAnswerOnlyTheirKind) {
  const Dictionary d{{"name", "Ada"}, {"ids", Value(Array{"a", Value::integer(1), "b"})}};
  EXPECT_EQ(*d.stringAt("name"), "Ada");
  EXPECT_EQ(d.stringAt("ids"), nullptr);
  EXPECT_EQ(d.arrayAt("ids")->size(), 3u);
  // A relationship's identifiers: the strings of a list, in order; nothing else counts.
  EXPECT_EQ(stringsIn(d.find("ids")), (std::vector<std::string>{"a", "b"}));
  EXPECT_TRUE(stringsIn(d.find("name")).empty());
  EXPECT_TRUE(stringsIn(nullptr).empty());
}

TEST(Value, ValuesOfDifferentKindsAreNeverEqual) {
  EXPECT_FALSE(Value("https://example.org/x") == Value(Url{"https://example.org/x"}));
  EXPECT_FALSE(Value(Data{1, 2}) == Value(Array{Value::integer(1), Value::integer(2)}));
}

}  // namespace
}  // namespace zt::platform
