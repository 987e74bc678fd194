#pragma once

#include <functional>
#include <string>
#include <vector>

#include "sources/http_client.h"
#include "sources/secret_service.h"
#include "sources/source.h"
#include "sources/source_state.h"
#include "tessel/store.h"

namespace tessel::sources {

enum class RefreshResult { Imported, Unchanged, Failed };

// How one source's refresh went: for Imported, what it brought ("\"Work\": 12 events, 0 tasks;
// 3 written, 1 deleted"); for Failed, why, and the store kept what it had of the source.
struct SourceRefresh {
  Source source;
  RefreshResult result = RefreshResult::Failed;
  std::string detail;
  // What a lenient source's text cost, one warningText each (importers/import_warnings.h).
  std::vector<std::string> warnings;
};

// Brings every source into the store, in the list's order, through the importers. What left a
// source leaves the store, and only what came from that source: a calendar source is one
// calendar, imported with its deletions; an address book's contacts are those its state lists
// (contacts are one pool, so the same card in two sources stays while either holds it). A source
// that cannot be read, or whose text the importers refuse, changes nothing in the store and the
// others go on; downloads are conditional on the validators of the last good one, and a
// collection the server reports unchanged is not imported again. A password is read as each
// source needs it (credentialsOf): a secret service that cannot answer fails only the sources
// that ask it. `report` hears of each source as it ends.
std::vector<SourceRefresh> refreshSources(Store& store, const std::vector<Source>& sources,
                                          const SourceStates& states, HttpClient& http,
                                          SecretService& secrets,
                                          const std::function<void(const SourceRefresh&)>& report);

// The calendar identifier of a calendar read from an address (files and folders keep that of
// `tessel import ical`, so a calendar imported by hand becomes the source's).
std::string calendarIdentifierForAddress(const std::string& address);

}  // namespace tessel::sources
