#include "platform/user_defaults.h"

#include <gtest/gtest.h>

#include <optional>
#include <string>
#include <utility>

#include "support/captured_log.h"

namespace zt::platform {
namespace {

using zt::test_support::ScopedEnvironment;
using zt::test_support::TemporaryFolder;

TEST(UserDefaults, ReadsBooleansInEveryFormAndSkipsWhatIsNotOne) {
  test_support::CapturedLog log;
  const auto defaults = UserDefaults::fromText(
      "A = true\nD = False\nF = 0\n  H\t=\tYES  \n"
      "   # AlwaysPushVCard = yes\n"
      "AlwaysSyncContactImages = yes   # forced for the demo\n"
      "Windows = no\r\nHash = a#b\n   \t\n"
      "Maybe = sometimes\nno equals sign here\n= yes\nTwice = no\nTwice = yes\nSplit = a = b\n"
      "Last = 1");  // no line end at the end of the file
  const std::pair<const char*, std::optional<bool>> booleans[] = {
      {"A", true},
      {"D", false},
      {"F", false},
      {"H", true},
      {"a", std::nullopt},
      {"AlwaysPushVCard", std::nullopt},
      {"AlwaysSyncContactImages", true},
      {"Windows", false},
      {"Maybe", std::nullopt},
      {"no equals sign here", std::nullopt},
      {"", std::nullopt},
      {"Twice", true},
      {"Last", true}};
  for (const auto& [key, value] : booleans) EXPECT_EQ(defaults.boolForKey(key), value) << key;
  EXPECT_EQ(defaults.stringForKey("Hash"), "a#b");
  EXPECT_EQ(defaults.stringForKey("Split"), "a = b");
  EXPECT_NE(log.text().find("Maybe"), std::string::npos) << log.text();
}

TEST(UserDefaults, FileLocationFollowsTheEnvironment) {
  ScopedEnvironment environment;
  environment.set("HOME", "/home/zeto");
  environment.unset("XDG_CONFIG_HOME");
  environment.unset("ZETOSYNCTOOL_DEFAULTS");
  EXPECT_EQ(UserDefaults::pathFromEnvironment(), "/home/zeto/.config/zetosynctool/defaults.conf");

  // XDG asks to ignore a relative or empty configuration folder.
  environment.set("XDG_CONFIG_HOME", "relative/config");
  EXPECT_EQ(UserDefaults::pathFromEnvironment(), "/home/zeto/.config/zetosynctool/defaults.conf");

  environment.set("XDG_CONFIG_HOME", "/etc/xdg-user");
  EXPECT_EQ(UserDefaults::pathFromEnvironment(), "/etc/xdg-user/zetosynctool/defaults.conf");

  environment.set("ZETOSYNCTOOL_DEFAULTS", "/srv/defaults.conf");
  EXPECT_EQ(UserDefaults::pathFromEnvironment(), "/srv/defaults.conf");
}

}  // namespace
}  // namespace zt::platform
