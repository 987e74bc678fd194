#include "importers/ical_alarm.h"

#include <chrono>
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

namespace {

// When a reader of the player's file sees the date: a whole day starts at midnight on the
// reader's own wall clock, which the local zone stands for.
std::chrono::sys_seconds instantOnWallClock(const ReadDate& date) {
  if (!date.wholeDay) return date.date.instant();
  zt::platform::CalendarDate::Fields midnight = date.date.fields();
  midnight.hour = 0;
  return zt::platform::CalendarDate::fromFields(midnight, zt::platform::TimeZone::local())
      .instant();
}

}  // namespace

std::optional<Dictionary> alarmRecord(const ICalDocument& document, ICalTimeZones& zones,
                                      icalcomponent* alarm, const std::optional<ReadDate>& start,
                                      const std::optional<ReadDate>& end) {
  ComponentReader reader(document, zones, alarm);
  std::optional<icalproperty_action> action;
  icalproperty* actionProperty = nullptr;
  icalproperty* trigger = nullptr;
  std::optional<std::int64_t> repeat, interval;
  std::optional<std::string> description, summary;
  Array recipients;
  for (icalproperty* property : propertiesOf(alarm)) {
    switch (icalproperty_isa(property)) {
      case ICAL_ACTION_PROPERTY:
        action = icalproperty_get_action(property);
        actionProperty = property;
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
  if (trigger == nullptr) {
    reader.warn(nullptr, "VALARM without TRIGGER: dropped");
    return std::nullopt;
  }
  if (!action) {
    // ACTION is required (RFC 5545 section 3.6.6), but some writers leave it out; a
    // reminder on screen is what such an alarm can only have meant.
    reader.warn(nullptr, "VALARM without ACTION: read as a display alarm");
    action = ICAL_ACTION_DISPLAY;
  }
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
      // RFC 9074 section 7.2: ACTION:NONE (Apple's acknowledged default alarms) never
      // alerts, so dropping it loses nothing.
      if (actionProperty != nullptr && lowerAscii(valueText(actionProperty)) != "none") {
        reader.warn(actionProperty,
                    "VALARM: ACTION:" + valueText(actionProperty) + " is not an alarm: dropped");
      }
      return std::nullopt;
  }
  // The three alarm entities share their attribute names.
  Dictionary record{{TesselRecordEntityNameKey, Value(entity)}};
  const icaltriggertype when = icalproperty_get_trigger(trigger);
  std::int64_t seconds = 0;
  if (!icaltime_is_null_time(when.time)) {
    // An alarm at a fixed time (Thunderbird and Google write them) becomes its offset from
    // the start, which is what the calendar on the player counts from. A TRIGGER should be
    // UTC (section 3.8.6.3); one without zone is read on the start's wall clock.
    const std::optional<zt::platform::TimeZone> floating =
        start && !start->wholeDay ? std::optional(start->date.timeZone()) : std::nullopt;
    const ReadDate at = reader.date(trigger, when.time, floating);
    if (!start) {
      reader.warn(trigger, "TRIGGER at a fixed time in an event without DTSTART: kept as a date");
      record.set(TesselAttribute_Calendars_AudioAlarm_Triggerdate, Value(at.date));
    } else {
      seconds = (instantOnWallClock(at) - instantOnWallClock(*start)).count();
    }
  } else {
    seconds = durationSeconds(when.duration);
    // The schema counts from the start; RELATED=END counts from the end (section 3.2.14).
    const std::optional<std::string> related = parameter(trigger, "RELATED");
    if (related && lowerAscii(*related) == "end" && start && end) {
      seconds += (end->date.instant() - start->date.instant()).count();
    }
  }
  if (seconds > kLongestDuration || seconds < -kLongestDuration) {
    throw reader.error(trigger, "TRIGGER: a duration of more than 1000 years");
  }
  if (!record.contains(TesselAttribute_Calendars_AudioAlarm_Triggerdate)) {
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
