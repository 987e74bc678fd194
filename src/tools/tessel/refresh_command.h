#pragma once

#include <cstddef>

#include "tools/tessel/command_context.h"

namespace tessel::cli {

// How a refresh of every source went.
struct RefreshOutcome {
  std::size_t sources = 0;
  std::size_t imported = 0;
  std::size_t unchanged = 0;
  std::size_t failed = 0;
  bool ok() const { return failed == 0; }
};

// `tessel refresh` (and the first step of a sync): brings every source of `tessel source list`
// into the store. One line per source on standard output as it ends ("1 calendar LOCATION:
// ..."); a source that cannot be read keeps what the store had from it, and the reason goes to
// standard error ("tessel: source 2: LOCATION: ...; the store keeps what it had from it"),
// after which the other sources go on. Without sources it does nothing, not even open the
// store. The command exits 1 when any source failed.
RefreshOutcome refreshSources(CommandContext& context);

}  // namespace tessel::cli
