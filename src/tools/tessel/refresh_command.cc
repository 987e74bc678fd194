#include "tools/tessel/refresh_command.h"

#include <iostream>
#include <stdexcept>

#include "sources/http_client.h"
#include "sources/secret_service.h"
#include "sources/source_refresh.h"

namespace tessel::cli {

RefreshOutcome refreshSources(CommandContext& context) {
  auto list = sources::SourceList::load(sources::SourceList::defaultPath());
  if (!list) throw std::runtime_error(list.error());
  RefreshOutcome outcome;
  outcome.sources = list->sources().size();
  if (outcome.sources == 0) return outcome;
  Store& store = context.store();
  const sources::SourceStates states(context.storePath());
  const auto http = sources::makeHttpClient();
  const auto secrets = sources::makeSecretService();
  sources::refreshSources(
      store, list->sources(), states, *http, *secrets, [&](const sources::SourceRefresh& refresh) {
        const sources::Source& source = refresh.source;
        if (refresh.result == sources::RefreshResult::Failed) {
          ++outcome.failed;
          context.out().flush();
          // The reason names the address, file or credentials file at fault.
          std::cerr << "tessel: source " << source.identifier << ": " << refresh.detail
                    << "; the store keeps what it had from it\n";
          return;
        }
        context.out().flush();
        for (const std::string& warning : refresh.warnings)
          std::cerr << "tessel: source " << source.identifier << ": warning: " << warning << '\n';
        ++(refresh.result == sources::RefreshResult::Imported ? outcome.imported
                                                              : outcome.unchanged);
        context.out() << source.identifier << ' ' << sources::collectionName(source.collection)
                      << ' ' << source.location << ": " << refresh.detail << '\n';
        context.out().flush();
      });
  return outcome;
}

}  // namespace tessel::cli
