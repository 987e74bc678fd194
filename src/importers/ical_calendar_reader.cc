#include "importers/ical_calendar_reader.h"

#include <libical/ical.h>

#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <map>
#include <memory>
#include <utility>

#include "importers/ical_document.h"
#include "importers/ical_time_zones.h"
#include "importers/import_error.h"
#include "platform/ascii.h"
#include "platform/calendar_date.h"
#include "platform/calendar_day.h"
#include "platform/value.h"
#include "tessel/schema.h"

namespace tessel::importers {

namespace {

using zt::platform::Array;
using zt::platform::CalendarDate;
using zt::platform::Dictionary;
using zt::platform::lowerAscii;
using zt::platform::TimeZone;
using zt::platform::Value;

// Durations beyond this are typing mistakes, and would carry dates out of any calendar.
constexpr std::int64_t kLongestDuration = std::int64_t{1000} * 366 * 86400;

struct FreeText {
  void operator()(char* text) const { std::free(text); }
};

std::vector<icalproperty*> propertiesOf(icalcomponent* component) {
  std::vector<icalproperty*> properties;
  for (icalproperty* property = icalcomponent_get_first_property(component, ICAL_ANY_PROPERTY);
       property != nullptr;
       property = icalcomponent_get_next_property(component, ICAL_ANY_PROPERTY)) {
    properties.push_back(property);
  }
  return properties;
}

std::vector<icalcomponent*> componentsOf(icalcomponent* component, icalcomponent_kind kind) {
  std::vector<icalcomponent*> components;
  for (icalcompiter it = icalcomponent_begin_component(component, kind);
       icalcompiter_deref(&it) != nullptr; icalcompiter_next(&it)) {
    components.push_back(icalcompiter_deref(&it));
  }
  return components;
}

// A parameter's value as written, without the quotes RFC 5545 section 3.2 puts around
// values holding ":", ";" or ",". None when the property lacks it.
std::optional<std::string> parameter(icalproperty* property, const char* name) {
  std::unique_ptr<char, FreeText> value(icalproperty_get_parameter_as_string_r(property, name));
  if (!value) return std::nullopt;
  std::string text;
  for (const char* c = value.get(); *c != '\0'; ++c) {
    if (*c != '"') text += *c;
  }
  return text;
}

std::string valueText(icalproperty* property) {
  std::unique_ptr<char, FreeText> value(icalproperty_get_value_as_string_r(property));
  return value ? std::string(value.get()) : std::string();
}

std::optional<std::string> text(const char* value) {
  if (value == nullptr || *value == '\0') return std::nullopt;
  return std::string(value);
}

std::string twoDigits(int n) {
  return (n < 10 ? "0" : "") + std::to_string(n);
}

std::string compactDate(const CalendarDate::Fields& f) {
  return std::to_string(f.year) + twoDigits(f.month) + twoDigits(f.day);
}

std::string compactDateTime(const CalendarDate::Fields& f) {
  return compactDate(f) + "T" + twoDigits(f.hour) + twoDigits(f.minute) + twoDigits(f.second);
}

// Bytes that structure the record identifiers ("/" "#") or that would make them hard to type
// are written as %XX, so that no UID can make the identifier of another record.
std::string escapedUid(std::string_view uid) {
  static constexpr char kHex[] = "0123456789ABCDEF";
  std::string escaped;
  for (char c : uid) {
    const auto byte = static_cast<unsigned char>(c);
    if (byte <= 0x20 || byte == 0x7F || c == '%' || c == '/' || c == '#') {
      escaped += '%';
      escaped += kHex[byte >> 4];
      escaped += kHex[byte & 0xF];
    } else {
      escaped += c;
    }
  }
  return escaped;
}

std::string hexHash(std::string_view text) {
  std::uint64_t hash = 0xcbf29ce484222325ULL;  // FNV-1a
  for (char c : text) {
    hash ^= static_cast<unsigned char>(c);
    hash *= 0x100000001b3ULL;
  }
  static constexpr char kHex[] = "0123456789abcdef";
  std::string hex(16, '0');
  for (int i = 15; i >= 0; --i, hash >>= 4) hex[static_cast<std::size_t>(i)] = kHex[hash & 0xF];
  return hex;
}

std::int64_t durationSeconds(const icaldurationtype& d) {
  const std::int64_t seconds = (std::int64_t{d.weeks} * 7 + d.days) * 86400 +
                               std::int64_t{d.hours} * 3600 + std::int64_t{d.minutes} * 60 +
                               d.seconds;
  return d.is_neg ? -seconds : seconds;
}

Array relationship(const std::vector<std::string>& identifiers) {
  Array array;
  for (const std::string& identifier : identifiers) array.emplace_back(identifier);
  return array;
}

enum class ItemKind { Event, Task };

// A date as a component carries it: the date and whether it was a whole day (a DATE value).
struct ReadDate {
  CalendarDate date;
  bool wholeDay;
};

// One VEVENT or VTODO with what its identifier is made of.
struct Item {
  ItemKind kind;
  const ICalDocument* document;
  icalcomponent* component;
  std::shared_ptr<ICalTimeZones> zones;
  std::string uid;
  std::optional<ReadDate> recurrenceId;
  std::string identifier;
  // The identifiers of the overrides of a master, in file order.
  std::vector<std::string> detached;
};

// Reads the values of one component, raising ImportError at the line of a faulty one.
class ComponentReader {
 public:
  ComponentReader(const ICalDocument& document, ICalTimeZones& zones, icalcomponent* component)
      : document_(document), zones_(zones), component_(component) {}

  ImportError error(icalproperty* property, std::string reason) const {
    return document_.errorAt(property, component_, std::move(reason));
  }

  std::string name(icalproperty* property) const {
    const char* name = icalproperty_get_property_name(property);
    return name != nullptr ? std::string(name) : std::string("property");
  }

  // RFC 5545 section 3.3.4 and 3.3.5: DATE values are whole days (kept as 12:00 GMT, as
  // the schema wants), "Z" times are UTC, TZID times are in that zone and the others
  // floating, which the local zone stands for.
  ReadDate date(icalproperty* property, const icaltimetype& t,
                const std::optional<TimeZone>& floatingZone = std::nullopt) const {
    check(property, t);
    const int second = t.second == 60 ? 59 : t.second;  // a leap second reads as :59
    if (t.is_date) {
      return {CalendarDate::fromFields({t.year, t.month, t.day, 12, 0, 0}, TimeZone::gmt()), true};
    }
    const CalendarDate::Fields fields{t.year, t.month, t.day, t.hour, t.minute, second};
    if (icaltime_is_utc(t)) return {CalendarDate::fromFields(fields, TimeZone::utc()), false};
    if (std::optional<std::string> tzid = parameter(property, "TZID")) {
      std::optional<TimeZone> zone = zones_.zone(*tzid);
      if (!zone) {
        throw error(property, name(property) + ": no VTIMEZONE defines the time zone \"" + *tzid +
                                  "\", and it is no IANA or Windows zone name");
      }
      return {CalendarDate::fromFields(fields, *zone), false};
    }
    return {CalendarDate::fromFields(fields, floatingZone ? *floatingZone : TimeZone::local()),
            false};
  }

  // `start` moved on by a duration; days count on the wall clock of the start's zone, the
  // rest exactly (RFC 5545 section 3.3.6).
  ReadDate plus(icalproperty* property, const ReadDate& start, const icaldurationtype& d) const {
    const std::int64_t days = std::int64_t{d.weeks} * 7 + d.days;
    const std::int64_t exact =
        std::int64_t{d.hours} * 3600 + std::int64_t{d.minutes} * 60 + d.seconds;
    if (days * 86400 + exact > kLongestDuration) {
      throw error(property, name(property) + ": a duration of more than 1000 years");
    }
    const std::int64_t sign = d.is_neg ? -1 : 1;
    const TimeZone& zone = start.date.timeZone();
    CalendarDate::Fields f = start.date.fields();
    using namespace std::chrono;
    const year_month_day day{local_days{year{f.year} / f.month / f.day} +
                             std::chrono::days{sign * days}};
    f.year = static_cast<int>(day.year());
    f.month = static_cast<int>(static_cast<unsigned>(day.month()));
    f.day = static_cast<int>(static_cast<unsigned>(day.day()));
    const CalendarDate moved = CalendarDate::fromFields(f, zone);
    return {CalendarDate(moved.instant() + seconds{sign * exact}, zone), start.wholeDay};
  }

  void check(icalproperty* property, const icaltimetype& t) const {
    if (icaltime_is_null_time(t)) throw error(property, name(property) + ": no date");
    if (t.year < 1 || t.year > 9999) {
      throw error(property, name(property) + ": the year " + std::to_string(t.year));
    }
    if (t.month < 1 || t.month > 12) {
      throw error(property, name(property) + ": there is no month " + std::to_string(t.month));
    }
    if (!zt::platform::isCalendarDay(t.year, t.month, t.day)) {
      throw error(property, name(property) + ": month " + std::to_string(t.month) + " of " +
                                std::to_string(t.year) + " has no day " + std::to_string(t.day));
    }
    if (!t.is_date && (t.hour < 0 || t.hour > 23 || t.minute < 0 || t.minute > 59 || t.second < 0 ||
                       t.second > 60)) {
      throw error(property, name(property) + ": there is no time " + twoDigits(t.hour) + ":" +
                                twoDigits(t.minute) + ":" + twoDigits(t.second));
    }
  }

 private:
  const ICalDocument& document_;
  ICalTimeZones& zones_;
  icalcomponent* component_;
};

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

// RFC 5545 section 3.3.10 rule parts as the Recurrence record holds them; none for the
// frequencies below a day, which the schema cannot say.
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

// RFC 5545 section 3.2.12: participation words become the schema's ("NEEDS-ACTION" →
// "needsaction").
std::string participationWord(std::string_view partstat) {
  std::string word;
  for (char c : lowerAscii(partstat)) {
    if (c != '-') word += c;
  }
  return word;
}

Dictionary participantRecord(icalproperty* property, std::string_view entity) {
  const bool attendee = entity == TesselEntity_Calendars_Attendee;
  Dictionary record{{TesselRecordEntityNameKey, Value(entity)}};
  if (auto dir = parameter(property, "DIR")) {
    record.set(TesselAttribute_Calendars_Attendee_DirectoryEntry, Value(*dir));
  }
  if (auto cn = parameter(property, "CN")) {
    record.set(TesselAttribute_Calendars_Attendee_CommonName, Value(*cn));
  }
  record.set(TesselAttribute_Calendars_Attendee_Email, Value(valueText(property)));
  if (!attendee) return record;
  if (auto cutype = parameter(property, "CUTYPE")) {
    record.set(TesselAttribute_Calendars_Attendee_UserType, Value(lowerAscii(*cutype)));
  }
  if (auto role = parameter(property, "ROLE")) {
    record.set(TesselAttribute_Calendars_Attendee_Role, Value(lowerAscii(*role)));
  }
  if (auto partstat = parameter(property, "PARTSTAT")) {
    record.set(TesselAttribute_Calendars_Attendee_Status, Value(participationWord(*partstat)));
  }
  if (auto rsvp = parameter(property, "RSVP")) {
    record.set(TesselAttribute_Calendars_Attendee_Rsvp,
               Value::boolean(lowerAscii(*rsvp) == "true"));
  }
  if (auto to = parameter(property, "DELEGATED-TO")) {
    record.set(TesselAttribute_Calendars_Attendee_Delegatedto, Value(*to));
  }
  if (auto from = parameter(property, "DELEGATED-FROM")) {
    record.set(TesselAttribute_Calendars_Attendee_Delegatedfrom, Value(*from));
  }
  return record;
}

// The sub-records of one event or task, with the relationships that list them.
struct Related {
  std::vector<Record> records;
  std::vector<std::string> recurrences, audioAlarms, mailAlarms, displayAlarms, organizer,
      attendees;
};

// RFC 5545 section 3.6.6: one VALARM, by its ACTION. None for actions the schema has no
// alarm for (PROCEDURE, X-...) and for alarms without the TRIGGER they must have.
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

// What a VEVENT or VTODO says, read once.
struct ItemFields {
  std::optional<std::string> summary, description, location, status, classification, url;
  std::optional<std::int64_t> priority;
  std::optional<ReadDate> start, end, due, completed;
  icalproperty* startProperty = nullptr;
  Array exceptionDates;
  std::vector<icalproperty*> rules, attendees;
  icalproperty* organizer = nullptr;
};

ItemFields readFields(const ComponentReader& reader, icalcomponent* component) {
  ItemFields fields;
  icalproperty* duration = nullptr;
  for (icalproperty* property : propertiesOf(component)) {
    switch (icalproperty_isa(property)) {
      case ICAL_SUMMARY_PROPERTY:
        fields.summary = text(icalproperty_get_summary(property));
        break;
      case ICAL_DESCRIPTION_PROPERTY:
        fields.description = text(icalproperty_get_description(property));
        break;
      case ICAL_LOCATION_PROPERTY:
        fields.location = text(icalproperty_get_location(property));
        break;
      case ICAL_STATUS_PROPERTY:
        // The schema's status words are RFC 5545 section 3.8.1.11's in lower case.
        fields.status = lowerAscii(valueText(property));
        break;
      case ICAL_CLASS_PROPERTY:
        fields.classification = lowerAscii(valueText(property));
        break;
      case ICAL_URL_PROPERTY:
        fields.url = text(icalproperty_get_url(property));
        break;
      case ICAL_PRIORITY_PROPERTY:
        // 0 is "undefined" (section 3.8.1.9).
        if (int priority = icalproperty_get_priority(property); priority > 0) {
          fields.priority = priority;
        }
        break;
      case ICAL_DTSTART_PROPERTY:
        fields.start = reader.date(property, icalproperty_get_dtstart(property));
        fields.startProperty = property;
        break;
      case ICAL_DTEND_PROPERTY:
        fields.end = reader.date(property, icalproperty_get_dtend(property));
        break;
      case ICAL_DUE_PROPERTY:
        fields.due = reader.date(property, icalproperty_get_due(property));
        break;
      case ICAL_COMPLETED_PROPERTY:
        fields.completed = reader.date(property, icalproperty_get_completed(property));
        break;
      case ICAL_DURATION_PROPERTY:
        duration = property;
        break;
      case ICAL_EXDATE_PROPERTY:
        fields.exceptionDates.emplace_back(
            reader.date(property, icalproperty_get_exdate(property)).date);
        break;
      case ICAL_RRULE_PROPERTY:
        fields.rules.push_back(property);
        break;
      case ICAL_ORGANIZER_PROPERTY:
        if (fields.organizer == nullptr) fields.organizer = property;
        break;
      case ICAL_ATTENDEE_PROPERTY:
        fields.attendees.push_back(property);
        break;
      default:
        break;
    }
  }
  const bool task = icalcomponent_isa(component) == ICAL_VTODO_COMPONENT;
  std::optional<ReadDate>& finish = task ? fields.due : fields.end;
  if (!finish && fields.start) {
    if (duration != nullptr) {
      finish = reader.plus(duration, *fields.start, icalproperty_get_duration(duration));
    } else if (!task) {
      // Section 3.6.1: without DTEND or DURATION an event of a DATE lasts that day, one of
      // a DATE-TIME lasts no time.
      icaldurationtype day = icaldurationtype_null_duration();
      day.days = fields.start->wholeDay ? 1 : 0;
      finish = reader.plus(fields.startProperty, *fields.start, day);
    }
  }
  return fields;
}

class CalendarBuilder {
 public:
  explicit CalendarBuilder(const ICalCalendarSource& source) : source_(source) {}

  ICalCalendar build() {
    std::vector<ICalDocument> documents;
    documents.reserve(source_.files.size());
    for (const ICalFile& file : source_.files) {
      documents.push_back(ICalDocument::parse(file.text, file.name));
    }

    ICalCalendar calendar;
    calendar.identifier = source_.identifier;
    std::optional<std::string> namedTitle;
    for (const ICalDocument& document : documents) {
      for (icalcomponent* vcalendar : document.calendars()) {
        collect(document, vcalendar, namedTitle);
      }
    }
    calendar.title = source_.title ? *source_.title
                     : namedTitle  ? *namedTitle
                                   : source_.fallbackTitle;
    linkOverrides();

    Dictionary calendarRecord{{TesselRecordEntityNameKey, Value(TesselEntity_Calendars_Calendar)},
                              {TesselAttribute_Calendars_Calendar_Title, Value(calendar.title)}};
    calendar.records.push_back({calendar.identifier, {}});
    std::vector<std::string> events, tasks;
    for (Item& item : items_) {
      (item.kind == ItemKind::Event ? events : tasks).push_back(item.identifier);
      append(item, calendar.records);
    }
    calendar.eventCount = events.size();
    calendar.taskCount = tasks.size();
    calendarRecord.set(TesselRelationship_Calendars_Calendar_Events, Value(relationship(events)));
    calendarRecord.set(TesselRelationship_Calendars_Calendar_Tasks, Value(relationship(tasks)));
    calendar.records.front().record = std::move(calendarRecord);
    return calendar;
  }

 private:
  void collect(const ICalDocument& document, icalcomponent* vcalendar,
               std::optional<std::string>& namedTitle) {
    auto zones = std::make_shared<ICalTimeZones>(vcalendar);
    for (icalproperty* property : propertiesOf(vcalendar)) {
      if (namedTitle || icalproperty_isa(property) != ICAL_X_PROPERTY) continue;
      const char* name = icalproperty_get_x_name(property);
      // X-WR-CALNAME: the calendar's name as Apple, Google and Outlook export it.
      if (name != nullptr && lowerAscii(name) == "x-wr-calname") {
        namedTitle = text(icalproperty_get_x(property));
      }
    }
    for (icalcomponent* component : componentsOf(vcalendar, ICAL_ANY_COMPONENT)) {
      const icalcomponent_kind kind = icalcomponent_isa(component);
      if (kind != ICAL_VEVENT_COMPONENT && kind != ICAL_VTODO_COMPONENT) continue;
      Item item{kind == ICAL_VEVENT_COMPONENT ? ItemKind::Event : ItemKind::Task,
                &document,
                component,
                zones,
                {},
                {},
                {},
                {}};
      ComponentReader reader(document, *zones, component);
      std::string fallback;
      for (icalproperty* property : propertiesOf(component)) {
        switch (icalproperty_isa(property)) {
          case ICAL_UID_PROPERTY:
            if (const char* uid = icalproperty_get_uid(property)) item.uid = uid;
            break;
          case ICAL_RECURRENCEID_PROPERTY:
            item.recurrenceId = reader.date(property, icalproperty_get_recurrenceid(property));
            break;
          case ICAL_DTSTART_PROPERTY:
          case ICAL_SUMMARY_PROPERTY:
            fallback += valueText(property) + "\n";
            break;
          default:
            break;
        }
      }
      std::string identifier =
          source_.identifier + (item.kind == ItemKind::Event ? "/event/" : "/task/");
      // RFC 5545 section 3.8.4.7 wants a UID in every component; for the few exporters that
      // leave it out, what the component says stands in, which stays stable while it does.
      identifier += item.uid.empty() ? "no-uid-" + hexHash(fallback) : escapedUid(item.uid);
      if (item.recurrenceId) {
        const ReadDate& rid = *item.recurrenceId;
        identifier += "/";
        if (rid.wholeDay) {
          identifier += compactDate(rid.date.fields());
        } else if (rid.date.timeZone().isLocal()) {
          identifier += compactDateTime(rid.date.fields());
        } else {
          CalendarDate utc = rid.date;
          utc.setTimeZone(TimeZone::utc());
          identifier += compactDateTime(utc.fields()) + "Z";
        }
      }
      item.identifier = std::move(identifier);
      // A component given twice (in two files of a folder, say) is read once: the later one.
      auto [it, inserted] = positions_.emplace(item.identifier, items_.size());
      if (inserted) {
        items_.push_back(std::move(item));
      } else {
        items_[it->second] = std::move(item);
      }
    }
  }

  // RFC 5545 section 3.8.4.4: a component with a RECURRENCE-ID replaces one occurrence of
  // the component with the same UID and none; the master lists it as a detached event.
  void linkOverrides() {
    std::map<std::pair<ItemKind, std::string>, std::size_t> masters;
    for (std::size_t i = 0; i < items_.size(); ++i) {
      if (!items_[i].recurrenceId && !items_[i].uid.empty()) {
        masters.emplace(std::make_pair(items_[i].kind, items_[i].uid), i);
      }
    }
    for (Item& item : items_) {
      if (!item.recurrenceId || item.kind != ItemKind::Event || item.uid.empty()) continue;
      const auto master = masters.find({item.kind, item.uid});
      if (master != masters.end()) items_[master->second].detached.push_back(item.identifier);
    }
  }

  void append(const Item& item, std::vector<Record>& records) const {
    ComponentReader reader(*item.document, *item.zones, item.component);
    ItemFields fields = readFields(reader, item.component);
    const bool event = item.kind == ItemKind::Event;
    Related related;
    if (event) relatedRecords(item, reader, fields, related);

    // The event and task attributes share their names.
    Dictionary record{{TesselRecordEntityNameKey,
                       Value(event ? TesselEntity_Calendars_Event : TesselEntity_Calendars_Task)}};
    const auto setText = [&](std::string_view key, const std::optional<std::string>& value) {
      if (value) record.set(key, Value(*value));
    };
    const auto setDate = [&](std::string_view key, const std::optional<ReadDate>& value) {
      if (value) record.set(key, Value(value->date));
    };
    setText(TesselAttribute_Calendars_Event_Summary, fields.summary);
    setText(TesselAttribute_Calendars_Event_Description, fields.description);
    if (event) setText(TesselAttribute_Calendars_Event_Location, fields.location);
    setText(TesselAttribute_Calendars_Event_Status, fields.status);
    setText(TesselAttribute_Calendars_Event_Classification, fields.classification);
    setDate(TesselAttribute_Calendars_Event_StartDate, fields.start);
    if (event) {
      setDate(TesselAttribute_Calendars_Event_EndDate, fields.end);
    } else {
      setDate(TesselAttribute_Calendars_Task_DueDate, fields.due);
      setDate(TesselAttribute_Calendars_Task_CompletionDate, fields.completed);
    }
    setDate(TesselAttribute_Calendars_Event_OriginalDate, item.recurrenceId);
    if (!fields.exceptionDates.empty()) {
      record.set(TesselAttribute_Calendars_Event_ExceptionDates,
                 Value(std::move(fields.exceptionDates)));
    }
    if (event && fields.start) {
      record.set(TesselAttribute_Calendars_Event_AllDay, Value::boolean(fields.start->wholeDay));
    }
    if (fields.priority) {
      record.set(TesselAttribute_Calendars_Event_Priority, Value::integer(*fields.priority));
    }
    if (fields.url)
      record.set(TesselAttribute_Calendars_Event_Url, Value(zt::platform::Url{*fields.url}));
    const auto setRelationship = [&](std::string_view key, const std::vector<std::string>& ids) {
      if (!ids.empty()) record.set(key, Value(relationship(ids)));
    };
    setRelationship(TesselRelationship_Calendars_Event_Recurrences, related.recurrences);
    setRelationship(TesselRelationship_Calendars_Event_AudioAlarms, related.audioAlarms);
    setRelationship(TesselRelationship_Calendars_Event_MailAlarms, related.mailAlarms);
    setRelationship(TesselRelationship_Calendars_Event_DisplayAlarms, related.displayAlarms);
    setRelationship(TesselRelationship_Calendars_Event_Organizer, related.organizer);
    setRelationship(TesselRelationship_Calendars_Event_Attendees, related.attendees);
    setRelationship(TesselRelationship_Calendars_Event_DetachedEvents, item.detached);
    record.set(TesselRelationship_Calendars_Event_Calendar,
               Value(relationship({source_.identifier})));

    records.push_back({item.identifier, std::move(record)});
    for (Record& sub : related.records) records.push_back(std::move(sub));
  }

  void relatedRecords(const Item& item, const ComponentReader& reader, const ItemFields& fields,
                      Related& related) const {
    std::size_t count = 0;
    for (icalproperty* rule : fields.rules) {
      if (auto record = recurrenceRecord(reader, rule, fields.start)) {
        std::string id = item.identifier + "#recurrence" + std::to_string(++count);
        related.recurrences.push_back(id);
        related.records.push_back({std::move(id), std::move(*record)});
      }
    }
    count = 0;
    for (icalcomponent* alarm : componentsOf(item.component, ICAL_VALARM_COMPONENT)) {
      std::optional<Dictionary> record =
          alarmRecord(*item.document, *item.zones, alarm, fields.start, fields.end);
      if (!record) continue;
      std::string id = item.identifier + "#alarm" + std::to_string(++count);
      const Value* entity = record->find(TesselRecordEntityNameKey);
      const std::string& name = *entity->asString();
      (name == TesselEntity_Calendars_AudioAlarm  ? related.audioAlarms
       : name == TesselEntity_Calendars_MailAlarm ? related.mailAlarms
                                                  : related.displayAlarms)
          .push_back(id);
      related.records.push_back({std::move(id), std::move(*record)});
    }
    if (fields.organizer != nullptr) {
      std::string id = item.identifier + "#organizer";
      related.organizer.push_back(id);
      related.records.push_back(
          {std::move(id), participantRecord(fields.organizer, TesselEntity_Calendars_Organizer)});
    }
    count = 0;
    for (icalproperty* attendee : fields.attendees) {
      std::string id = item.identifier + "#attendee" + std::to_string(++count);
      related.attendees.push_back(id);
      related.records.push_back(
          {std::move(id), participantRecord(attendee, TesselEntity_Calendars_Attendee)});
    }
  }

  const ICalCalendarSource& source_;
  std::vector<Item> items_;
  std::map<std::string, std::size_t> positions_;
};

}  // namespace

ICalCalendar readICalCalendar(const ICalCalendarSource& source) {
  return CalendarBuilder(source).build();
}

}  // namespace tessel::importers
