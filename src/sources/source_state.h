#pragma once

#include <filesystem>
#include <string>
#include <vector>

#include "platform/result.h"
#include "sources/http_client.h"
#include "sources/source.h"

namespace tessel::sources {

// What the last good refresh of one source left behind, for the next one: the validators of
// its download, and the contact and group identifiers an address book produced, so that a
// contact that leaves this source leaves the store while those of other sources and of imports
// by hand stay.
struct SourceState {
  std::string location;
  Validators validators;
  std::vector<std::string> records;  // sorted
};

// The states of the sources that fill one store live beside it, in "<store>-sources/" (as
// SQLite names its own companions, truth.db-wal): they describe what that store holds, so
// another store (--store) starts from nothing and downloads everything.
class SourceStates {
 public:
  explicit SourceStates(const std::filesystem::path& storePath);

  // The state of the source; an empty one when there is none, it is unreadable or it belongs
  // to an earlier source of the same identifier (so the next download is unconditional).
  SourceState load(const Source& source) const;
  zt::platform::Result<void> save(const Source& source, const SourceState& state) const;
  void forget(const Source& source) const;

 private:
  std::filesystem::path fileOf(const Source& source) const;
  std::filesystem::path folder_;
};

}  // namespace tessel::sources
