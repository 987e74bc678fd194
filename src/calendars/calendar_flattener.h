#pragma once

// The flattening of one calendar: its records in the engine's truth become the one nested
// record that the exporter reads (title, order, and arrays of events and tasks whose related
// records are copied in as arrays of small records). Only listed keys travel; values are
// never converted.

#include <cstddef>
#include <optional>
#include <set>
#include <span>
#include <string>
#include <string_view>

#include "platform/value.h"
#include "tessel/record.h"
#include "tessel/snapshot.h"

namespace zt::calendars {

// The keys that one kind of record keeps, in copying order.
using KeyList = std::span<const std::string_view>;

class CalendarFlattener {
 public:
  // The snapshot answers every record lookup; it must outlive the flattener.
  explicit CalendarFlattener(const tessel::Snapshot& snapshot) : snapshot_(snapshot) {}

  // The flattened record of a calendar record with this title, at this zero-based position
  // in the device's calendar list. All the calendar's events and tasks are fetched in one
  // request. None when a record cannot be appended (which does not happen today).
  std::optional<platform::Dictionary> flattenCalendar(const platform::Dictionary& calendar,
                                                      const std::string& title,
                                                      std::size_t order) const;

  // Stores under `icalKey` an array of the records of `identifiers`, each reduced to
  // `filteredKeys`, in the order the snapshot yields them; unknown identifiers are skipped.
  // Nothing is stored for an empty list. Always true.
  bool appendCalSubEntities(const platform::Array& identifiers, KeyList filteredKeys,
                            std::string_view icalKey, platform::Dictionary& filteredRecord) const;

  // Flattens one event or task of the calendar into the matching array; an array that is
  // absent (the calendar has no such relationship) drops the record. `allEntities` holds all
  // of the calendar's events and tasks, where detached occurrences are looked up. Records of
  // other entities are logged and skipped. False only when a related-record step fails.
  bool appendCalEntity(const platform::Dictionary& record, platform::Array* eventArray,
                       platform::Array* taskArray, const tessel::RecordMap& allEntities) const;

  // What the last flattenCalendar read besides the calendar record: whether an identifier it
  // looked up named no record of the snapshot, and the entity names of the records it found.
  // Its result depends on those records alone only when none was missing.
  bool missedRecord() const { return reads_.missed; }
  const std::set<std::string>& entitiesRead() const { return reads_.entities; }

  // "1l" for the first calendar: the number followed by a letter l, which devices expect in
  // X-WR-CALORDER.
  static std::string orderString(std::size_t order);

  // The key lists, in their stored order. The event list names the exception dates twice
  // and keysForExDates holds the attendee names; both stay as they are: copying is by key,
  // so the repeated entry changes nothing, and nothing reads keysForExDates.
  static KeyList eventFilteredKeys();
  static KeyList taskFilteredKeys();
  static KeyList keysForRecurrence();
  static KeyList keysForAudioAlarm();
  static KeyList keysForMailAlarm();
  static KeyList keysForDisplayAlarm();
  static KeyList keysForOrganizer();
  static KeyList keysForAttendee();
  static KeyList keysForExDates();

 private:
  struct Reads {
    bool missed = false;
    std::set<std::string> entities;
    // Notes what a lookup of `requested` distinct identifiers found.
    void note(std::size_t requested, const tessel::RecordMap& found);
  };

  const tessel::Snapshot& snapshot_;
  mutable Reads reads_;
};

}  // namespace zt::calendars
