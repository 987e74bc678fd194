#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "filters/filter_helpers.h"
#include "filters/selection_filter.h"
#include "tessel/decoder.h"
#include "tessel/snapshot.h"

namespace zt::filters {

// The user's choice of calendars for one player: all of them, or some. The twin of
// ZetoContactFilter; it differs in what it asks its helper and in equality, where the same
// calendars in another order count as the same selection.
class ZetoCalendarFilter final : public SelectionFilter {
 public:
  static constexpr std::string_view kClassName = "ZetoCalendarFilter";

  ZetoCalendarFilter();
  explicit ZetoCalendarFilter(tessel::Decoder& decoder);

  static void setCalendarFilterHelper(CalendarFilterHelper* helper);

  bool useAllCalendars() const { return useAll(); }
  void setUseAllCalendars(bool useAll) { setUseAll(useAll); }
  const tessel::CodedElements& usedCalendarGroups() const { return selection(); }
  std::vector<std::string> usedCalendarGroupIDsForSnapshot(const tessel::Snapshot& snapshot) const {
    return selectedIDsForSnapshot(snapshot);
  }
  void setUsedCalendarGroups(const tessel::CodedElements& calendars) { setSelection(calendars); }
  void setUsedCalendarGroupIDs(const std::vector<std::string>& identifiers,
                               const tessel::Snapshot& snapshot) {
    setSelectedIDs(identifiers, snapshot);
  }

  bool shouldApplyRecord(const platform::Dictionary& record,
                         const std::string& identifier) const override;
  bool isEqual(const tessel::Filtering& other) const override;
};

}  // namespace zt::filters
