#include "filters/zeto_calendar_filter.h"

#include "filters/group_selection.h"
#include "tessel/schema.h"

namespace zt::filters {

namespace {

CalendarFilterHelper* calendarFilterHelper = nullptr;

constexpr SelectionFilter::Wording kWording = {
    ZetoCalendarFilter::kClassName, tessel::TesselEntity_Calendars_Calendar, "Calendar Filter",
    "*** WARNING: can't set list of selected calendars. Will sync all calendars"};

}  // namespace

ZetoCalendarFilter::ZetoCalendarFilter() : SelectionFilter(kWording) {}

ZetoCalendarFilter::ZetoCalendarFilter(tessel::Decoder& decoder)
    : SelectionFilter(kWording, decoder) {}

void ZetoCalendarFilter::setCalendarFilterHelper(CalendarFilterHelper* helper) {
  calendarFilterHelper = helper;
}

bool ZetoCalendarFilter::shouldApplyRecord(const platform::Dictionary& /*record*/,
                                           const std::string& identifier) const {
  if (useAll() || !calendarFilterHelper) return true;
  return calendarFilterHelper->shouldApplyCalendarWithIdentifier(identifier);
}

bool ZetoCalendarFilter::isEqual(const tessel::Filtering& other) const {
  const auto* filter = dynamic_cast<const ZetoCalendarFilter*>(&other);
  if (!filter || filter->useAll() != useAll()) return false;
  if (filter->selection().size() != selection().size()) return false;
  if (filter->selection() == selection()) return true;
  return group_selection::containsAll(selection(), filter->selection());
}

}  // namespace zt::filters
