#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/value.h"
#include "tessel/connection.h"
#include "tessel/record.h"

namespace tessel::detail {

// The index of who names whom: for every live record, the identifiers its relationships hold,
// kept in the record_links table by every write. Deleting a record looks up the records that
// name it there instead of reading the whole truth.

// The identifiers `record`, of `entity`, names in its relationships; records of entities
// without relationships name none.
std::vector<std::string> namedIdentifiers(std::string_view entity,
                                          const zt::platform::Dictionary& record);

// Replaces the index entries of the record stored under `key` by the identifiers it names now
// (none for a record just deleted).
void indexLinks(Connection& connection, std::int64_t key, const std::vector<std::string>& named);

// The live records whose relationships name any of `removed`, each with those identifiers
// taken out (a relationship left empty goes, as importers leave an empty one out), in
// identifier order; `entities` gets their entities alongside.
std::vector<Record> recordsWithoutLinksTo(Connection& connection,
                                          const std::vector<std::string>& removed,
                                          std::vector<std::string>& entities);

// Indexes every live record; the migration that brings the index runs it once.
void indexEveryRecord(Connection& connection);

}  // namespace tessel::detail
