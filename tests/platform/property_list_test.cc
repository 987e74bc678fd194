#include "platform/property_list.h"

#include <gtest/gtest.h>

#include <string>
#include <string_view>
#include <vector>

namespace zt::platform {
namespace {

Result<Value> parse(std::string_view text) {
  return parsePropertyList(
      std::span(reinterpret_cast<const std::uint8_t*>(text.data()), text.size()));
}

std::string plist(std::string_view body) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">" + std::string(body) +
         "</plist>";
}

TEST(PropertyList, XmlValuesBecomeRecordValues) {
  auto parsed = parse(
      plist("<dict><key>z</key><true/><key>a</key><integer>-7</integer><key>r</key><real>2.5</real>"
            "<key>s</key><string>caf\xC3\xA9 &amp; co</string><key>d</key><data>AAEC</data>"
            "<key>t</key><date>2007-03-15T12:30:00Z</date>"
            "<key>l</key><array><false/><dict/></array></dict>"));
  ASSERT_TRUE(parsed) << parsed.error();
  const Dictionary* root = parsed.value().asDictionary();
  ASSERT_TRUE(root);
  std::vector<std::string> keys;
  for (const auto& [key, value] : *root) keys.push_back(key);
  EXPECT_EQ(keys, (std::vector<std::string>{"z", "a", "r", "s", "d", "t", "l"}));
  EXPECT_EQ(*root->find("z"), Value::boolean(true));
  EXPECT_EQ(root->find("z")->asNumber()->kind(), Number::Kind::Boolean);
  EXPECT_EQ(*root->find("a"), Value::integer(-7));
  EXPECT_EQ(*root->find("r"), Value::real(2.5));
  EXPECT_EQ(*root->find("s"), Value("caf\xC3\xA9 & co"));
  EXPECT_EQ(*root->find("d"), Value(Data{0, 1, 2}));
  EXPECT_EQ(root->find("t")->description(), "2007-03-15 12:30:00 +0000");
  EXPECT_EQ(*root->find("l"), Value(Array{Value::boolean(false), Value(Dictionary{})}));
}

TEST(PropertyList, StringEndsAtANulByte) {
  // A device's document may hold NUL bytes; libplist keeps a string's text up to the first.
  using namespace std::string_view_literals;
  auto parsed = parse(plist("<dict><key>k</key><string>a\0b</string></dict>"sv));
  ASSERT_TRUE(parsed);
  const Value* text = parsed.value().asDictionary()->find("k");
  ASSERT_TRUE(text && text->asString());
  EXPECT_EQ(*text->asString(), "a");
}

TEST(PropertyList, FailuresSayWhy) {
  for (std::string_view text : {std::string_view(""), std::string_view("not a plist"),
                                std::string_view("<plist><dict><key>a</key>")}) {
    auto parsed = parse(text);
    ASSERT_FALSE(parsed) << text;
    EXPECT_FALSE(parsed.error().empty());
  }
}

}  // namespace
}  // namespace zt::platform
