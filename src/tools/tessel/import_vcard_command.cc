#include "tools/tessel/import_vcard_command.h"

#include <filesystem>
#include <iostream>
#include <utility>

#include "tools/tessel/counted.h"
#include "tools/tessel/import_report.h"

namespace tessel::cli {

void importVCards(CommandContext& context, const std::vector<std::string>& paths,
                  importers::SyncDeletes syncDeletes, importers::OnFault onFault) {
  importers::ImportWarnings warnings(onFault);
  importers::VCardImport import(warnings);
  import.addPaths(std::vector<std::filesystem::path>(paths.begin(), paths.end()));
  writeImportWarnings(std::cerr, warnings);
  const importers::VCardImportSummary summary =
      std::move(import).writeTo(context.store(), syncDeletes);
  context.out() << counted(summary.contacts, "contact", "contacts") << ", "
                << counted(summary.groups, "group", "groups") << " from "
                << counted(summary.files, "file", "files") << "; " << summary.written
                << " written, " << summary.deleted << " deleted" << warningCount(warnings) << '\n';
}

}  // namespace tessel::cli
