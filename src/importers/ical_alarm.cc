#include "importers/ical_alarm.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <utility>

#include "importers/ical_properties.h"
#include "platform/ascii.h"
#include "tessel/schema.h"

namespace tessel::importers::ical {

using zt::platform::Array;
using zt::platform::Dictionary;
using zt::platform::lowerAscii;
using zt::platform::Value;

std::optional<Dictionary> alarmRecord(const ICalDocument& document, ICalTimeZones& zones,
                                      icalcomponent* alarm, const std::optional<ReadDate>& start,
                                      const std::optional<ReadDate>& end) {
  ComponentReader reader(document, zones, alarm);
  std::optional<icalproperty_action> action;
  icalproperty* trigger = nullptr;
  std::optional<std::int64_t> repeat, interval;
  std::optional<std::string> description, summary;
  Array recipients;
  for (icalproperty* property : propertiesOf(alarm)) {
    switch (icalproperty_isa(property)) {
      case ICAL_ACTION_PROPERTY:
        action = icalproperty_get_action(property);
        break;
      case ICAL_TRIGGER_PROPERTY:
        trigger = property;
        break;
      case ICAL_REPEAT_PROPERTY:
        repeat = icalproperty_get_repeat(property);
        break;
      case ICAL_DURATION_PROPERTY:
        interval = durationSeconds(icalproperty_get_duration(property));
        break;
      case ICAL_DESCRIPTION_PROPERTY:
        description = text(icalproperty_get_description(property));
        break;
      case ICAL_SUMMARY_PROPERTY:
        summary = text(icalproperty_get_summary(property));
        break;
      case ICAL_ATTENDEE_PROPERTY:
        recipients.emplace_back(valueText(property));
        break;
      default:
        break;
    }
  }
  if (!action || trigger == nullptr) return std::nullopt;
  std::string_view entity;
  switch (*action) {
    case ICAL_ACTION_AUDIO:
      entity = TesselEntity_Calendars_AudioAlarm;
      break;
    case ICAL_ACTION_EMAIL:
      entity = TesselEntity_Calendars_MailAlarm;
      break;
    case ICAL_ACTION_DISPLAY:
      entity = TesselEntity_Calendars_DisplayAlarm;
      break;
    default:
      return std::nullopt;
  }
  // The three alarm entities share their attribute names.
  Dictionary record{{TesselRecordEntityNameKey, Value(entity)}};
  const icaltriggertype when = icalproperty_get_trigger(trigger);
  if (!icaltime_is_null_time(when.time)) {
    record.set(TesselAttribute_Calendars_AudioAlarm_Triggerdate,
               Value(reader.date(trigger, when.time).date));
  } else {
    std::int64_t seconds = durationSeconds(when.duration);
    if (seconds > kLongestDuration || seconds < -kLongestDuration) {
      throw reader.error(trigger, "TRIGGER: a duration of more than 1000 years");
    }
    // The schema counts from the start; RELATED=END counts from the end (section 3.2.14).
    const std::optional<std::string> related = parameter(trigger, "RELATED");
    if (related && lowerAscii(*related) == "end" && start && end) {
      seconds += (end->date.instant() - start->date.instant()).count();
    }
    record.set(TesselAttribute_Calendars_AudioAlarm_Triggerduration, Value::integer(seconds));
  }
  if (repeat) record.set(TesselAttribute_Calendars_AudioAlarm_RepeatCount, Value::integer(*repeat));
  if (interval) {
    record.set(TesselAttribute_Calendars_AudioAlarm_RepeatInterval, Value::integer(*interval));
  }
  if (description) {
    record.set(TesselAttribute_Calendars_AudioAlarm_Description, Value(*description));
  }
  if (summary && entity != TesselEntity_Calendars_DisplayAlarm) {
    record.set(TesselAttribute_Calendars_AudioAlarm_Summary, Value(*summary));
  }
  if (entity == TesselEntity_Calendars_MailAlarm && !recipients.empty()) {
    record.set(TesselAttribute_Calendars_MailAlarm_Recipients, Value(std::move(recipients)));
  }
  return record;
}

}  // namespace tessel::importers::ical
