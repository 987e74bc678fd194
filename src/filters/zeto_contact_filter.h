#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "filters/filter_helpers.h"
#include "filters/selection_filter.h"
#include "tessel/decoder.h"
#include "tessel/snapshot.h"

namespace zt::filters {

// The user's choice of contacts for one player: all of them, or the members of some groups.
// Stored with the sync client; the engine asks it record by record during a sync, and it
// defers to the contacts syncer registered as its helper.
class ZetoContactFilter final : public SelectionFilter {
 public:
  static constexpr std::string_view kClassName = "ZetoContactFilter";

  // Everything selected.
  ZetoContactFilter();
  // The stored form: the "use all" flag, then the group list. Raises TesselCodingException
  // when the payload holds something else.
  explicit ZetoContactFilter(tessel::Decoder& decoder);

  // The process-wide helper, not owned; none lets every record through.
  static void setContactFilterHelper(ContactFilterHelper* helper);

  bool useAllContacts() const { return useAll(); }
  void setUseAllContacts(bool useAll) { setUseAll(useAll); }
  const tessel::CodedElements& usedContactGroups() const { return selection(); }
  std::vector<std::string> usedContactGroupIDsForSnapshot(const tessel::Snapshot& snapshot) const {
    return selectedIDsForSnapshot(snapshot);
  }
  void setUsedContactGroups(const tessel::CodedElements& groups) { setSelection(groups); }
  void setUsedContactGroupIDs(const std::vector<std::string>& identifiers,
                              const tessel::Snapshot& snapshot) {
    setSelectedIDs(identifiers, snapshot);
  }

  bool shouldApplyRecord(const platform::Dictionary& record,
                         const std::string& identifier) const override;
  bool isEqual(const tessel::Filtering& other) const override;
};

}  // namespace zt::filters
