#pragma once

#include <poll.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace zt::platform {

// The event loop of one thread. Sources are file descriptors waited on with poll(2) and
// timers; each belongs to a set of named modes, and a run in one mode serves only the sources
// of that mode, so that a private wait (the device-event wait in "ZetoMode") cannot run any
// other work of the process. Time is measured on the monotonic clock.
//
// Callbacks may add and remove sources, their own included, while they run.
class RunLoop {
 public:
  using Clock = std::chrono::steady_clock;
  using SourceId = std::uint64_t;
  // Receives the descriptor and the events poll(2) reported for it.
  using DescriptorCallback = std::function<void(int fd, short revents)>;
  using TimerCallback = std::function<void()>;

  enum class ReturnAfter { SourceHandled, TimeElapsed };
  enum class RunResult {
    SourceHandled,  // one source was served (only with ReturnAfter::SourceHandled)
    TimedOut,       // the time given to the run has passed
    NoSources,      // the mode has no sources (left), nothing to wait for
  };
  enum class Repeat { Once, Periodically };

  // The loop of the calling thread, created at first use.
  static RunLoop& current();

  RunLoop() = default;
  RunLoop(const RunLoop&) = delete;
  RunLoop& operator=(const RunLoop&) = delete;

  // Watches a descriptor for `events` (POLLIN, POLLPRI...). The loop does not own it: its
  // owner removes the source before closing it (a closed one reports POLLNVAL at every turn).
  SourceId addDescriptor(int fd, short events, std::vector<std::string> modes,
                         DescriptorCallback callback);
  // A timer that fires `delay` after now; a periodic one fires again every `delay`.
  SourceId addTimer(Clock::duration delay, Repeat repeat, std::vector<std::string> modes,
                    TimerCallback callback);
  // Forgets a source; unknown or already removed identifiers are ignored.
  void removeSource(SourceId id);
  bool hasSource(SourceId id) const;

  // Serves the sources of `mode` for at most `seconds` (zero or less: one look at what is
  // ready, without waiting). With ReturnAfter::SourceHandled the run ends after the first
  // source served; with ReturnAfter::TimeElapsed it goes on until the time has passed.
  RunResult runInMode(std::string_view mode, double seconds, ReturnAfter returnAfter);

 private:
  struct Source {
    std::vector<std::string> modes;
    int fd = -1;  // -1 for a timer
    short events = 0;
    DescriptorCallback onDescriptor;
    Clock::time_point fireAt;
    std::optional<Clock::duration> interval;
    TimerCallback onTimer;

    bool inMode(std::string_view mode) const;
  };

  bool modeHasSources(std::string_view mode) const;
  std::optional<Clock::time_point> nextTimerIn(std::string_view mode) const;
  // Fires the timers of the mode that are due; at most one when `onlyOne`. Returns how many.
  int fireDueTimers(std::string_view mode, bool onlyOne);

  SourceId nextId_ = 1;
  std::map<SourceId, std::shared_ptr<Source>> sources_;
};

}  // namespace zt::platform
