#include "importers/ical_calendar_reader.h"

#include <libical/ical.h>

#include <cstdint>
#include <cstdlib>
#include <map>
#include <memory>
#include <utility>

#include "importers/ical_alarm.h"
#include "importers/ical_component_reader.h"
#include "importers/ical_document.h"
#include "importers/ical_document_visitor.h"
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

// The records of the VEVENT and VTODO components of the files, each made while its file is
// read, before the calendar's identifier is known.
class FileItemsReader : public ICalDocumentVisitor {
 public:
  explicit FileItemsReader(ICalParsedFiles& parsed) : parsed_(parsed) {}

  void calendar(const ICalDocument&, icalcomponent* vcalendar, ICalTimeZones& zones) override {
    zones_ = &zones;
    ICalCalendarLabels& labels = parsed_.labels;
    for (icalproperty* property : propertiesOf(vcalendar)) {
      if (icalproperty_isa(property) != ICAL_X_PROPERTY) continue;
      const char* name = icalproperty_get_x_name(property);
      const std::string lower = name != nullptr ? lowerAscii(name) : std::string();
      std::optional<std::string>* label = lower == "x-wr-calname"    ? &labels.name
                                          : lower == "x-wr-relcalid" ? &labels.relationId
                                                                     : nullptr;
      if (label != nullptr && !*label) *label = text(icalproperty_get_x(property));
    }
  }

  // Nothing is kept until the item is read: its reading may start over (lineAt).
  void item(const ICalDocument& document, icalcomponent* component) override {
    ICalReadItem read;
    read.event = icalcomponent_isa(component) == ICAL_VEVENT_COMPONENT;
    read.source = document.source();
    const ICalDocument identifying(document, read.identifying);
    ComponentReader reader(identifying, *zones_, component);
    icalproperty* uidProperty = nullptr;
    std::optional<ReadDate> recurrenceId;
    bool unreadable = false;
    for (icalproperty* property : propertiesOf(component)) {
      switch (icalproperty_isa(property)) {
        case ICAL_UID_PROPERTY:
          if (const char* uid = icalproperty_get_uid(property); uid != nullptr && !uidProperty) {
            read.uid = uid;
            uidProperty = property;
          }
          break;
        case ICAL_RECURRENCEID_PROPERTY:
          // Which occurrence a component replaces is what it is: without it, it is dropped.
          if (recurrenceId) break;
          try {
            recurrenceId = reader.date(property, icalproperty_get_recurrenceid(property));
          } catch (const ImportError& fault) {
            read.identifying.fault(fault, "dropped " + ICalDocument::describe(component));
            unreadable = true;
          }
          break;
        default:
          break;
      }
    }
    if (unreadable) {
      parsed_.items.push_back(std::move(read));
      return;
    }
    read.overrides = recurrenceId.has_value();
    // The content of a component whose identifier another may have too, kept as a hash: the
    // component itself is gone before the other is read.
    if (read.uid.empty() || !recurrenceId) read.contentHash = contentHash(component);
    if (uidProperty != nullptr) read.uidLine = document.lineAt(uidProperty, component);
    std::string key = read.event ? "/event/" : "/task/";
    // RFC 5545 section 3.8.4.7 wants a UID in every component; for the few exporters that
    // leave it out, what the component says stands in: two that say different things stay
    // two, and the same file read again gives the same identifiers.
    key += read.uid.empty() ? "no-uid-" + read.contentHash : escapedUid(read.uid);
    if (recurrenceId) key += "/" + occurrenceKey(*recurrenceId);
    read.key = std::move(key);

    const ICalDocument reading(document, read.reading);
    try {
      records(reading, component, recurrenceId, read);
    } catch (const ImportError& fault) {
      read.reading.fault(fault, "dropped " + ICalDocument::describe(component));
      read.dropped = true;
      read.record = {};
      read.related.clear();
    }
    parsed_.items.push_back(std::move(read));
  }

 private:
  void records(const ICalDocument& document, icalcomponent* component,
               const std::optional<ReadDate>& recurrenceId, ICalReadItem& read) const {
    ComponentReader reader(document, *zones_, component);
    ItemFields fields = readFields(reader, component);
    const bool event = read.event;
    ICalReadItem related;
    if (event) relatedRecords(document, component, reader, fields, related);

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
    setDate(TesselAttribute_Calendars_Event_OriginalDate, recurrenceId);
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

    read.record = std::move(record);
    read.related = std::move(related.related);
    read.recurrences = std::move(related.recurrences);
    read.audioAlarms = std::move(related.audioAlarms);
    read.mailAlarms = std::move(related.mailAlarms);
    read.displayAlarms = std::move(related.displayAlarms);
    read.organizer = std::move(related.organizer);
    read.attendees = std::move(related.attendees);
  }

  // The sub-records, each known by what follows the identifier of its event.
  void relatedRecords(const ICalDocument& document, icalcomponent* component,
                      const ComponentReader& reader, const ItemFields& fields,
                      ICalReadItem& related) const {
    std::size_t count = 0;
    for (icalproperty* rule : fields.rules) {
      std::optional<Dictionary> record;
      try {
        record = recurrenceRecord(reader, rule, fields.start);
      } catch (const ImportError& fault) {
        reader.drop(fault, rule);
      }
      if (record) {
        std::string id = "#recurrence" + std::to_string(++count);
        related.recurrences.push_back(id);
        related.related.emplace_back(std::move(id), std::move(*record));
      }
    }
    count = 0;
    for (icalcomponent* alarm : componentsOf(component, ICAL_VALARM_COMPONENT)) {
      std::optional<Dictionary> record;
      try {
        record = alarmRecord(document, *zones_, alarm, fields.start, fields.end);
      } catch (const ImportError& fault) {
        document.warnings().fault(fault, "dropped " + ICalDocument::describe(alarm));
      }
      if (!record) continue;
      std::string id = "#alarm" + std::to_string(++count);
      const std::string& name = *record->stringAt(TesselRecordEntityNameKey);
      (name == TesselEntity_Calendars_AudioAlarm  ? related.audioAlarms
       : name == TesselEntity_Calendars_MailAlarm ? related.mailAlarms
                                                  : related.displayAlarms)
          .push_back(id);
      related.related.emplace_back(std::move(id), std::move(*record));
    }
    if (fields.organizer != nullptr) {
      std::string id = "#organizer";
      related.organizer.push_back(id);
      related.related.emplace_back(
          std::move(id), participantRecord(fields.organizer, TesselEntity_Calendars_Organizer));
    }
    count = 0;
    for (icalproperty* attendee : fields.attendees) {
      std::string id = "#attendee" + std::to_string(++count);
      related.attendees.push_back(id);
      related.related.emplace_back(std::move(id),
                                   participantRecord(attendee, TesselEntity_Calendars_Attendee));
    }
  }

  ICalParsedFiles& parsed_;
  // The zones of the calendar being read.
  ICalTimeZones* zones_ = nullptr;
};

// One item of the calendar, under its whole identifier.
struct Item {
  ICalReadItem* read;
  std::string identifier;
  // The identifiers of the overrides of a master, in file order, with whether each was
  // dropped.
  std::vector<std::pair<std::string, bool>> detached;
};

class CalendarBuilder {
 public:
  CalendarBuilder(ICalParsedFiles& files, std::string identifier, std::string title,
                  ImportWarnings& warnings)
      : files_(files),
        identifier_(std::move(identifier)),
        title_(std::move(title)),
        warnings_(warnings) {}

  // The faults of identifying every item, then those of each item becoming records, as
  // when every item was identified before any became records.
  ICalCalendar build() {
    ICalCalendar calendar;
    calendar.identifier = identifier_;
    calendar.title = title_;
    for (ICalReadItem& read : files_.items) {
      read.identifying.passOn(warnings_);
      if (read.key) add(read);
    }
    linkOverrides();

    Dictionary calendarRecord{{TesselRecordEntityNameKey, Value(TesselEntity_Calendars_Calendar)},
                              {TesselAttribute_Calendars_Calendar_Title, Value(calendar.title)}};
    calendar.records.push_back({calendar.identifier, {}});
    std::vector<std::string> events, tasks;
    for (Item& item : items_) {
      item.read->reading.passOn(warnings_);
      if (item.read->dropped) continue;
      (item.read->event ? events : tasks).push_back(item.identifier);
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
  // RFC 5545 section 3.8.4.7 makes a UID unique, yet calendars merged by hand or folders with
  // conflict copies hold the same UID twice. Both are kept, the later one as a copy known by
  // what it says, unless it says the same. Of two overrides of one occurrence the later one
  // counts.
  void add(ICalReadItem& read) {
    Item item{&read, identifier_ + *read.key, {}};
    auto known = positions_.find(item.identifier);
    if (known != positions_.end() && !read.overrides && !read.uid.empty()) {
      if (read.contentHash != items_[known->second].read->contentHash) {
        item.identifier += "/copy-" + read.contentHash;
        known = positions_.find(item.identifier);
        if (known == positions_.end()) {
          warnings_.note(read.source, read.uidLine,
                         "UID " + read.uid + " is given twice: kept as a second " +
                             (read.event ? "event" : "task"));
        }
      }
    } else if (known != positions_.end() && read.overrides && !read.uid.empty()) {
      warnings_.note(
          read.source, read.uidLine,
          "UID " + read.uid + " overrides the same occurrence twice: the later one counts");
    }
    if (known == positions_.end()) {
      positions_.emplace(item.identifier, items_.size());
      items_.push_back(std::move(item));
    } else {
      items_[known->second] = std::move(item);
    }
  }

  // RFC 5545 section 3.8.4.4: a component with a RECURRENCE-ID replaces one occurrence of
  // the component with the same UID and none; the master lists it as a detached event.
  void linkOverrides() {
    std::map<std::pair<bool, std::string>, std::size_t> masters;
    for (std::size_t i = 0; i < items_.size(); ++i) {
      const ICalReadItem& read = *items_[i].read;
      if (!read.overrides && !read.uid.empty()) {
        masters.emplace(std::make_pair(read.event, read.uid), i);
      }
    }
    for (Item& item : items_) {
      const ICalReadItem& read = *item.read;
      if (!read.overrides || !read.event || read.uid.empty()) continue;
      const auto master = masters.find({read.event, read.uid});
      if (master != masters.end()) {
        items_[master->second].detached.emplace_back(item.identifier, read.dropped);
      }
    }
  }

  void append(Item& item, std::vector<Record>& records) const {
    ICalReadItem& read = *item.read;
    Dictionary record = std::move(read.record);
    const auto setRelationship = [&](std::string_view key, const std::vector<std::string>& ids) {
      if (ids.empty()) return;
      Array array;
      for (const std::string& id : ids) array.emplace_back(item.identifier + id);
      record.set(key, Value(std::move(array)));
    };
    setRelationship(TesselRelationship_Calendars_Event_Recurrences, read.recurrences);
    setRelationship(TesselRelationship_Calendars_Event_AudioAlarms, read.audioAlarms);
    setRelationship(TesselRelationship_Calendars_Event_MailAlarms, read.mailAlarms);
    setRelationship(TesselRelationship_Calendars_Event_DisplayAlarms, read.displayAlarms);
    setRelationship(TesselRelationship_Calendars_Event_Organizer, read.organizer);
    setRelationship(TesselRelationship_Calendars_Event_Attendees, read.attendees);
    // A master does not list the overrides that were dropped.
    std::vector<std::string> kept;
    for (const auto& [id, dropped] : item.detached) {
      if (!dropped) kept.push_back(id);
    }
    if (!kept.empty()) {
      record.set(TesselRelationship_Calendars_Event_DetachedEvents, Value(relationship(kept)));
    }
    record.set(TesselRelationship_Calendars_Event_Calendar, Value(relationship({identifier_})));

    records.push_back({item.identifier, std::move(record)});
    for (auto& [suffix, sub] : read.related) {
      records.push_back({item.identifier + suffix, std::move(sub)});
    }
    read.related.clear();
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
  FileItemsReader reader(parsed);
  for (ICalFile& file : files) {
    ICalDocument::read(file.text, file.name, warnings, reader);
    std::string().swap(file.text);
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
