#include "calendars/calendar_flattener.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <functional>
#include <utility>
#include <vector>

#include "calendars/record_description.h"
#include "platform/log.h"
#include "tessel/schema.h"

namespace zt::calendars {

using platform::Array;
using platform::Dictionary;
using platform::Log;
using platform::Value;
using namespace tessel;  // the schema's names, which carry their own prefixes

namespace {

constexpr std::array kEventFilteredKeys{
    TesselAttribute_Calendars_Event_Summary,        TesselAttribute_Calendars_Event_StartDate,
    TesselAttribute_Calendars_Event_EndDate,        TesselAttribute_Calendars_Event_AllDay,
    TesselAttribute_Calendars_Event_OriginalDate,   TesselAttribute_Calendars_Event_Url,
    TesselAttribute_Calendars_Event_Description,    TesselAttribute_Calendars_Event_Location,
    TesselAttribute_Calendars_Event_ExceptionDates, TesselAttribute_Calendars_Event_Classification,
    TesselAttribute_Calendars_Event_Priority,       TesselAttribute_Calendars_Event_Status,
    TesselAttribute_Calendars_Event_ExceptionDates,
};

constexpr std::array kTaskFilteredKeys{
    TesselAttribute_Calendars_Task_OriginalDate,
    TesselAttribute_Calendars_Task_Summary,
    TesselAttribute_Calendars_Task_Url,
    TesselAttribute_Calendars_Task_Description,
    TesselAttribute_Calendars_Task_CompletionDate,
    TesselAttribute_Calendars_Task_StartDate,
    TesselAttribute_Calendars_Task_DueDate,
    TesselAttribute_Calendars_Task_Status,
    TesselAttribute_Calendars_Task_ExceptionDates,
    TesselAttribute_Calendars_Task_Priority,
    TesselAttribute_Calendars_Task_Classification,
};

constexpr std::array kKeysForRecurrence{
    TesselAttribute_Calendars_Recurrence_Frequency,
    TesselAttribute_Calendars_Recurrence_Until,
    TesselAttribute_Calendars_Recurrence_Count,
    TesselAttribute_Calendars_Recurrence_Interval,
    TesselAttribute_Calendars_Recurrence_Bymonth,
    TesselAttribute_Calendars_Recurrence_Byweeknumber,
    TesselAttribute_Calendars_Recurrence_Byyearday,
    TesselAttribute_Calendars_Recurrence_Bymonthday,
    TesselAttribute_Calendars_Recurrence_Bydayfreq,
    TesselAttribute_Calendars_Recurrence_Bydaydays,
    TesselAttribute_Calendars_Recurrence_Bysetpos,
    TesselAttribute_Calendars_Recurrence_Weekstartday,
};

constexpr std::array kKeysForAudioAlarm{
    TesselAttribute_Calendars_AudioAlarm_Triggerdate,
    TesselAttribute_Calendars_AudioAlarm_Triggerduration,
    TesselAttribute_Calendars_AudioAlarm_RepeatCount,
    TesselAttribute_Calendars_AudioAlarm_RepeatInterval,
    TesselAttribute_Calendars_AudioAlarm_Description,
    TesselAttribute_Calendars_AudioAlarm_Summary,
};

constexpr std::array kKeysForMailAlarm{
    TesselAttribute_Calendars_MailAlarm_Triggerdate,
    TesselAttribute_Calendars_MailAlarm_Triggerduration,
    TesselAttribute_Calendars_MailAlarm_RepeatCount,
    TesselAttribute_Calendars_MailAlarm_RepeatInterval,
    TesselAttribute_Calendars_MailAlarm_Description,
    TesselAttribute_Calendars_MailAlarm_Summary,
    TesselAttribute_Calendars_MailAlarm_Recipients,
};

constexpr std::array kKeysForDisplayAlarm{
    TesselAttribute_Calendars_DisplayAlarm_Triggerdate,
    TesselAttribute_Calendars_DisplayAlarm_Triggerduration,
    TesselAttribute_Calendars_DisplayAlarm_RepeatCount,
    TesselAttribute_Calendars_DisplayAlarm_RepeatInterval,
    TesselAttribute_Calendars_DisplayAlarm_Description,
};

constexpr std::array kKeysForOrganizer{
    TesselAttribute_Calendars_Organizer_DirectoryEntry,
    TesselAttribute_Calendars_Organizer_CommonName,
    TesselAttribute_Calendars_Organizer_Email,
};

constexpr std::array kKeysForAttendee{
    TesselAttribute_Calendars_Attendee_DirectoryEntry,
    TesselAttribute_Calendars_Attendee_CommonName,
    TesselAttribute_Calendars_Attendee_Email,
    TesselAttribute_Calendars_Attendee_UserType,
    TesselAttribute_Calendars_Attendee_Role,
    TesselAttribute_Calendars_Attendee_Status,
    TesselAttribute_Calendars_Attendee_Rsvp,
    TesselAttribute_Calendars_Attendee_Delegatedto,
    TesselAttribute_Calendars_Attendee_Delegatedfrom,
};

// A list of its own, although it holds the attendee names.
constexpr std::array kKeysForExDates = kKeysForAttendee;

// An event's related records, in the order they are copied in.
struct SubEntity {
  std::string_view relationship;
  KeyList keys;
  std::string_view icalKey;
};

const std::array<SubEntity, 6>& subEntities() {
  static const std::array<SubEntity, 6> table{{
      {TesselRelationship_Calendars_Event_Recurrences, kKeysForRecurrence,
       TesselEntity_Calendars_Recurrence},
      {TesselRelationship_Calendars_Event_AudioAlarms, kKeysForAudioAlarm,
       TesselEntity_Calendars_AudioAlarm},
      {TesselRelationship_Calendars_Event_MailAlarms, kKeysForMailAlarm,
       TesselEntity_Calendars_MailAlarm},
      {TesselRelationship_Calendars_Event_DisplayAlarms, kKeysForDisplayAlarm,
       TesselEntity_Calendars_DisplayAlarm},
      {TesselRelationship_Calendars_Event_Organizer, kKeysForOrganizer,
       TesselEntity_Calendars_Organizer},
      {TesselRelationship_Calendars_Event_Attendees, kKeysForAttendee,
       TesselEntity_Calendars_Attendee},
  }};
  return table;
}

// Copies the values of the listed keys that the source has, and nothing else.
void copyKeys(const Dictionary& source, Dictionary& destination, KeyList keys) {
  for (std::string_view key : keys) {
    if (const Value* value = source.find(key)) destination.set(key, *value);
  }
}

// As copyKeys, moving the values out of a record that is read no further, except the
// original date, which the detached-occurrence lookup still reads. A key listed twice was
// taken at its first listing, which copying would have written again unchanged.
void takeKeys(Dictionary& source, Dictionary& destination, KeyList keys) {
  for (std::size_t i = 0; i < keys.size(); ++i) {
    const std::string_view key = keys[i];
    Value* value = source.find(key);
    if (!value) continue;
    if (std::find(keys.begin(), keys.begin() + static_cast<std::ptrdiff_t>(i), key) !=
        keys.begin() + static_cast<std::ptrdiff_t>(i)) {
      continue;
    }
    if (key == TesselAttribute_Calendars_Event_OriginalDate) {
      destination.set(key, *value);
    } else {
      destination.set(key, std::move(*value));
    }
  }
}
void takeKeys(const Dictionary& source, Dictionary& destination, KeyList keys) {
  copyKeys(source, destination, keys);
}

// The identifiers of one relationship as a fetch of them yields their records: in
// identifier order (tessel::RecordMap is a std::map), each once.
std::vector<std::string_view> fetchOrder(const Array& identifiers) {
  std::vector<std::string_view> ids;
  ids.reserve(identifiers.size());
  for (const Value& element : identifiers) {
    if (const std::string* text = element.asString()) ids.emplace_back(*text);
  }
  std::sort(ids.begin(), ids.end());
  ids.erase(std::unique(ids.begin(), ids.end()), ids.end());
  return ids;
}

bool isEvent(const Dictionary& record) {
  const std::string* entity = record.stringAt(TesselRecordEntityNameKey);
  return entity && *entity == TesselEntity_Calendars_Event;
}

// The related records of all of a calendar's events, fetched in one request and handed out
// to the events that name them. A record named by one event only is moved out and released.
class SubRecords {
 public:
  SubRecords(const tessel::Snapshot& snapshot, const tessel::RecordMap& entities,
             const std::function<void(std::size_t, const tessel::RecordMap&)>& note) {
    std::vector<std::string_view> all;
    for (const auto& [identifier, record] : entities) {
      if (!isEvent(record)) continue;
      for (const SubEntity& sub : subEntities()) {
        const Value* relationship = record.find(sub.relationship);
        const Array* identifiers = relationship ? relationship->asArray() : nullptr;
        if (!identifiers || identifiers->empty()) continue;
        std::vector<std::string_view> ids = fetchOrder(*identifiers);
        all.insert(all.end(), ids.begin(), ids.end());
      }
    }
    if (all.empty()) return;
    std::sort(all.begin(), all.end());
    std::vector<std::string> unique;
    unique.reserve(all.size());
    for (std::size_t i = 0; i < all.size(); ++i) {
      if (i > 0 && all[i] == all[i - 1]) {
        if (shared_.empty() || shared_.back() != all[i]) shared_.emplace_back(all[i]);
        continue;
      }
      unique.emplace_back(all[i]);
    }
    records_ = snapshot.recordsWithIdentifiers(unique);
    note(unique.size(), records_);
  }

  // What CalendarFlattener::appendCalSubEntities stores for these identifiers.
  void append(const Array& identifiers, KeyList keys, std::string_view icalKey, Dictionary& event) {
    if (identifiers.empty()) return;
    const std::vector<std::string_view> ids = fetchOrder(identifiers);
    Array flattened;
    flattened.reserve(ids.size());
    for (std::string_view id : ids) {
      auto found = records_.find(id);
      if (found == records_.end()) continue;
      Dictionary subRecord;
      if (std::binary_search(shared_.begin(), shared_.end(), id)) {
        copyKeys(found->second, subRecord, keys);
      } else {
        // Named by this event alone: taken, and the rest of the record released at once.
        takeKeys(found->second, subRecord, keys);
        records_.erase(found);
      }
      flattened.emplace_back(std::move(subRecord));
    }
    event.set(icalKey, std::move(flattened));
  }

 private:
  tessel::RecordMap records_;
  // Identifiers named more than once, sorted.
  std::vector<std::string_view> shared_;
};

const Array& emptyArray() {
  static const Array empty;
  return empty;
}

// One event or task of the calendar into the matching array (see appendCalEntity). `record`
// is copied from when const and moved from otherwise; `appendSubEntities` stores one
// relationship's records into the event.
template <typename Record, typename AppendSubEntities>
bool flattenEntity(Record& record, Array* eventArray, Array* taskArray,
                   const tessel::RecordMap& allEntities, AppendSubEntities&& appendSubEntities) {
  const std::string* entity = record.stringAt(TesselRecordEntityNameKey);
  if (!entity) {
    Log::debug("No entity type for calendar record:\n%@", RecordDescription{record});
    return true;
  }

  if (*entity == TesselEntity_Calendars_Event) {
    Dictionary event;
    takeKeys(record, event, kEventFilteredKeys);
    for (const SubEntity& sub : subEntities()) {
      const Value* relationship = record.find(sub.relationship);
      if (!relationship) continue;
      const Array* identifiers = relationship->asArray();
      if (!appendSubEntities(identifiers ? *identifiers : emptyArray(), sub.keys, sub.icalKey,
                             event)) {
        return false;
      }
    }

    const Value* detached = record.find(TesselRelationship_Calendars_Event_DetachedEvents);
    const Array* detachedIDs = detached ? detached->asArray() : nullptr;
    if (detachedIDs && std::any_of(detachedIDs->begin(), detachedIDs->end(),
                                   [](const Value& id) { return id.asString() != nullptr; })) {
      // A detached occurrence replaces one instance of the rule, so the rule must skip it.
      Array exceptionDates;
      if (Value* dates = event.find(TesselAttribute_Calendars_Event_ExceptionDates)) {
        if (Array* array = dates->asArray()) exceptionDates = std::move(*array);
      }
      for (const Value& element : *detachedIDs) {
        const std::string* identifier = element.asString();
        if (!identifier) continue;
        auto occurrence = allEntities.find(*identifier);
        if (occurrence == allEntities.end()) continue;
        if (const Value* date =
                occurrence->second.find(TesselAttribute_Calendars_Event_OriginalDate)) {
          exceptionDates.push_back(*date);
        }
      }
      event.set(TesselAttribute_Calendars_Event_ExceptionDates, std::move(exceptionDates));
    }

    if (eventArray) eventArray->emplace_back(std::move(event));
    return true;
  }

  if (*entity == TesselEntity_Calendars_Task) {
    Dictionary task;
    takeKeys(record, task, kTaskFilteredKeys);
    if (taskArray) taskArray->emplace_back(std::move(task));
    return true;
  }

  Log::debug("Unkown calendar entity type:\n%@", RecordDescription{record});
  return true;
}

}  // namespace

KeyList CalendarFlattener::eventFilteredKeys() {
  return kEventFilteredKeys;
}
KeyList CalendarFlattener::taskFilteredKeys() {
  return kTaskFilteredKeys;
}
KeyList CalendarFlattener::keysForRecurrence() {
  return kKeysForRecurrence;
}
KeyList CalendarFlattener::keysForAudioAlarm() {
  return kKeysForAudioAlarm;
}
KeyList CalendarFlattener::keysForMailAlarm() {
  return kKeysForMailAlarm;
}
KeyList CalendarFlattener::keysForDisplayAlarm() {
  return kKeysForDisplayAlarm;
}
KeyList CalendarFlattener::keysForOrganizer() {
  return kKeysForOrganizer;
}
KeyList CalendarFlattener::keysForAttendee() {
  return kKeysForAttendee;
}
KeyList CalendarFlattener::keysForExDates() {
  return kKeysForExDates;
}

std::string CalendarFlattener::orderString(std::size_t order) {
  return std::to_string(order + 1) + "l";
}

bool CalendarFlattener::appendCalSubEntities(const Array& identifiers, KeyList filteredKeys,
                                             std::string_view icalKey,
                                             Dictionary& filteredRecord) const {
  if (identifiers.empty()) return true;
  // The key is there even when none of the records can be found.
  filteredRecord.set(icalKey, Array{});
  tessel::RecordMap records = snapshot_.recordsWithIdentifiers(platform::stringsIn(identifiers));
  Array flattened;
  flattened.reserve(records.size());
  for (const auto& [identifier, record] : records) {
    Dictionary subRecord;
    copyKeys(record, subRecord, filteredKeys);
    flattened.emplace_back(std::move(subRecord));
  }
  filteredRecord.set(icalKey, std::move(flattened));
  return true;
}

bool CalendarFlattener::appendCalEntity(const Dictionary& record, Array* eventArray,
                                        Array* taskArray,
                                        const tessel::RecordMap& allEntities) const {
  return flattenEntity(
      record, eventArray, taskArray, allEntities,
      [this](const Array& identifiers, KeyList keys, std::string_view icalKey, Dictionary& event) {
        return appendCalSubEntities(identifiers, keys, icalKey, event);
      });
}

void CalendarFlattener::Reads::note(std::size_t requested, const tessel::RecordMap& found) {
  if (found.size() != requested) missed = true;
  for (const auto& [identifier, record] : found) {
    const std::string* entity = record.stringAt(TesselRecordEntityNameKey);
    if (!entity) {
      missed = true;
      continue;
    }
    if (!entities.contains(*entity)) entities.insert(*entity);
  }
}

std::optional<Dictionary> CalendarFlattener::flattenCalendar(const Dictionary& calendar,
                                                             const std::string& title,
                                                             std::size_t order) const {
  reads_ = Reads{};
  Dictionary flattened;
  flattened.set(TesselAttribute_Calendars_Calendar_Title, title);
  flattened.set(TesselEntity_Calendars_CalendarOrder, orderString(order));

  const Value* eventsValue = calendar.find(TesselRelationship_Calendars_Calendar_Events);
  const Value* tasksValue = calendar.find(TesselRelationship_Calendars_Calendar_Tasks);
  std::optional<Array> events;
  std::optional<Array> tasks;
  std::vector<std::string> members;
  if (eventsValue) {
    members = platform::stringsIn(eventsValue);
    events.emplace();
  }
  if (tasksValue) {
    std::vector<std::string> taskIDs = platform::stringsIn(tasksValue);
    members.insert(members.end(), std::make_move_iterator(taskIDs.begin()),
                   std::make_move_iterator(taskIDs.end()));
    tasks.emplace();
  }

  if (eventsValue || tasksValue) {
    // One request for the whole calendar; the same map answers the detached occurrences.
    tessel::RecordMap allEntities = snapshot_.recordsWithIdentifiers(members);
    std::sort(members.begin(), members.end());
    reads_.note(
        static_cast<std::size_t>(std::unique(members.begin(), members.end()) - members.begin()),
        allEntities);
    members = {};
    // And one request for all the records the events relate to.
    SubRecords subRecords(snapshot_, allEntities,
                          [this](std::size_t requested, const tessel::RecordMap& found) {
                            reads_.note(requested, found);
                          });
    auto appendSubEntities = [&subRecords](const Array& identifiers, KeyList keys,
                                           std::string_view icalKey, Dictionary& event) {
      subRecords.append(identifiers, keys, icalKey, event);
      return true;
    };
    if (events) events->reserve(allEntities.size());
    // The records are read no further than their own turn, so their values are moved.
    for (auto& [identifier, record] : allEntities) {
      if (!flattenEntity(record, events ? &*events : nullptr, tasks ? &*tasks : nullptr,
                         allEntities, appendSubEntities)) {
        return std::nullopt;
      }
    }
  }

  if (events) flattened.set(TesselEntity_Calendars_Event, std::move(*events));
  if (tasks) flattened.set(TesselEntity_Calendars_Task, std::move(*tasks));
  return flattened;
}

}  // namespace zt::calendars
