#include "tools/tessel/import_ical_command.h"

#include <filesystem>
#include <iostream>

#include "tools/tessel/counted.h"
#include "tools/tessel/import_report.h"

namespace tessel::cli {

void importICalendars(CommandContext& context, const std::vector<std::string>& paths,
                      const std::optional<std::string>& title, importers::SyncDeletes syncDeletes,
                      importers::OnFault onFault) {
  importers::ImportWarnings warnings(onFault);
  std::vector<importers::ICalCalendar> calendars = importers::readICalendarPaths(
      std::vector<std::filesystem::path>(paths.begin(), paths.end()), title, warnings);
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
