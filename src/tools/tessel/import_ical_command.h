#pragma once

#include <optional>
#include <string>
#include <vector>

#include "importers/ical_import.h"
#include "tools/tessel/command_context.h"

namespace tessel::cli {

// `import ical PATH... [--title T] [--sync-deletes] [--strict]`: reads every file and folder
// (every *.ics in it) before the store is opened. What cannot be read costs only itself (a
// property, else its event or task), with a warning on standard error naming its file and
// line; with --strict (OnFault::Refuse) a fault anywhere imports nothing. A file that is no
// iCalendar file imports nothing either way. Prints one line per calendar,
// "<id> \"<title>\": N events, M tasks", then "X written, Y deleted", and "; W warnings"
// after it when there were any.
void importICalendars(CommandContext& context, const std::vector<std::string>& paths,
                      const std::optional<std::string>& title, importers::SyncDeletes syncDeletes,
                      importers::OnFault onFault);

}  // namespace tessel::cli
