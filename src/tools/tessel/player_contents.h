#pragma once

#include <cstddef>
#include <filesystem>

namespace tessel::cli {

// What a player's volume holds of what the tool writes there, counted after a sync to tell a
// person what they now carry: the cards of Contacts/Tessel.vcf and the Calendars/Tessel-*.ics
// files. A missing file or folder counts as none.
struct PlayerContents {
  std::size_t contacts = 0;
  std::size_t calendars = 0;

  static PlayerContents of(const std::filesystem::path& volume);
};

}  // namespace tessel::cli
