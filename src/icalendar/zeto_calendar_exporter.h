#pragma once

// The calendar exporter: one flattened calendar record (title, order, events, tasks, with
// their recurrence, alarm, organizer and attendee sub-records) becomes the whole text of one
// iCalendar (RFC 2445) file. It only writes; it never reads iCalendar text.

#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/value.h"

namespace zt::icalendar {

class ZetoCalendarExporter {
 public:
  // Replaces the buffer's contents with the calendar's iCalendar text in UTF-8, without a
  // byte-order mark. Throws std::out_of_range when an event's organizer is an empty array;
  // the buffer is then left as it was.
  static void setupData(std::vector<std::uint8_t>& buffer, const platform::Dictionary& record);

  ZetoCalendarExporter();

  // The whole document: header, VTIMEZONE blocks, one VEVENT per event and one VTODO per
  // task, in the arrays' order.
  std::string calendarFromRecords(const platform::Dictionary& record) const;

  // Names of the zones of start, completion, due, original and end dates that need a
  // VTIMEZONE block, without duplicates, in order of first use.
  std::vector<std::string> timeZoneIdentifiersInCalendar(const platform::Dictionary& record) const;

  // One component named `entity` ("VEVENT" or "VTODO"), properties in the record's key order.
  void appendCalendarRepresentationTo(std::string& out, const platform::Dictionary& record,
                                      std::string_view entity) const;

  // The complete lines, CR LF ended, that one key of an event or task gives; absent when the
  // key gives nothing or the value is absent.
  std::optional<std::string> propertyForKey(std::string_view key, std::string_view entity,
                                            const platform::Value* value) const;

  // The property name of a directly mapped key ("start date" gives DTSTART). The entity is
  // not consulted: events and tasks share the table.
  std::optional<std::string_view> mappingForSyncKey(std::string_view key,
                                                    std::optional<std::string_view> entity) const;
  bool isDirectMapping(std::string_view key) const;

  // A VALARM component. Every alarm kind becomes a display alarm, the only kind the device
  // shows.
  std::string alarmForRecord(const platform::Dictionary& alarm) const;
  // ";CN=...;PARTSTAT=...:<email>" for ATTENDEE and ORGANIZER; absent without an email.
  std::optional<std::string> addressForRecord(const platform::Dictionary& address) const;
  // The rule text after "RRULE:": FREQ first, BYDAY last, other parts in the record's order.
  std::optional<std::string> recurrenceRuleForRecord(const platform::Dictionary& rule) const;
  // One EXDATE line per date.
  std::string lineForExceptionDates(const platform::Array& dates) const;
  // "STATUS:" and the word upper-cased; absent for an empty word, "none" or a non-string.
  std::optional<std::string> lineForStatus(const platform::Value* value) const;

  // A hook to stop at in a debugger; does nothing.
  void debugMark() const {}

 private:
  // propertyForKey, appending to `out`; false when the key gives nothing.
  bool appendPropertyForKey(std::string& out, std::string_view key, std::string_view entity,
                            const platform::Value* value) const;
  // The writers of the kinds of keys appendPropertyForKey tells apart.
  void appendMappedProperty(std::string& out, std::string_view property,
                            const platform::Value& value) const;
  bool appendOrganizer(std::string& out, const platform::Value& value) const;
  void appendAttendees(std::string& out, const platform::Array& attendees) const;
  bool appendRecurrence(std::string& out, const platform::Array& rules) const;
  void appendAlarm(std::string& out, const platform::Dictionary& alarm) const;
  // name, addressForRecord's text and CR LF, folded; false (and nothing written) without
  // an email.
  bool appendAddressLine(std::string& out, std::string_view name,
                         const platform::Dictionary& address) const;
  // recurrenceRuleForRecord's text, appended.
  void appendRecurrenceRule(std::string& out, const platform::Dictionary& rule) const;
  void appendExceptionDates(std::string& out, const platform::Array& dates) const;
  bool appendStatus(std::string& out, const platform::Value* value) const;

  // Record key to property name, for the keys that map one to one onto a property.
  std::map<std::string, std::string, std::less<>> _keyMapping;
  // The keys of _keyMapping.
  std::vector<std::string> _directMapping;
};

}  // namespace zt::icalendar
