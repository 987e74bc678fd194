#include "tools/tessel/sync_outcome.h"

#include <algorithm>

namespace tessel::cli {

namespace {

std::string outcomeWord(int status) {
  switch (status) {
    case kSyncSucceeded:
      return "synced";
    case kSyncCancelled:
      return "cancelled";
    case kSyncPlayerUnavailable:
      return "not synced";
    default:
      return "failed";
  }
}

std::string summaryOf(const PlayerSync& player) {
  switch (player.status) {
    case kSyncSucceeded:
      return player.name + " synced";
    case kSyncCancelled:
      return player.name + " sync cancelled";
    case kSyncPlayerUnavailable:
      return player.name + " not synced";
    default:
      return player.name + " sync failed";
  }
}

}  // namespace

std::string withThousands(std::size_t count) {
  std::string digits = std::to_string(count);
  for (auto at = static_cast<std::ptrdiff_t>(digits.size()) - 3; at > 0; at -= 3) {
    digits.insert(static_cast<std::size_t>(at), ",");
  }
  return digits;
}

int SyncRun::exitStatus() const {
  if (stopped) return stopped->status;
  int worst = kSyncSucceeded;
  for (const PlayerSync& player : players) worst = std::max(worst, player.status);
  if (worst == kSyncSucceeded && refreshFailure) return kSyncNotRefreshed;
  return worst;
}

std::string SyncRun::outcomeLine(const PlayerSync& player) {
  return player.client + ": " + outcomeWord(player.status) + ": " + player.detail;
}

zt::platform::DesktopNotice SyncRun::notice() const {
  zt::platform::DesktopNotice notice;
  const int status = exitStatus();
  notice.urgency = status == kSyncFailed || status == kSyncPlayerUnavailable
                       ? zt::platform::NoticeUrgency::Critical
                       : zt::platform::NoticeUrgency::Normal;
  if (stopped) {
    notice.summary = stopped->status == kSyncNoPlayer ? "No Zeto to sync" : "Zeto not synced";
    notice.body = stopped->reason;
  } else if (players.size() == 1) {
    notice.summary = summaryOf(players.front());
    notice.body = players.front().detail;
  } else {
    // Several players: the summary of the worst, and a line for each.
    const auto worst = std::max_element(
        players.begin(), players.end(),
        [](const PlayerSync& a, const PlayerSync& b) { return a.status < b.status; });
    notice.summary = worst->status == kSyncSucceeded
                         ? std::to_string(players.size()) + " Zeto players synced"
                         : summaryOf(*worst);
    for (const PlayerSync& player : players) {
      if (!notice.body.empty()) notice.body += '\n';
      notice.body += player.name + ": " + outcomeWord(player.status) + ": " + player.detail;
    }
  }
  if (refreshFailure) {
    const bool someSynced =
        std::any_of(players.begin(), players.end(),
                    [](const PlayerSync& player) { return player.status == kSyncSucceeded; });
    if (status == kSyncNotRefreshed) notice.summary += ", but not refreshed";
    notice.body += "\nNot refreshed: " + *refreshFailure;
    if (someSynced) notice.body += "; the player has what the store held before";
    notice.body += " (tessel refresh says more).";
  }
  return notice;
}

}  // namespace tessel::cli
