#include "tools/tessel/progress_view.h"

#include <algorithm>
#include <cmath>
#include <iomanip>
#include <sstream>

#include "platform/sync_progress.h"
#include "platform/terminal.h"

namespace tessel::cli {

namespace {

std::string phaseWord(const std::string& phase) {
  static const std::map<std::string, std::string, std::less<>> words = {
      {zt::platform::sync_progress::kConnectingPhase, "connecting"},
      {zt::platform::sync_progress::kMinglingPhase, "preparing"},
      {zt::platform::sync_progress::kUploadingPhase, "writing"},
      {zt::platform::sync_progress::kDisconnectingPhase, "done"},
  };
  auto it = words.find(phase);
  return it == words.end() ? phase : it->second;
}

std::string statusWord(std::int64_t status) {
  switch (status) {
    case 0:
      return "success";
    case 1:
      return "cancelled";
    case 2:
      return "failed";
    case 3:
      return "player unavailable";
    default:
      return "status " + std::to_string(status);
  }
}

}  // namespace

ProgressView::ProgressView(std::ostream& out, const std::optional<std::string>& client)
    : out_(out),
      client_(client),
      live_(zt::platform::isTerminal(zt::platform::StandardStream::Output)) {}

std::optional<int> ProgressView::show(const std::string& name, const std::string& sender,
                                      const zt::platform::Dictionary& info) {
  if (name != zt::platform::sync_progress::kNotificationName) return std::nullopt;
  if (client_ && sender != *client_) return std::nullopt;
  Progress& progress = players_[sender];
  update(progress, info);
  // On a terminal each player's bar is redrawn in place; otherwise one line per update.
  if (live_) {
    out_ << '\r' << "\x1b[K" << bar(sender, progress);
    if (progress.status) {
      out_ << '\n';
      drawn_.reset();
    } else {
      drawn_ = sender;
    }
  } else {
    out_ << bar(sender, progress) << '\n';
  }
  out_.flush();
  if (!progress.status) return std::nullopt;
  const auto status = static_cast<int>(*progress.status);
  players_.erase(sender);
  if (client_) return status;
  return std::nullopt;
}

void ProgressView::makeWay() {
  if (!live_ || !drawn_) return;
  out_ << '\r' << "\x1b[K";
  out_.flush();
}

void ProgressView::redraw() {
  if (!live_ || !drawn_) return;
  if (auto it = players_.find(*drawn_); it != players_.end()) {
    out_ << bar(it->first, it->second);
    out_.flush();
  }
}

void ProgressView::end() {
  if (live_ && drawn_) out_ << '\n';
  drawn_.reset();
}

std::string ProgressView::bar(const std::string& client, const Progress& progress) {
  constexpr int kWidth = 30;
  double percent = std::isfinite(progress.percent) ? progress.percent : 0;
  percent = std::clamp(percent, 0.0, 100.0);
  int filled = static_cast<int>(std::lround(percent / 100 * kWidth));
  std::ostringstream line;
  line << client << " [" << std::string(static_cast<std::size_t>(filled), '#')
       << std::string(static_cast<std::size_t>(kWidth - filled), '-') << "] " << std::fixed
       << std::setprecision(1) << std::setw(5) << percent << "% " << phaseWord(progress.phase);
  if (!progress.dataClasses.empty()) line << " (" << progress.dataClasses << ")";
  if (progress.status) line << ": " << statusWord(*progress.status);
  return line.str();
}

// Reads one notification's payload into the player's progress.
void ProgressView::update(Progress& progress, const zt::platform::Dictionary& info) {
  if (const auto* phase = info.find(zt::platform::sync_progress::kCurrentPhaseKey);
      phase && phase->asString()) {
    progress.phase = *phase->asString();
  }
  if (const auto* percent = info.find(zt::platform::sync_progress::kPercentKey);
      percent && percent->asNumber()) {
    progress.percent = percent->asNumber()->doubleValue();
  }
  if (const auto* classes = info.find(zt::platform::sync_progress::kDataClassSyncingKey);
      classes && classes->asArray()) {
    std::string names;
    for (const zt::platform::Value& name : *classes->asArray()) {
      if (!name.asString()) continue;
      std::string text = *name.asString();
      // "tessel.contacts" reads better as "contacts".
      if (auto dot = text.rfind('.'); dot != std::string::npos) text.erase(0, dot + 1);
      names += (names.empty() ? "" : ", ") + text;
    }
    progress.dataClasses = names.empty() ? "nothing to sync" : names;
  }
  if (const auto* status = info.find(zt::platform::sync_progress::kStatusKey);
      status && status->asNumber()) {
    progress.status = status->asNumber()->int64Value();
  }
}

}  // namespace tessel::cli
