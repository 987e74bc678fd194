#pragma once

#include <optional>
#include <string>

#include "tools/tessel/command_context.h"

namespace tessel::cli {

// `tessel sync [ID]`: refreshes every source, then runs `zetosynctool --oneshot --sync` for
// the client `ID`, or else for every connected player whose client (as `tessel devices`
// suggests it) is registered, one after another. Each sync's progress shows as it runs and its
// outcome as one line; at the end the desktop shows the outcome as a notice when a session bus
// is there. Answers the exit status (sync_outcome.h).
int syncPlayers(CommandContext& context, const std::optional<std::string>& clientIdentifier);

}  // namespace tessel::cli
