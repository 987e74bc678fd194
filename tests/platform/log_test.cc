#include "platform/log.h"

#include <gtest/gtest.h>
#include <stdlib.h>

#include <cstdint>
#include <sstream>
#include <string>
#include <thread>
#include <tuple>
#include <vector>

#include "support/captured_log.h"

namespace zt::platform {
namespace {

struct Described {
  std::string description() const { return "<Described 7>"; }
};

TEST(LogFormat, ConversionsFlagsAndArgumentsThatDoNotMatch) {
  const std::string longText(5000, 'x');
  const std::tuple<std::string, std::vector<LogArgument>, std::string> cases[] = {
      // "%ul" is the unsigned number followed by a literal "l", not an unsigned long.
      {"count %ul", {42u}, "count 42l"},
      {"%016llX", {std::uint64_t{0xA27001A2B3C4DULL}}, "000A27001A2B3C4D"},
      {"[%-5d][%+d][%05d][%.4d] %#x", {42, 42, -42, 7, 255}, "[42   ][+42][-0042][0007] 0xff"},
      // Signed and unsigned arguments are reinterpreted as C would; integers for reals converted.
      {"%u %d %.1f", {-1, UINT64_MAX, 3}, "18446744073709551615 -1 3.0"},
      {"[%6s][%.2s] %s %p",
       {"ab", "abcdef", static_cast<const char*>(nullptr), reinterpret_cast<const void*>(0x1234)},
       "[    ab][ab] (null) 0x1234"},
      {"value %@.", {Described{}}, "value <Described 7>."},
      {"%@", {std::string("a\0b", 3)}, std::string("a\0b", 3)},
      {"<%s>", {longText}, "<" + longText + ">"},
      // Unknown conversions, "%n" among them, are printed as text and take no argument.
      {"100%% %k %n %d trailing %5l %", {9}, "100% %k %n 9 trailing %5l %"},
      // Mismatched arguments never crash; missing ones print nothing or "(null)".
      {"%s %d %x", {42, "text", reinterpret_cast<const void*>(0xbeef)}, "42 text beef"},
      {"[%d][%s][%@][%f]", {}, "[][(null)][(null)][]"},
  };
  for (const auto& [format, arguments, expected] : cases)
    EXPECT_EQ(Log::format(format, std::span<const LogArgument>(arguments)), expected) << format;
}

// Sends the log to a fresh file for the duration of a test and restores everything after.
class LogSinkTest : public testing::Test {
 protected:
  static void useSink(const std::string& value) {
    ::setenv("ZETOSYNCTOOL_LOG", value.c_str(), 1);
    Log::configureFromEnvironment();
  }
  std::string contents() const { return log_.text(); }

  zt::test_support::CapturedLog log_;
  zt::test_support::TemporaryFolder dir_;
};

TEST_F(LogSinkTest, DebugLinesFollowTheFlagAndReconfiguringAppends) {
  Log::setDebugEnabled(false);
  Log::debug("hidden %d", 1);
  Log::always("first %s", "line");
  Log::setDebugEnabled(true);
  Log::debug("debug");
  // Reconfiguring reopens for append: earlier lines stay.
  Log::configureFromEnvironment();
  Log::always("third");
  EXPECT_EQ(contents(), "first line\ndebug\nthird\n");
}

TEST_F(LogSinkTest, ConfigurationSwitchesBetweenSinks) {
  const auto other = dir_ / "other.log";
  Log::always("one");
  useSink(other.string());
  Log::always("two");
  useSink("stderr");
  testing::internal::CaptureStderr();
  Log::always("three");
  EXPECT_EQ(testing::internal::GetCapturedStderr(), "three\n");
  EXPECT_EQ(contents(), "one\n");
  EXPECT_EQ(zt::test_support::readFile(other), "two\n");

  // A file that cannot be opened falls back to standard error.
  useSink((dir_ / "missing" / "tool.log").string());
  testing::internal::CaptureStderr();
  Log::always("still %s", "visible");
  EXPECT_EQ(testing::internal::GetCapturedStderr(), "still visible\n");

  // Lines for standard error also go to the log, once when the log is standard error itself.
  useSink(log_.path().string());
  testing::internal::CaptureStderr();
  Log::standardError("cannot translate %@", Described{});
  EXPECT_EQ(testing::internal::GetCapturedStderr(), "cannot translate <Described 7>\n");
  EXPECT_EQ(log_.last(), "cannot translate <Described 7>");
  useSink("stderr");
  testing::internal::CaptureStderr();
  Log::standardError("once");
  EXPECT_EQ(testing::internal::GetCapturedStderr(), "once\n");
}

TEST_F(LogSinkTest, ConcurrentLinesStayWhole) {
  constexpr int kThreads = 8;
  constexpr int kLines = 200;
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([t] {
      for (int i = 0; i < kLines; ++i) Log::always("thread %d line %03d %s", t, i, "payload");
    });
  }
  // Reconfiguring while lines are written must not lose or tear any of them.
  for (int i = 0; i < 20; ++i) Log::configureFromEnvironment();
  for (auto& thread : threads) thread.join();

  std::istringstream lines(contents());
  std::vector<int> seen(kThreads, 0);
  std::string line;
  int total = 0;
  while (std::getline(lines, line)) {
    int t = -1, i = -1;
    char payload[16] = {};
    ASSERT_EQ(std::sscanf(line.c_str(), "thread %d line %d %15s", &t, &i, payload), 3) << line;
    ASSERT_GE(t, 0);
    ASSERT_LT(t, kThreads);
    EXPECT_EQ(i, seen[t]++) << "lines of one thread out of order";
    EXPECT_STREQ(payload, "payload");
    ++total;
  }
  EXPECT_EQ(total, kThreads * kLines);
}

}  // namespace
}  // namespace zt::platform
