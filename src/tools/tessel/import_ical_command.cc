#include "tools/tessel/import_ical_command.h"

#include <filesystem>
#include <iostream>
#include <utility>

#include "tools/tessel/counted.h"
#include "tools/tessel/import_report.h"
#include "tools/tessel/record_names.h"

namespace tessel::cli {

void importICalendars(CommandContext& context, const std::vector<std::string>& paths,
                      const ICalImportChoices& choices, importers::SyncDeletes syncDeletes,
                      importers::OnFault onFault) {
  importers::ImportWarnings warnings(onFault);
  // Every file is read before the store is opened: a fault in one says so before anything
  // about the store.
  std::vector<importers::ICalPath> parsed = importers::parseICalendarPaths(
      std::vector<std::filesystem::path>(paths.begin(), paths.end()), warnings);
  importers::ICalImportTarget target;
  target.title = choices.title;
  if (choices.calendar) {
    target.calendar = resolveName(namedRecords(context.store(), NamedEntity::Calendar),
                                  *choices.calendar, NamedEntity::Calendar);
  }
  std::vector<importers::ICalCalendar> calendars = importers::readICalendarPaths(
      std::move(parsed), target, importers::knownCalendars(context.store()), warnings);
  writeImportWarnings(std::cerr, warnings);
  const importers::ICalImportCounts counts =
      importers::writeICalCalendars(context.store(), calendars, syncDeletes);
  for (const importers::ICalCalendar& calendar : calendars) {
    context.out() << calendar.identifier << " \"" << calendar.title
                  << "\": " << counted(calendar.eventCount, "event", "events") << ", "
                  << counted(calendar.taskCount, "task", "tasks") << '\n';
  }
  context.out() << counts.written << " written, " << counts.deleted << " deleted"
                << warningCount(warnings) << '\n';
}

}  // namespace tessel::cli
