#pragma once

#include <string>
#include <vector>

#include "importers/vcard_import.h"
#include "tools/tessel/command_context.h"

namespace tessel::cli {

// `import vcard PATH... [--sync-deletes] [--strict]`: reads every file and folder (every *.vcf
// in it) before the store is opened. What cannot be read costs only itself (a line, a
// property), with a warning on standard error naming its file and line; with --strict
// (OnFault::Refuse) a fault anywhere imports nothing. A file that is no vCard file imports
// nothing either way. Prints "N contacts, M groups from K files; X written, Y deleted", and
// "; W warnings" after it when there were any.
void importVCards(CommandContext& context, const std::vector<std::string>& paths,
                  importers::SyncDeletes syncDeletes, importers::OnFault onFault);

}  // namespace tessel::cli
