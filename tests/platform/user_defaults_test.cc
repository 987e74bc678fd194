#include "platform/user_defaults.h"

#include <gtest/gtest.h>

#include <fstream>
#include <iterator>
#include <string>

#include "platform/log.h"
#include "support/scoped_environment.h"
#include "support/temporary_folder.h"

namespace zt::platform {
namespace {

using zt::test_support::ScopedEnvironment;
using zt::test_support::TemporaryFolder;

void writeFile(const std::filesystem::path& path, const std::string& text) {
  std::filesystem::create_directories(path.parent_path());
  std::ofstream(path, std::ios::binary) << text;
}

TEST(UserDefaults, BooleansInEveryFormAndCase) {
  const auto defaults = UserDefaults::fromText("A = true\nD = False\nF = 0\n  H\t=\tYES  \n");
  EXPECT_EQ(defaults.boolForKey("A"), true);
  EXPECT_EQ(defaults.boolForKey("D"), false);
  EXPECT_EQ(defaults.boolForKey("F"), false);
  EXPECT_EQ(defaults.boolForKey("H"), true);
  // Keys are names, not words: their case matters.
  EXPECT_EQ(defaults.boolForKey("a"), std::nullopt);
}

TEST(UserDefaults, CommentsBlankLinesAndLineEnds) {
  const auto defaults = UserDefaults::fromText(
      "   # AlwaysPushVCard = yes\n"
      "AlwaysSyncContactImages = yes   # forced for the demo\n"
      "Windows = no\r\n"
      "Hash = a#b\n"
      "   \t\n"
      "Last = 1");  // no line end at the end of the file
  EXPECT_EQ(defaults.boolForKey("AlwaysPushVCard"), std::nullopt);
  EXPECT_EQ(defaults.boolForKey("AlwaysSyncContactImages"), true);
  EXPECT_EQ(defaults.boolForKey("Windows"), false);
  EXPECT_EQ(defaults.stringForKey("Hash"), "a#b");
  EXPECT_EQ(defaults.boolForKey("Last"), true);
}

TEST(UserDefaults, ValuesThatAreNotBooleansAreAbsent) {
  const auto defaults = UserDefaults::fromText(
      "Maybe = sometimes\nTwo = 2\nno equals sign here\n= yes\n"
      "Twice = no\nTwice = yes\nSplit = a = b\n");
  EXPECT_EQ(defaults.boolForKey("Maybe"), std::nullopt);
  EXPECT_EQ(defaults.boolForKey("Two"), std::nullopt);
  EXPECT_EQ(defaults.boolForKey("no equals sign here"), std::nullopt);
  EXPECT_EQ(defaults.boolForKey(""), std::nullopt);
  // A later line wins; the value is everything after the first "=".
  EXPECT_EQ(defaults.boolForKey("Twice"), true);
  EXPECT_EQ(defaults.stringForKey("Split"), "a = b");
}

TEST(UserDefaults, ANonBooleanValueIsReportedInTheDebugLog) {
  TemporaryFolder folder;
  ScopedEnvironment environment;
  environment.set("ZETOSYNCTOOL_LOG", (folder / "tool.log").string());
  Log::configureFromEnvironment();
  const bool previousDebug = Log::debugEnabled();
  Log::setDebugEnabled(true);

  EXPECT_EQ(UserDefaults::fromText("DebugLog = maybe\n").boolForKey("DebugLog"), std::nullopt);

  Log::setDebugEnabled(previousDebug);
  environment.unset("ZETOSYNCTOOL_LOG");
  Log::configureFromEnvironment();
  std::ifstream log(folder / "tool.log");
  const std::string text{std::istreambuf_iterator<char>(log), {}};
  EXPECT_NE(text.find("DebugLog"), std::string::npos) << text;
  EXPECT_NE(text.find("maybe"), std::string::npos) << text;
}

TEST(UserDefaults, AMissingOrUnreadableFileHoldsNothing) {
  TemporaryFolder folder;
  EXPECT_EQ(UserDefaults::fromFile(folder / "absent.conf").boolForKey("DebugLog"), std::nullopt);
  EXPECT_EQ(UserDefaults::fromFile(folder.path()).boolForKey("DebugLog"), std::nullopt);

  writeFile(folder / "defaults.conf", "DebugLog = yes\n");
  EXPECT_EQ(UserDefaults::fromFile(folder / "defaults.conf").boolForKey("DebugLog"), true);
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
  environment.set("XDG_CONFIG_HOME", "");
  EXPECT_EQ(UserDefaults::pathFromEnvironment(), "/home/zeto/.config/zetosynctool/defaults.conf");

  environment.set("XDG_CONFIG_HOME", "/etc/xdg-user");
  EXPECT_EQ(UserDefaults::pathFromEnvironment(), "/etc/xdg-user/zetosynctool/defaults.conf");

  environment.set("ZETOSYNCTOOL_DEFAULTS", "/srv/defaults.conf");
  EXPECT_EQ(UserDefaults::pathFromEnvironment(), "/srv/defaults.conf");
}

}  // namespace
}  // namespace zt::platform
