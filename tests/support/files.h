#pragma once

// Files as tests read and write them, and texts compared line by line with reference files.

#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

namespace zt::test_support {

namespace fs = std::filesystem;

// The whole file as bytes; empty when it cannot be read.
std::string readFile(const fs::path& path);
void writeFile(const fs::path& path, std::string_view bytes);
inline bool contains(std::string_view text, std::string_view part) {
  return text.find(part) != std::string_view::npos;
}
// The names in a folder, sorted, links not followed.
std::vector<std::string> namesIn(const fs::path& folder);
// Lines without their "\n"; a "\r" before it stays.
std::vector<std::string> splitLines(std::string_view text);
// A UTF-16BE file that starts with exactly one byte-order mark, as UTF-8 without the mark.
// Fails the test when the mark is missing or the length is odd.
std::string utf8OfUtf16BigEndian(std::string_view bytes);

// Whether `actual` is `expected`, line by line; the failure names the first line that differs.
::testing::AssertionResult sameLines(std::string_view expected, std::string_view actual);

// Compares `actual` with the reference file `golden`. With ZT_UPDATE_GOLDEN=1 in the
// environment the file is written from `actual` instead (to be checked by eye before it is
// committed).
::testing::AssertionResult matchesGoldenFile(const fs::path& golden, std::string_view actual);

}  // namespace zt::test_support

#define EXPECT_CONTAINS(text, part) \
  EXPECT_NE(std::string(text).find(part), std::string::npos) << "in: " << (text)
