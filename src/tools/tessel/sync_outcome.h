#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/desktop_notifier.h"

namespace tessel::cli {

// The exit statuses of `tessel sync`. 1 to 3 are a sync's own outcome, as `tessel watch` gives
// them; with several players the highest of theirs.
inline constexpr int kSyncSucceeded = 0;
inline constexpr int kSyncCancelled = 1;
inline constexpr int kSyncFailed = 2;
inline constexpr int kSyncPlayerUnavailable = 3;
// Every sync succeeded, but a source could not be refreshed: the players hold what the store
// held before.
inline constexpr int kSyncNotRefreshed = 4;
// No sync client was given and no connected player has a registered one.
inline constexpr int kSyncNoPlayer = 5;

// What became of one player's sync.
struct PlayerSync {
  std::string client;        // the sync client's identifier
  std::string name;          // what a person calls the player
  int status = kSyncFailed;  // kSyncSucceeded ... kSyncPlayerUnavailable
  // After a success what the player holds ("1,204 contacts, 6 calendars"); otherwise why it
  // did not sync and what to do.
  std::string detail;
};

// One `tessel sync`: the refresh, then the players in the order they were synced.
struct SyncRun {
  std::optional<std::string> refreshFailure;
  std::vector<PlayerSync> players;
  // Why no player could be synced at all (no store, no zetosynctool, no player), and the exit
  // status that says so.
  struct Stop {
    int status;
    std::string reason;
  };
  std::optional<Stop> stopped;

  int exitStatus() const;
  // The line printed for one player, such as "zeto-1A2B: synced: 31 contacts, 2 calendars".
  static std::string outcomeLine(const PlayerSync& player);
  // What the desktop shows at the end.
  zt::platform::DesktopNotice notice() const;
};

// "1,204": a count as a person reads it.
std::string withThousands(std::size_t count);

}  // namespace tessel::cli
