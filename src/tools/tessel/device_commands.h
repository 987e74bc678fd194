#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "tools/tessel/command_context.h"

namespace tessel::cli {

// `tessel devices`: the connected players (virtual ones when $ZETO_VIRTUAL_DEVICES is set),
// one line each: unique identifier, mount point or "not mounted", and the client identifier
// to register for it.
void listDevices(CommandContext& context);

// The client identifier suggested for a player: the tool finds its player by the identifier's
// trailing "%llX" text.
std::string suggestedClientIdentifier(std::uint64_t uniqueID);

// `tessel watch [ID]`: a live progress bar per player from the notifications of running
// syncs. With a client identifier it follows that client only and returns the status of its
// final notification (0 success, 1 cancelled, 2 error, 3 player unavailable); without one it
// follows every client until interrupted.
int watchSyncs(CommandContext& context, const std::optional<std::string>& clientIdentifier);

}  // namespace tessel::cli
