#pragma once

#include <array>
#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <span>
#include <string>
#include <vector>

#include "platform/folder_handle.h"

namespace zt::calendars {

// The iCalendar texts of earlier runs, one file per calendar in one folder, named by the
// SHA-256 of everything the text depends on (see ZTCalendarsSyncer: the calendar records'
// version, the store, the program, the time-zone rules, the calendar's identifier, title and
// place). A run whose calendars have not changed writes them from here instead of reading,
// flattening and exporting every event again. Entries are written to a temporary file and
// renamed, never through a symbolic link; an entry that cannot be read or does not hold what
// its name says counts as missing. prune() keeps only the entries of the last run.
class CalendarTextCache {
 public:
  using Key = std::array<std::uint8_t, 32>;

  // The cache in $XDG_CACHE_HOME (or ~/.cache) zetosynctool/calendars; none when it cannot be
  // opened, and every calendar is then exported.
  static std::unique_ptr<CalendarTextCache> openUserCache();

  std::optional<std::vector<std::uint8_t>> find(const Key& key);
  // Keeps the text; a failure to write only costs the next run an export.
  void store(const Key& key, std::span<const std::uint8_t> text);
  // Removes the entries neither found nor stored since the cache was opened, and then entries
  // until the rest fits the size cap.
  void prune();

  static constexpr std::uint64_t kSizeCap = std::uint64_t{512} << 20;

 private:
  explicit CalendarTextCache(platform::FolderHandle folder);

  platform::FolderHandle folder_;
  std::set<std::string> used_;
};

}  // namespace zt::calendars
