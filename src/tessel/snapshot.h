#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/value.h"
#include "tessel/record.h"
#include "tessel/record_reference.h"

namespace tessel {

namespace detail {
class ReadView;
}

// Where the records of some entities stand in a snapshot: the latest generation among them
// (tombstones included) and how many there are. Every write of such a record takes a new,
// higher generation, and a record that leaves them lowers the count, so two snapshots of one
// store whose versions are equal hold the same records of those entities.
struct RecordsVersion {
  std::int64_t latestGeneration = 0;
  std::int64_t records = 0;

  bool operator==(const RecordsVersion&) const = default;
};

// A read-only, consistent view of truth for some entities: it does not see writes made after
// it was taken. Records of entities outside the view are not found. A snapshot keeps its
// read transaction open for as long as it lives.
class Snapshot {
 public:
  ~Snapshot();

  const std::vector<std::string>& entityNames() const { return entityNames_; }

  // Every record whose values equal the criteria's, key by key (the entity-name key
  // included); an empty criteria dictionary matches every record of the view.
  RecordMap recordsMatchingAttributes(const zt::platform::Dictionary& criteria) const;
  // The records of the identifiers that the view knows; others are left out.
  RecordMap recordsWithIdentifiers(const std::vector<std::string>& identifiers) const;
  std::optional<zt::platform::Dictionary> recordWithIdentifier(std::string_view identifier) const;

  // The identifiers of the view's records of `entity`, in identifier order, read without
  // decoding any record: a count, or the work list of a caller that reads them in batches.
  std::vector<std::string> recordIdentifiersOfEntity(std::string_view entity) const;
  // The version of the records of those entities that the view sees; no record is read.
  RecordsVersion versionOfEntities(const std::vector<std::string>& entities) const;
  // The records recordsMatchingAttributes(criteria) answers, in the same identifier order, but
  // handed to `visit` one at a time: only the record being visited is decoded and held. The
  // attributes named in `omitted` (an image, say) are left out of the visited records; read
  // them with attributeOfRecord when needed. `visit` may move the record out and may use this
  // snapshot.
  void forEachRecordMatching(const zt::platform::Dictionary& criteria,
                             const std::function<void(Record&)>& visit,
                             const std::vector<std::string>& omitted = {}) const;
  // The records recordsWithIdentifiers(identifiers) answers, in identifier order, one at a
  // time, read with one query per batch of identifiers; `omitted` as above.
  void forEachRecordWithIdentifiers(const std::vector<std::string>& identifiers,
                                    const std::function<void(Record&)>& visit,
                                    const std::vector<std::string>& omitted = {}) const;
  // One attribute of a record of the view; none when the record is not found or lacks it.
  std::optional<zt::platform::Value> attributeOfRecord(std::string_view identifier,
                                                       std::string_view attribute) const;

  std::optional<RecordReference> recordReferenceForRecordIdentifier(
      std::string_view identifier) const;
  std::optional<std::string> recordIdentifierForReference(const RecordReference& reference) const;

  // Internal: made by Session and Store.
  Snapshot(std::shared_ptr<detail::ReadView> view, std::vector<std::string> entityNames);

 private:
  bool sees(std::string_view entityName) const;
  std::shared_ptr<detail::ReadView> view_;
  std::vector<std::string> entityNames_;
};

}  // namespace tessel
