#include "filters/zeto_calendar_filter.h"

#include "filters/group_selection.h"
#include "platform/log.h"
#include "tessel/exception.h"
#include "tessel/schema.h"

namespace zt::filters {

namespace {
CalendarFilterHelper* calendarFilterHelper = nullptr;
}  // namespace

ZetoCalendarFilter::ZetoCalendarFilter() = default;

ZetoCalendarFilter::ZetoCalendarFilter(tessel::Decoder& decoder) {
  platform::Value useAll = decoder.decodeValue();
  const platform::Number* flag = useAll.asNumber();
  if (!flag) {
    throw tessel::Exception(tessel::TesselCodingException,
                            "ZetoCalendarFilter: the first coded value is not a number");
  }
  _useAllCalendars = flag->boolValue();
  _usedCalendarGroups = decoder.decodeElements();
}

void ZetoCalendarFilter::setCalendarFilterHelper(CalendarFilterHelper* helper) {
  calendarFilterHelper = helper;
}

void ZetoCalendarFilter::setUseAllCalendars(bool useAll) {
  if (useAll == _useAllCalendars) return;
  _useAllCalendars = useAll;
  _needsUpdate = true;
}

std::vector<std::string> ZetoCalendarFilter::usedCalendarGroupIDsForSnapshot(
    const tessel::Snapshot& snapshot) const {
  return group_selection::identifiersForSnapshot(_usedCalendarGroups, snapshot);
}

void ZetoCalendarFilter::setUsedCalendarGroups(const tessel::CodedElements& calendars) {
  group_selection::replace(_usedCalendarGroups, calendars, _useAllCalendars, _needsUpdate);
}

void ZetoCalendarFilter::setUsedCalendarGroupIDs(const std::vector<std::string>& identifiers,
                                                 const tessel::Snapshot& snapshot) {
  tessel::CodedElements calendars =
      group_selection::referencesForIdentifiers(identifiers, snapshot);
  if (calendars.empty()) {
    platform::Log::always(
        "*** WARNING: can't set list of selected calendars. Will sync all calendars");
    setUseAllCalendars(true);
    return;
  }
  setUsedCalendarGroups(calendars);
}

std::vector<std::string> ZetoCalendarFilter::supportedEntityNames() const {
  return {std::string(tessel::TesselEntity_Calendars_Calendar)};
}

bool ZetoCalendarFilter::shouldApplyRecord(const platform::Dictionary& /*record*/,
                                           const std::string& identifier) const {
  if (_useAllCalendars || !calendarFilterHelper) return true;
  return calendarFilterHelper->shouldApplyCalendarWithIdentifier(identifier);
}

bool ZetoCalendarFilter::isEqual(const tessel::Filtering& other) const {
  const auto* filter = dynamic_cast<const ZetoCalendarFilter*>(&other);
  if (!filter || filter->_useAllCalendars != _useAllCalendars) return false;
  if (filter->_usedCalendarGroups.size() != _usedCalendarGroups.size()) return false;
  if (filter->_usedCalendarGroups == _usedCalendarGroups) return true;
  return group_selection::containsAll(_usedCalendarGroups, filter->_usedCalendarGroups);
}

void ZetoCalendarFilter::encode(tessel::Coder& coder) const {
  coder.encodeValue(platform::Value::boolean(_useAllCalendars));
  coder.encodeElements(_usedCalendarGroups);
}

std::string ZetoCalendarFilter::description() const {
  const void* self = this;
  if (_useAllCalendars) return platform::Log::format("Calendar Filter %p: enableAll YES", {self});
  return platform::Log::format("Calendar Filter %p: enableALL NO, with options %@",
                               {self, group_selection::describe(_usedCalendarGroups)});
}

}  // namespace zt::filters
