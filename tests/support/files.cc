#include "support/files.h"

#include <algorithm>
#include <cstdlib>
#include <fstream>
#include <sstream>

#include "platform/utf16.h"

namespace zt::test_support {

std::string readFile(const fs::path& path) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream text;
  text << in.rdbuf();
  return text.str();
}

void writeFile(const fs::path& path, std::string_view bytes) {
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  out << bytes;
}

std::vector<std::string> namesIn(const fs::path& folder) {
  std::vector<std::string> names;
  for (const auto& entry : fs::directory_iterator(folder))
    names.push_back(entry.path().filename().string());
  std::sort(names.begin(), names.end());
  return names;
}

std::vector<std::string> splitLines(std::string_view text) {
  std::vector<std::string> lines;
  std::istringstream in{std::string(text)};
  for (std::string line; std::getline(in, line);) lines.push_back(line);
  return lines;
}

std::string utf8OfUtf16BigEndian(std::string_view bytes) {
  EXPECT_EQ(bytes.size() % 2, 0u) << "odd length";
  EXPECT_TRUE(bytes.starts_with("\xFE\xFF")) << "no byte-order mark";
  std::u16string units;
  for (std::size_t i = 2; i + 1 < bytes.size(); i += 2)
    units.push_back(static_cast<char16_t>((static_cast<unsigned char>(bytes[i]) << 8) |
                                          static_cast<unsigned char>(bytes[i + 1])));
  return platform::utf16::toUtf8(units);
}

::testing::AssertionResult sameLines(std::string_view expected, std::string_view actual) {
  const std::vector<std::string> want = splitLines(expected), got = splitLines(actual);
  for (std::size_t i = 0; i < std::max(want.size(), got.size()); ++i) {
    const std::string w = i < want.size() ? want[i] : "(end of text)";
    const std::string g = i < got.size() ? got[i] : "(end of text)";
    if (w != g)
      return ::testing::AssertionFailure()
             << "line " << i + 1 << ": expected \"" << w << "\" got \"" << g << "\"";
  }
  if (expected != actual) return ::testing::AssertionFailure() << "texts differ in line ends";
  return ::testing::AssertionSuccess();
}

::testing::AssertionResult matchesGoldenFile(const fs::path& golden, std::string_view actual) {
  if (const char* update = std::getenv("ZT_UPDATE_GOLDEN"); update && std::string(update) == "1") {
    fs::create_directories(golden.parent_path());
    writeFile(golden, actual);
    return ::testing::AssertionSuccess();
  }
  if (!fs::exists(golden)) return ::testing::AssertionFailure() << "no reference file " << golden;
  ::testing::AssertionResult same = sameLines(readFile(golden), actual);
  if (!same) same << " (reference " << golden.filename() << ")";
  return same;
}

}  // namespace zt::test_support
