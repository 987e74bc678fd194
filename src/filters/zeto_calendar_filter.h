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

// The user's choice of calendars for one player: all of them, or some. The twin of
// ZetoContactFilter; it differs in what it asks its helper and in equality, where the same
// calendars in another order count as the same selection.
class ZetoCalendarFilter final : public tessel::Filtering {
 public:
  static constexpr std::string_view kClassName = "ZetoCalendarFilter";

  ZetoCalendarFilter();
  explicit ZetoCalendarFilter(tessel::Decoder& decoder);

  static void setCalendarFilterHelper(CalendarFilterHelper* helper);

  bool useAllCalendars() const { return _useAllCalendars; }
  void setUseAllCalendars(bool useAll);
  const tessel::CodedElements& usedCalendarGroups() const { return _usedCalendarGroups; }
  std::vector<std::string> usedCalendarGroupIDsForSnapshot(const tessel::Snapshot& snapshot) const;
  void setUsedCalendarGroups(const tessel::CodedElements& calendars);
  void setUsedCalendarGroupIDs(const std::vector<std::string>& identifiers,
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
  bool _useAllCalendars = true;
  tessel::CodedElements _usedCalendarGroups;
};

}  // namespace zt::filters
