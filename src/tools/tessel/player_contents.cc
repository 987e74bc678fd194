#include "tools/tessel/player_contents.h"

#include <algorithm>
#include <fstream>
#include <string>
#include <string_view>
#include <system_error>

namespace tessel::cli {

namespace {

// The cards of a UTF-16BE vCard file: its lines that are BEGIN:VCARD (a folded line goes on
// with a blank, so the text inside a value never starts a line).
std::size_t countCards(const std::filesystem::path& file) {
  std::ifstream in(file, std::ios::binary);
  if (!in) return 0;
  std::string pattern;
  for (char c : std::string_view("\nBEGIN:VCARD")) pattern += {'\0', c};
  // The file's first line has no line end before it: one is supposed, after the byte order
  // mark when there is one.
  std::string text(pattern.substr(0, 2));
  std::size_t count = 0;
  char buffer[1 << 16];
  bool first = true;
  while (in.read(buffer, sizeof buffer) || in.gcount() > 0) {
    std::string_view chunk(buffer, static_cast<std::size_t>(in.gcount()));
    if (first && chunk.starts_with("\xFE\xFF")) chunk.remove_prefix(2);
    first = false;
    text += chunk;
    for (auto at = text.find(pattern); at != std::string::npos; at = text.find(pattern, at + 1)) {
      if (at % 2 == 0) ++count;  // a code unit's second byte starts nothing
    }
    // The end of this chunk may hold the start of a line that the next one finishes; keeping
    // an even number of bytes keeps the code units aligned.
    const std::size_t keep = std::min(text.size(), pattern.size() - 2);
    text.erase(0, text.size() - keep);
  }
  return count;
}

std::size_t countCalendars(const std::filesystem::path& folder) {
  std::size_t count = 0;
  std::error_code error;
  for (const auto& entry : std::filesystem::directory_iterator(folder, error)) {
    const std::string name = entry.path().filename().string();
    if (name.starts_with("Tessel-") && name.ends_with(".ics") && entry.is_regular_file(error)) {
      ++count;
    }
  }
  return count;
}

}  // namespace

PlayerContents PlayerContents::of(const std::filesystem::path& volume) {
  return {countCards(volume / "Contacts" / "Tessel.vcf"), countCalendars(volume / "Calendars")};
}

}  // namespace tessel::cli
