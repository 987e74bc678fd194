#include "importers/ical_recurrence.h"

#include <string>
#include <utility>

#include "importers/ical_properties.h"
#include "tessel/schema.h"

namespace tessel::importers::ical {

using zt::platform::Array;
using zt::platform::Dictionary;
using zt::platform::TimeZone;
using zt::platform::Value;

namespace {

const char* weekdayName(int dayOfWeek) {
  // libical numbers the days from Sunday = 1.
  static constexpr const char* kNames[] = {"sunday",   "monday", "tuesday", "wednesday",
                                           "thursday", "friday", "saturday"};
  return dayOfWeek >= 1 && dayOfWeek <= 7 ? kNames[dayOfWeek - 1] : nullptr;
}

template <std::size_t N>
Array numbers(const short (&values)[N]) {
  Array array;
  for (std::size_t i = 0; i < N && values[i] != ICAL_RECURRENCE_ARRAY_MAX; ++i) {
    array.push_back(Value::integer(values[i]));
  }
  return array;
}

void setIfAny(Dictionary& record, std::string_view key, Array array) {
  if (!array.empty()) record.set(key, Value(std::move(array)));
}

}  // namespace

std::optional<Dictionary> recurrenceRecord(const ComponentReader& reader, icalproperty* property,
                                           const std::optional<ReadDate>& start) {
  const icalrecurrencetype rule = icalproperty_get_rrule(property);
  const char* frequency = nullptr;
  switch (rule.freq) {
    case ICAL_DAILY_RECURRENCE:
      frequency = "daily";
      break;
    case ICAL_WEEKLY_RECURRENCE:
      frequency = "weekly";
      break;
    case ICAL_MONTHLY_RECURRENCE:
      frequency = "monthly";
      break;
    case ICAL_YEARLY_RECURRENCE:
      frequency = "yearly";
      break;
    default:
      return std::nullopt;
  }
  Dictionary record{{TesselRecordEntityNameKey, Value(TesselEntity_Calendars_Recurrence)},
                    {TesselAttribute_Calendars_Recurrence_Frequency, Value(frequency)}};
  if (!icaltime_is_null_time(rule.until)) {
    // UNTIL has the value type of DTSTART; a local one is read in DTSTART's zone.
    std::optional<TimeZone> startZone;
    if (start && !start->wholeDay) startZone = start->date.timeZone();
    record.set(TesselAttribute_Calendars_Recurrence_Until,
               Value(reader.date(property, rule.until, startZone).date));
  }
  if (rule.count > 0)
    record.set(TesselAttribute_Calendars_Recurrence_Count, Value::integer(rule.count));
  if (rule.interval > 1) {
    record.set(TesselAttribute_Calendars_Recurrence_Interval, Value::integer(rule.interval));
  }
  Array months;
  for (std::size_t i = 0; i < ICAL_BY_MONTH_SIZE && rule.by_month[i] != ICAL_RECURRENCE_ARRAY_MAX;
       ++i) {
    months.push_back(Value::integer(icalrecurrencetype_month_month(rule.by_month[i])));
  }
  setIfAny(record, TesselAttribute_Calendars_Recurrence_Bymonth, std::move(months));
  setIfAny(record, TesselAttribute_Calendars_Recurrence_Byweeknumber, numbers(rule.by_week_no));
  setIfAny(record, TesselAttribute_Calendars_Recurrence_Byyearday, numbers(rule.by_year_day));
  setIfAny(record, TesselAttribute_Calendars_Recurrence_Bymonthday, numbers(rule.by_month_day));
  setIfAny(record, TesselAttribute_Calendars_Recurrence_Bysetpos, numbers(rule.by_set_pos));
  Array ordinals;
  Array days;
  for (std::size_t i = 0; i < ICAL_BY_DAY_SIZE && rule.by_day[i] != ICAL_RECURRENCE_ARRAY_MAX;
       ++i) {
    const char* day = weekdayName(icalrecurrencetype_day_day_of_week(rule.by_day[i]));
    if (day == nullptr) continue;
    // "2MO" is the second Monday, "-1FR" the last Friday, "TU" every Tuesday (0).
    ordinals.push_back(Value::integer(icalrecurrencetype_day_position(rule.by_day[i])));
    days.emplace_back(day);
  }
  setIfAny(record, TesselAttribute_Calendars_Recurrence_Bydayfreq, std::move(ordinals));
  setIfAny(record, TesselAttribute_Calendars_Recurrence_Bydaydays, std::move(days));
  // libical fills in Monday when WKST is absent; only a written one is kept.
  if (valueText(property).find("WKST=") != std::string::npos) {
    if (const char* day = weekdayName(rule.week_start)) {
      record.set(TesselAttribute_Calendars_Recurrence_Weekstartday, Value(day));
    }
  }
  return record;
}

}  // namespace tessel::importers::ical
