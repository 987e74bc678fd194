#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "filters/filter_helpers.h"
#include "tessel/coder.h"
#include "tessel/decoder.h"
#include "tessel/filtering.h"
#include "tessel/snapshot.h"

namespace zt::filters {

// The user's choice of contacts for one player: all of them, or the members of some groups.
// Stored with the sync client; the engine asks it record by record during a sync, and it
// defers to the contacts syncer registered as its helper.
class ZetoContactFilter final : public tessel::Filtering {
 public:
  static constexpr std::string_view kClassName = "ZetoContactFilter";

  // Everything selected.
  ZetoContactFilter();
  // The stored form: the "use all" flag, then the group list. Raises TesselCodingException
  // when the payload holds something else.
  explicit ZetoContactFilter(tessel::Decoder& decoder);

  // The process-wide helper, not owned; none lets every record through.
  static void setContactFilterHelper(ContactFilterHelper* helper);

  bool useAllContacts() const { return _useAllContacts; }
  void setUseAllContacts(bool useAll);
  const tessel::CodedElements& usedContactGroups() const { return _usedContactGroups; }
  std::vector<std::string> usedContactGroupIDsForSnapshot(const tessel::Snapshot& snapshot) const;
  void setUsedContactGroups(const tessel::CodedElements& groups);
  void setUsedContactGroupIDs(const std::vector<std::string>& identifiers,
                              const tessel::Snapshot& snapshot);
  bool needsUpdate() const { return _needsUpdate; }
  void setNeedsUpdate(bool needsUpdate) { _needsUpdate = needsUpdate; }

  std::string className() const override { return std::string(kClassName); }
  std::vector<std::string> supportedEntityNames() const override;
  bool shouldApplyRecord(const platform::Dictionary& record,
                         const std::string& identifier) const override;
  bool isEqual(const tessel::Filtering& other) const override;
  void encode(tessel::Coder& coder) const override;
  std::string description() const override;

 private:
  bool _needsUpdate = false;
  bool _useAllContacts = true;
  tessel::CodedElements _usedContactGroups;
};

}  // namespace zt::filters
