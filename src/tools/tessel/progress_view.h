#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <ostream>
#include <string>

#include "platform/value.h"

namespace tessel::cli {

// The progress of running syncs as a person reads it: a bar per player, drawn as their
// notifications come. On a terminal the bar is redrawn in place; elsewhere (a pipe, the
// journal) each update is one line.
class ProgressView {
 public:
  // With a client identifier, only that client's notifications are shown.
  ProgressView(std::ostream& out, const std::optional<std::string>& client);

  // Shows one notification; answers its status once the sync of the followed client ended.
  std::optional<int> show(const std::string& name, const std::string& sender,
                          const zt::platform::Dictionary& info);

  // Other text is about to go to the terminal: the bar being drawn makes way for it, and the
  // next redraw() puts it back under that text.
  void makeWay();
  void redraw();

  // Ends the bar being drawn, when following stops before the sync's end.
  void end();

 private:
  struct Progress {
    std::string phase;
    double percent = 0;
    std::string dataClasses;
    std::optional<std::int64_t> status;
  };

  static std::string bar(const std::string& client, const Progress& progress);
  static void update(Progress& progress, const zt::platform::Dictionary& info);

  std::ostream& out_;
  std::optional<std::string> client_;
  bool live_;
  std::map<std::string, Progress> players_;
  // The player whose bar is on the terminal's last line, not yet ended.
  std::optional<std::string> drawn_;
};

}  // namespace tessel::cli
