#pragma once

#include <string>
#include <vector>

#include "importers/vcard_import.h"
#include "tools/tessel/command_context.h"

namespace tessel::cli {

// `import vcard PATH... [--sync-deletes]`: reads every file and folder (every *.vcf in it)
// before the store is opened, so that a malformed card anywhere (reported with its file and
// line) imports nothing. Prints "N contacts, M groups from K files; X written, Y deleted".
void importVCards(CommandContext& context, const std::vector<std::string>& paths,
                  importers::SyncDeletes syncDeletes);

}  // namespace tessel::cli
