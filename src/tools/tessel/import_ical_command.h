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

// `import ical PATH... [--title T] [--calendar C] [--sync-deletes] [--strict]`: reads every
// file and folder (every *.ics in it) before the store is opened. What cannot be read costs
// only itself (a property, else its event or task), with a warning on standard error naming
// its file and line; with --strict (OnFault::Refuse) a fault anywhere imports nothing. A file
// that is no iCalendar file imports nothing either way. Each path is found again as the
// calendar it was imported into before (importers::readICalendarPaths). Prints one line per
// calendar, "<id> \"<title>\": N events, M tasks", then "X written, Y deleted", and
// "; W warnings" after it when there were any.
void importICalendars(CommandContext& context, const std::vector<std::string>& paths,
                      const ICalImportChoices& choices, importers::SyncDeletes syncDeletes,
                      importers::OnFault onFault);

}  // namespace tessel::cli
