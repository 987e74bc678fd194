#include "tools/tessel/import_ical_command.h"

#include <cstddef>
#include <filesystem>
#include <ostream>
#include <string_view>

namespace tessel::cli {

namespace {

std::string counted(std::size_t count, std::string_view one, std::string_view many) {
  return std::to_string(count) + " " + std::string(count == 1 ? one : many);
}

}  // namespace

void importICalendars(CommandContext& context, const std::vector<std::string>& paths,
                      const std::optional<std::string>& title, importers::SyncDeletes syncDeletes) {
  const std::vector<importers::ICalCalendar> calendars = importers::readICalendarPaths(
      std::vector<std::filesystem::path>(paths.begin(), paths.end()), title);
  const importers::ICalImportCounts counts =
      importers::writeICalCalendars(context.store(), calendars, syncDeletes);
  for (const importers::ICalCalendar& calendar : calendars) {
    context.out() << calendar.identifier << " \"" << calendar.title
                  << "\": " << counted(calendar.eventCount, "event", "events") << ", "
                  << counted(calendar.taskCount, "task", "tasks") << '\n';
  }
  context.out() << counts.written << " written, " << counts.deleted << " deleted\n";
}

}  // namespace tessel::cli
