#pragma once

#include <optional>
#include <string>
#include <vector>

#include "importers/ical_import.h"
#include "tools/tessel/command_context.h"

namespace tessel::cli {

// `import ical PATH... [--title T] [--sync-deletes]`: reads every file and folder (every
// *.ics in it) before the store is opened, so that a malformed file anywhere (reported with
// its file and line) imports nothing. Prints one line per calendar,
// "<id> \"<title>\": N events, M tasks", then "X written, Y deleted".
void importICalendars(CommandContext& context, const std::vector<std::string>& paths,
                      const std::optional<std::string>& title, importers::SyncDeletes syncDeletes);

}  // namespace tessel::cli
