#include "platform/log.h"

#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <optional>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "support/captured_log.h"

namespace zt::platform {
namespace {

struct Described {
  std::string description() const { return "<Described 7>"; }
};

TEST(LogFormat, ConversionEndsAtItsLetter) {
  // "%ul" is the unsigned number followed by a literal "l", not an unsigned long.
  EXPECT_EQ(Log::format("count %ul", {42u}), "count 42l");
  EXPECT_EQ(Log::format("%lu|%llu|%zu|%hhu|%qu|%ju|%tu", {1u, 2u, std::size_t{3}, 4u, 5u, 6u, 7u}),
            "1|2|3|4|5|6|7");
  EXPECT_EQ(Log::format("%016llX", {std::uint64_t{0xA27001A2B3C4DULL}}), "000A27001A2B3C4D");
}

TEST(LogFormat, NumbersKeepFlagsWidthAndPrecision) {
  EXPECT_EQ(Log::format("%d %i %o %#x %X", {-3, 12, 8, 255, 255}), "-3 12 10 0xff FF");
  EXPECT_EQ(Log::format("[%5d][%-5d][%+d][% d][%05d][%.4d]", {42, 42, 42, 42, -42, 7}),
            "[   42][42   ][+42][ 42][-0042][0007]");
  // Signed and unsigned arguments are reinterpreted as C would.
  EXPECT_EQ(Log::format("%u %d", {-1, UINT64_MAX}), "18446744073709551615 -1");
  EXPECT_EQ(Log::format("%f %.2f %8.3f|%e %g", {1.5, 3.14159, 2.5, 12345.678, 0.0001}),
            "1.500000 3.14    2.500|1.234568e+04 0.0001");
  // An integer given for a real conversion is converted, not reinterpreted.
  EXPECT_EQ(Log::format("%.1f", {3}), "3.0");
}

TEST(LogFormat, TextsPointersAndDescriptions) {
  EXPECT_EQ(Log::format("%s and %s", {"cats", std::string("dogs")}), "cats and dogs");
  EXPECT_EQ(Log::format("[%6s][%-6s][%.2s]", {"ab", "ab", "abcdef"}), "[    ab][ab    ][ab]");
  EXPECT_EQ(Log::format("%s", {static_cast<const char*>(nullptr)}), "(null)");
  EXPECT_EQ(Log::format("%p", {reinterpret_cast<const void*>(0x1234)}), "0x1234");
  EXPECT_EQ(Log::format("value %@.", {Described{}}), "value <Described 7>.");
  // Embedded NULs of a description survive a plain "%@".
  EXPECT_EQ(Log::format("%@", {std::string("a\0b", 3)}), std::string("a\0b", 3));
}

TEST(LogFormat, PercentMalformedConversionsAndMismatchedArguments) {
  EXPECT_EQ(Log::format("100%% done", {}), "100% done");
  EXPECT_EQ(Log::format("trailing %", {}), "trailing %");
  EXPECT_EQ(Log::format("trailing %5l", {1}), "trailing %5l");
  // Unknown conversions, "%n" among them, are printed as text and take no argument.
  EXPECT_EQ(Log::format("%k %n %d", {9}), "%k %n 9");
  // Mismatched arguments never crash.
  EXPECT_EQ(Log::format("%s", {42}), "42");
  EXPECT_EQ(Log::format("%d", {"text"}), "text");
  EXPECT_EQ(Log::format("%x", {reinterpret_cast<const void*>(0xbeef)}), "beef");
  // Missing arguments print nothing, or "(null)" for texts; extra ones are ignored.
  EXPECT_EQ(Log::format("[%d][%s][%@][%f]", {}), "[][(null)][(null)][]");
  EXPECT_EQ(Log::format("%d", {1, "extra", 3.0}), "1");
}

TEST(LogFormat, WideConversionsAreNotTruncated) {
  const std::string longText(5000, 'x');
  EXPECT_EQ(Log::format("<%s>", {longText}), "<" + longText + ">");
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

TEST_F(LogSinkTest, DebugLinesFollowTheFlag) {
  Log::setDebugEnabled(false);
  EXPECT_FALSE(Log::debugEnabled());
  Log::debug("hidden %d", 1);
  EXPECT_EQ(contents(), "");

  Log::setDebugEnabled(true);
  EXPECT_TRUE(Log::debugEnabled());
  Log::debug("line");
  EXPECT_EQ(contents(), "line\n");
}

TEST_F(LogSinkTest, AlwaysLinesIgnoreTheFlagAndAppend) {
  Log::setDebugEnabled(false);
  Log::always("first %s", "line");
  Log::always("device %016llX", std::uint64_t{0xA27001A2B3C4DULL});
  EXPECT_EQ(contents(), "first line\ndevice 000A27001A2B3C4D\n");

  // Reconfiguring reopens for append: earlier lines stay.
  Log::configureFromEnvironment();
  Log::always("third");
  EXPECT_EQ(contents(), "first line\ndevice 000A27001A2B3C4D\nthird\n");
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
}

TEST_F(LogSinkTest, StandardErrorLinesAlsoGoToTheLog) {
  testing::internal::CaptureStderr();
  Log::standardError("cannot translate %@", Described{});
  EXPECT_EQ(testing::internal::GetCapturedStderr(), "cannot translate <Described 7>\n");
  EXPECT_EQ(contents(), "cannot translate <Described 7>\n");
  // Written once when the log is standard error itself.
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
