#include "platform/property_list.h"

#include <gtest/gtest.h>

#include <string>
#include <string_view>

#include "platform/calendar_date.h"

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
  const auto date = CalendarDate::fromString("2007-03-15 12:30:00 +0000");
  // Equality of values includes the key order and the kind of every number.
  EXPECT_EQ(*root, (Dictionary{{"z", Value::boolean(true)},
                               {"a", Value::integer(-7)},
                               {"r", Value::real(2.5)},
                               {"s", "caf\xC3\xA9 & co"},
                               {"d", Data{0, 1, 2}},
                               {"t", *date},
                               {"l", Array{Value::boolean(false), Dictionary{}}}}));
}

}  // namespace
}  // namespace zt::platform
