#pragma once

#include <optional>
#include <string>
#include <vector>

#include "importers/ical_import.h"
#include "tools/tessel/command_context.h"

namespace tessel::cli {

// The options of `import ical` that choose the calendars.
struct ICalImportChoices {
  std::optional<std::string> title;     // --title: over what the files say
  std::optional<std::string> calendar;  // --calendar: an existing calendar, by name or identifier
};

// `import ical PATH... [--title T] [--calendar C] [--sync-deletes]`: reads every file and
// folder (every *.ics in it) before the store is opened, so that a malformed file anywhere
// (reported with its file and line) imports nothing. Each path is found again as the
// calendar it was imported into before (importers::readICalendarPaths). Prints one line per
// calendar, "<id> \"<title>\": N events, M tasks", then "X written, Y deleted".
void importICalendars(CommandContext& context, const std::vector<std::string>& paths,
                      const ICalImportChoices& choices, importers::SyncDeletes syncDeletes);

}  // namespace tessel::cli
