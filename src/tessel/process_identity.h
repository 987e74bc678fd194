#pragma once

#include <cstdint>
#include <optional>

namespace tessel::detail {

// A process as the kernel knows it: its id and its start time (clock ticks after boot), so
// that a recycled process id is not taken for the process that once had it.
struct ProcessIdentity {
  long pid;
  std::int64_t startTime;

  static ProcessIdentity current();
  // The start time of a running (not zombie) process; none when it no longer runs.
  static std::optional<std::int64_t> startTimeOf(long pid);
  bool isAlive() const;
};

}  // namespace tessel::detail
