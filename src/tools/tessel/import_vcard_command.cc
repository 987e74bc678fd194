#include "tools/tessel/import_vcard_command.h"

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

void importVCards(CommandContext& context, const std::vector<std::string>& paths,
                  importers::SyncDeletes syncDeletes) {
  importers::VCardImport import;
  import.addPaths(std::vector<std::filesystem::path>(paths.begin(), paths.end()));
  const importers::VCardImportSummary summary = import.writeTo(context.store(), syncDeletes);
  context.out() << counted(summary.contacts, "contact", "contacts") << ", "
                << counted(summary.groups, "group", "groups") << " from "
                << counted(summary.files, "file", "files") << "; " << summary.written
                << " written, " << summary.deleted << " deleted\n";
}

}  // namespace tessel::cli
