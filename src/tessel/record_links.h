#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <unordered_set>
#include <utility>
#include <vector>

#include "platform/value.h"
#include "tessel/connection.h"
#include "tessel/record.h"

namespace tessel::detail {

// The index of who names whom: for every live record, the identifiers its relationships hold,
// kept in the record_links table by every write. Deleting a record looks up the records that
// name it there instead of reading the whole truth.

// Keeps the index up to date for the records written in one transaction. Entries of records
// written for the first time are gathered and inserted sorted, many rows per statement, by
// flush(), which must run before anything reads the index; the old entries of records written
// again are dropped at once.
class LinkIndexer {
 public:
  // Records whose keys are above the largest key stored now are new: they have no entries.
  explicit LinkIndexer(Connection& connection);
  LinkIndexer(const LinkIndexer&) = delete;
  LinkIndexer& operator=(const LinkIndexer&) = delete;

  // The record stored under `key`, of `entity`, was written with these contents.
  void written(std::int64_t key, std::string_view entity, const zt::platform::Dictionary& record);
  // The record stored under `key` was deleted: it names no one.
  void deleted(std::int64_t key);
  void flush();

 private:
  void forget(std::int64_t key);
  // Whether the record under `key` is met for the first time since the last flush().
  bool firstTouch(std::int64_t key);
  Connection& connection_;
  // Keys up to this one may have entries in the table.
  std::int64_t largestOldKey_ = 0;
  // SQLite gives each added row a key above every key in the table, so the records added
  // since the last flush() are known by the largest key among them, with no set to fill.
  std::int64_t largestNewKey_ = 0;
  // (target, source) pairs waiting for flush().
  std::vector<std::pair<std::int64_t, std::int64_t>> pending_;
  // Records at or below largestOldKey_ met since the last flush().
  std::unordered_set<std::int64_t> touched_;
};

// The live records whose relationships name any of `removed`, each with those identifiers
// taken out (a relationship left empty goes, as importers leave an empty one out), in
// identifier order; `entities` gets their entities alongside.
std::vector<Record> recordsWithoutLinksTo(Connection& connection,
                                          const std::vector<std::string>& removed,
                                          std::vector<std::string>& entities);

// Indexes every live record; the migration that brings the index runs it once.
void indexEveryRecord(Connection& connection);

}  // namespace tessel::detail
