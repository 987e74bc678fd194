#include "platform/run_loop.h"

#include <algorithm>
#include <cerrno>
#include <ctime>
#include <system_error>
#include <utility>

namespace zt::platform {
namespace {

// Longer waits than this are taken as "for ever"; it keeps time arithmetic from overflowing.
constexpr double kLongestRunSeconds = 100.0 * 365 * 24 * 3600;

RunLoop::Clock::duration durationOf(double seconds) {
  if (!(seconds > 0)) return RunLoop::Clock::duration::zero();  // also NaN
  if (seconds > kLongestRunSeconds) seconds = kLongestRunSeconds;
  return std::chrono::duration_cast<RunLoop::Clock::duration>(
      std::chrono::duration<double>(seconds));
}

timespec timespecOf(RunLoop::Clock::duration d) {
  if (d < RunLoop::Clock::duration::zero()) d = RunLoop::Clock::duration::zero();
  auto whole = std::chrono::duration_cast<std::chrono::seconds>(d);
  auto nanos = std::chrono::duration_cast<std::chrono::nanoseconds>(d - whole);
  return timespec{static_cast<time_t>(whole.count()), static_cast<long>(nanos.count())};
}

}  // namespace

RunLoop& RunLoop::current() {
  thread_local RunLoop loop;
  return loop;
}

bool RunLoop::Source::inMode(std::string_view mode) const {
  for (const auto& m : modes) {
    if (m == mode) return true;
  }
  return false;
}

RunLoop::SourceId RunLoop::addDescriptor(int fd, short events, std::vector<std::string> modes,
                                         DescriptorCallback callback) {
  auto source = std::make_shared<Source>();
  source->modes = std::move(modes);
  source->fd = fd;
  source->events = events;
  source->onDescriptor = std::move(callback);
  SourceId id = nextId_++;
  sources_.emplace(id, std::move(source));
  return id;
}

RunLoop::SourceId RunLoop::addTimer(Clock::duration delay, Repeat repeat,
                                    std::vector<std::string> modes, TimerCallback callback) {
  auto source = std::make_shared<Source>();
  source->modes = std::move(modes);
  source->fireAt = Clock::now() + delay;
  if (repeat == Repeat::Periodically) {
    // A zero period would keep the loop from ever waiting.
    source->interval = std::max(delay, Clock::duration(std::chrono::milliseconds(1)));
  }
  source->onTimer = std::move(callback);
  SourceId id = nextId_++;
  sources_.emplace(id, std::move(source));
  return id;
}

void RunLoop::removeSource(SourceId id) {
  sources_.erase(id);
}

bool RunLoop::hasSource(SourceId id) const {
  return sources_.contains(id);
}

bool RunLoop::modeHasSources(std::string_view mode) const {
  for (const auto& [id, source] : sources_) {
    if (source->inMode(mode)) return true;
  }
  return false;
}

std::optional<RunLoop::Clock::time_point> RunLoop::nextTimerIn(std::string_view mode) const {
  std::optional<Clock::time_point> next;
  for (const auto& [id, source] : sources_) {
    if (source->fd >= 0 || !source->inMode(mode)) continue;
    if (!next || source->fireAt < *next) next = source->fireAt;
  }
  return next;
}

int RunLoop::fireDueTimers(std::string_view mode, bool onlyOne) {
  // Collect first: callbacks may change the table.
  std::vector<SourceId> due;
  auto now = Clock::now();
  for (const auto& [id, source] : sources_) {
    if (source->fd < 0 && source->inMode(mode) && source->fireAt <= now) due.push_back(id);
  }
  int fired = 0;
  for (SourceId id : due) {
    auto it = sources_.find(id);
    if (it == sources_.end()) continue;  // removed by an earlier callback
    std::shared_ptr<Source> source = it->second;
    if (source->interval) {
      source->fireAt += *source->interval;
      if (source->fireAt <= now) source->fireAt = now + *source->interval;
    } else {
      sources_.erase(it);
    }
    source->onTimer();
    ++fired;
    if (onlyOne) break;
  }
  return fired;
}

RunLoop::RunResult RunLoop::runInMode(std::string_view mode, double seconds,
                                      ReturnAfter returnAfter) {
  const bool onlyOne = returnAfter == ReturnAfter::SourceHandled;
  const Clock::time_point deadline = Clock::now() + durationOf(seconds);
  const std::string modeName(mode);  // callbacks may destroy the caller's text

  for (;;) {
    if (!modeHasSources(modeName)) return RunResult::NoSources;
    if (fireDueTimers(modeName, onlyOne) > 0 && onlyOne) return RunResult::SourceHandled;
    if (!modeHasSources(modeName)) return RunResult::NoSources;

    std::vector<pollfd> fds;
    std::vector<SourceId> ids;
    for (const auto& [id, source] : sources_) {
      if (source->fd < 0 || !source->inMode(modeName)) continue;
      fds.push_back(pollfd{source->fd, source->events, 0});
      ids.push_back(id);
    }
    Clock::time_point wakeAt = deadline;
    if (auto timer = nextTimerIn(modeName); timer && *timer < wakeAt) wakeAt = *timer;
    timespec timeout = timespecOf(wakeAt - Clock::now());
    int ready = ppoll(fds.data(), fds.size(), &timeout, nullptr);
    if (ready < 0) {
      if (errno == EINTR) continue;
      throw std::system_error(errno, std::generic_category(), "ppoll");
    }
    for (std::size_t i = 0; ready > 0 && i < fds.size(); ++i) {
      if (fds[i].revents == 0) continue;
      auto it = sources_.find(ids[i]);
      if (it == sources_.end()) continue;           // removed by an earlier callback of this round
      std::shared_ptr<Source> source = it->second;  // outlives its own removal
      source->onDescriptor(fds[i].fd, fds[i].revents);
      if (onlyOne) return RunResult::SourceHandled;
    }
    if (fireDueTimers(modeName, onlyOne) > 0 && onlyOne) return RunResult::SourceHandled;
    if (Clock::now() >= deadline) return RunResult::TimedOut;
  }
}

}  // namespace zt::platform
