#include "tools/tessel/import_vcard_command.h"

#include <filesystem>
#include <ostream>
#include <utility>

#include "tools/tessel/counted.h"

namespace tessel::cli {

void importVCards(CommandContext& context, const std::vector<std::string>& paths,
                  importers::SyncDeletes syncDeletes) {
  importers::VCardImport import;
  import.addPaths(std::vector<std::filesystem::path>(paths.begin(), paths.end()));
  const importers::VCardImportSummary summary =
      std::move(import).writeTo(context.store(), syncDeletes);
  context.out() << counted(summary.contacts, "contact", "contacts") << ", "
                << counted(summary.groups, "group", "groups") << " from "
                << counted(summary.files, "file", "files") << "; " << summary.written
                << " written, " << summary.deleted << " deleted\n";
}

}  // namespace tessel::cli
