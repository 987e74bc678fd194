#pragma once

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
