#include "importers/ical_calendar_reader.h"

#include <libical/ical.h>

#include <cstdint>
#include <cstdlib>
#include <map>
#include <memory>
#include <set>
#include <utility>

#include "importers/ical_alarm.h"
#include "importers/ical_component_reader.h"
#include "importers/ical_document.h"
#include "importers/ical_item_fields.h"
#include "importers/ical_participants.h"
#include "importers/ical_properties.h"
#include "importers/ical_recurrence.h"
#include "importers/ical_time_zones.h"
#include "importers/stable_hash.h"
#include "platform/ascii.h"
#include "platform/calendar_date.h"
#include "platform/value.h"
#include "tessel/schema.h"

namespace tessel::importers {

namespace {

using namespace ical;  // the pieces of the reader, in this source file only
using zt::platform::Array;
using zt::platform::CalendarDate;
using zt::platform::Dictionary;
using zt::platform::lowerAscii;
using zt::platform::TimeZone;
using zt::platform::Value;

struct FreeText {
  void operator()(char* text) const { std::free(text); }
};

// ----- identifiers: the calendar's, the component's UID and its RECURRENCE-ID ---------------

std::string compactDate(const CalendarDate::Fields& f) {
  return std::to_string(f.year) + twoDigits(f.month) + twoDigits(f.day);
}

std::string compactDateTime(const CalendarDate::Fields& f) {
  return compactDate(f) + "T" + twoDigits(f.hour) + twoDigits(f.minute) + twoDigits(f.second);
}

// The identifier of one occurrence: its date, its time on the floating wall clock, or its
// time in UTC.
std::string occurrenceKey(const ReadDate& rid) {
  if (rid.wholeDay) return compactDate(rid.date.fields());
  if (rid.date.timeZone().isLocal()) return compactDateTime(rid.date.fields());
  CalendarDate utc = rid.date;
  utc.setTimeZone(TimeZone::utc());
  return compactDateTime(utc.fields()) + "Z";
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

// What a component says, for the identity of one that has no UID of its own: every property
// and sub-component as written, but for DTSTAMP, which many writers set to the time of the
// export, and the line marks of the reader.
void appendContent(icalcomponent* component, std::string& out) {
  if (const char* kind = icalcomponent_kind_to_string(icalcomponent_isa(component))) out += kind;
  out += '\n';
  for (icalproperty* property : propertiesOf(component)) {
    const char* name = icalproperty_get_property_name(property);
    if (name == nullptr || ICalDocument::isLineMark(name)) continue;
    if (icalproperty_isa(property) == ICAL_DTSTAMP_PROPERTY) continue;
    out += name;
    for (icalparameter* parameter = icalproperty_get_first_parameter(property, ICAL_ANY_PARAMETER);
         parameter != nullptr;
         parameter = icalproperty_get_next_parameter(property, ICAL_ANY_PARAMETER)) {
      const char* xname = icalparameter_get_xname(parameter);
      if (icalparameter_isa(parameter) == ICAL_X_PARAMETER && xname != nullptr &&
          ICalDocument::isLineMark(xname)) {
        continue;
      }
      std::unique_ptr<char, FreeText> text(icalparameter_as_ical_string_r(parameter));
      out += ';';
      if (text) out += text.get();
    }
    out += ':';
    out += valueText(property);
    out += '\n';
  }
  for (icalcomponent* inner : componentsOf(component, ICAL_ANY_COMPONENT)) {
    appendContent(inner, out);
  }
}

std::string contentHash(icalcomponent* component) {
  std::string content;
  appendContent(component, content);
  return stableHash(content);
}

// ----- the calendar: its events and tasks, each followed by its sub-records ---------------

Array relationship(const std::vector<std::string>& identifiers) {
  Array array;
  for (const std::string& identifier : identifiers) array.emplace_back(identifier);
  return array;
}

enum class ItemKind { Event, Task };

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

// The sub-records of one event or task, with the relationships that list them.
struct Related {
  std::vector<Record> records;
  std::vector<std::string> recurrences, audioAlarms, mailAlarms, displayAlarms, organizer,
      attendees;
};

class CalendarBuilder {
 public:
  CalendarBuilder(ICalParsedFiles& files, std::string identifier, std::string title,
                  ImportWarnings& warnings)
      : files_(files),
        identifier_(std::move(identifier)),
        title_(std::move(title)),
        warnings_(warnings) {}

  ICalCalendar build() {
    ICalCalendar calendar;
    calendar.identifier = identifier_;
    calendar.title = title_;
    for (const ICalDocument& document : files_.documents) {
      for (icalcomponent* vcalendar : document.calendars()) collect(document, vcalendar);
    }
    linkOverrides();

    Dictionary calendarRecord{{TesselRecordEntityNameKey, Value(TesselEntity_Calendars_Calendar)},
                              {TesselAttribute_Calendars_Calendar_Title, Value(calendar.title)}};
    calendar.records.push_back({calendar.identifier, {}});
    std::vector<std::string> events, tasks;
    std::set<std::string> dropped;
    for (Item& item : items_) {
      try {
        append(item, calendar.records);
        (item.kind == ItemKind::Event ? events : tasks).push_back(item.identifier);
      } catch (const ImportError& fault) {
        warnings_.fault(fault, "dropped " + ICalDocument::describe(item.component));
        dropped.insert(item.identifier);
      }
      // What libical read of the component is not needed once it became records.
      icalcomponent_remove_component(icalcomponent_get_parent(item.component), item.component);
      icalcomponent_free(item.component);
      item.component = nullptr;
    }
    if (!dropped.empty()) forgetDetached(dropped, calendar.records);
    calendar.eventCount = events.size();
    calendar.taskCount = tasks.size();
    calendarRecord.set(TesselRelationship_Calendars_Calendar_Events, Value(relationship(events)));
    calendarRecord.set(TesselRelationship_Calendars_Calendar_Tasks, Value(relationship(tasks)));
    calendar.records.front().record = std::move(calendarRecord);
    return calendar;
  }

 private:
  void collect(const ICalDocument& document, icalcomponent* vcalendar) {
    auto zones = std::make_shared<ICalTimeZones>(vcalendar);
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
      icalproperty* uidProperty = nullptr;
      bool unreadable = false;
      for (icalproperty* property : propertiesOf(component)) {
        switch (icalproperty_isa(property)) {
          case ICAL_UID_PROPERTY:
            if (const char* uid = icalproperty_get_uid(property); uid != nullptr && !uidProperty) {
              item.uid = uid;
              uidProperty = property;
            }
            break;
          case ICAL_RECURRENCEID_PROPERTY:
            // Which occurrence a component replaces is what it is: without it, it is dropped.
            if (item.recurrenceId) break;
            try {
              item.recurrenceId = reader.date(property, icalproperty_get_recurrenceid(property));
            } catch (const ImportError& fault) {
              warnings_.fault(fault, "dropped " + ICalDocument::describe(component));
              unreadable = true;
            }
            break;
          default:
            break;
        }
      }
      if (unreadable) continue;
      std::string identifier = identifier_ + (item.kind == ItemKind::Event ? "/event/" : "/task/");
      // RFC 5545 section 3.8.4.7 wants a UID in every component; for the few exporters that
      // leave it out, what the component says stands in: two that say different things stay
      // two, and the same file read again gives the same identifiers.
      identifier += item.uid.empty() ? "no-uid-" + contentHash(component) : escapedUid(item.uid);
      if (item.recurrenceId) identifier += "/" + occurrenceKey(*item.recurrenceId);
      item.identifier = std::move(identifier);
      add(std::move(item), reader, uidProperty);
    }
  }

  // RFC 5545 section 3.8.4.7 makes a UID unique, yet calendars merged by hand or folders with
  // conflict copies hold the same UID twice. Both are kept, the later one as a copy known by
  // what it says, unless it says the same. Of two overrides of one occurrence the later one
  // counts.
  void add(Item item, const ComponentReader& reader, icalproperty* uidProperty) {
    auto known = positions_.find(item.identifier);
    if (known != positions_.end() && !item.recurrenceId && !item.uid.empty()) {
      const std::string hash = contentHash(item.component);
      if (hash != contentHash(items_[known->second].component)) {
        item.identifier += "/copy-" + hash;
        known = positions_.find(item.identifier);
        if (known == positions_.end()) {
          reader.warn(uidProperty, "UID " + item.uid + " is given twice: kept as a second " +
                                       (item.kind == ItemKind::Event ? "event" : "task"));
        }
      }
    } else if (known != positions_.end() && item.recurrenceId && !item.uid.empty()) {
      reader.warn(uidProperty,
                  "UID " + item.uid + " overrides the same occurrence twice: the later one counts");
    }
    if (known == positions_.end()) {
      positions_.emplace(item.identifier, items_.size());
      items_.push_back(std::move(item));
    } else {
      items_[known->second] = std::move(item);
    }
  }

  // A master does not list the overrides that were dropped.
  static void forgetDetached(const std::set<std::string>& dropped, std::vector<Record>& records) {
    for (Record& record : records) {
      const Value* detached = record.record.find(TesselRelationship_Calendars_Event_DetachedEvents);
      if (detached == nullptr) continue;
      std::vector<std::string> kept;
      for (std::string& id : zt::platform::stringsIn(detached)) {
        if (dropped.count(id) == 0) kept.push_back(std::move(id));
      }
      if (kept.empty()) {
        record.record.erase(TesselRelationship_Calendars_Event_DetachedEvents);
      } else {
        record.record.set(TesselRelationship_Calendars_Event_DetachedEvents,
                          Value(relationship(kept)));
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
    record.set(TesselRelationship_Calendars_Event_Calendar, Value(relationship({identifier_})));

    records.push_back({item.identifier, std::move(record)});
    for (Record& sub : related.records) records.push_back(std::move(sub));
  }

  void relatedRecords(const Item& item, const ComponentReader& reader, const ItemFields& fields,
                      Related& related) const {
    std::size_t count = 0;
    for (icalproperty* rule : fields.rules) {
      std::optional<Dictionary> record;
      try {
        record = recurrenceRecord(reader, rule, fields.start);
      } catch (const ImportError& fault) {
        reader.drop(fault, rule);
      }
      if (record) {
        std::string id = item.identifier + "#recurrence" + std::to_string(++count);
        related.recurrences.push_back(id);
        related.records.push_back({std::move(id), std::move(*record)});
      }
    }
    count = 0;
    for (icalcomponent* alarm : componentsOf(item.component, ICAL_VALARM_COMPONENT)) {
      std::optional<Dictionary> record;
      try {
        record = alarmRecord(*item.document, *item.zones, alarm, fields.start, fields.end);
      } catch (const ImportError& fault) {
        warnings_.fault(fault, "dropped " + ICalDocument::describe(alarm));
      }
      if (!record) continue;
      std::string id = item.identifier + "#alarm" + std::to_string(++count);
      const std::string& name = *record->stringAt(TesselRecordEntityNameKey);
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

  ICalParsedFiles& files_;
  std::string identifier_;
  std::string title_;
  ImportWarnings& warnings_;
  std::vector<Item> items_;
  std::map<std::string, std::size_t> positions_;
};

}  // namespace

ICalParsedFiles parseICalFiles(std::vector<ICalFile> files, ImportWarnings& warnings) {
  ICalParsedFiles parsed;
  parsed.documents.reserve(files.size());
  for (ICalFile& file : files) {
    parsed.documents.push_back(ICalDocument::parse(file.text, file.name, warnings));
    std::string().swap(file.text);  // libical holds what is needed of it
    for (icalcomponent* vcalendar : parsed.documents.back().calendars()) {
      for (icalproperty* property : propertiesOf(vcalendar)) {
        if (icalproperty_isa(property) != ICAL_X_PROPERTY) continue;
        const char* name = icalproperty_get_x_name(property);
        const std::string lower = name != nullptr ? lowerAscii(name) : std::string();
        std::optional<std::string>* label = lower == "x-wr-calname"    ? &parsed.labels.name
                                            : lower == "x-wr-relcalid" ? &parsed.labels.relationId
                                                                       : nullptr;
        if (label != nullptr && !*label) *label = text(icalproperty_get_x(property));
      }
    }
  }
  return parsed;
}

ICalCalendar readICalCalendar(ICalParsedFiles files, std::string identifier, std::string title,
                              ImportWarnings& warnings) {
  return CalendarBuilder(files, std::move(identifier), std::move(title), warnings).build();
}

ICalCalendar readICalCalendar(ICalCalendarSource source, ImportWarnings& warnings) {
  ICalParsedFiles files = parseICalFiles(std::move(source.files), warnings);
  std::string title = source.title        ? *source.title
                      : files.labels.name ? *files.labels.name
                                          : source.fallbackTitle;
  return readICalCalendar(std::move(files), std::move(source.identifier), std::move(title),
                          warnings);
}

ICalCalendar readICalCalendar(ICalCalendarSource source) {
  ImportWarnings strict(OnFault::Refuse);
  return readICalCalendar(std::move(source), strict);
}

}  // namespace tessel::importers
