#include "icalendar/zeto_calendar_exporter.h"

#include <algorithm>
#include <initializer_list>
#include <stdexcept>
#include <utility>

#include "icalendar/calendar_sync_extension.h"
#include "icalendar/icalendar_export.h"
#include "icalendar/zeto_calendar_export.h"
#include "platform/ascii.h"
#include "platform/calendar_date.h"
#include "platform/log.h"
#include "platform/time_zone.h"
#include "tessel/schema.h"

namespace zt::icalendar {

namespace {

using platform::Array;
using platform::CalendarDate;
using platform::Dictionary;
using platform::Value;

bool isAnyOf(std::string_view key, std::initializer_list<std::string_view> names) {
  return std::find(names.begin(), names.end(), key) != names.end();
}

bool isAlarmKey(std::string_view key) {
  return isAnyOf(
      key, {tessel::TesselEntity_Calendars_AudioAlarm, tessel::TesselEntity_Calendars_DisplayAlarm,
            tessel::TesselEntity_Calendars_MailAlarm});
}

bool isExceptionDatesKey(std::string_view key) {
  return isAnyOf(key, {tessel::TesselAttribute_Calendars_Event_ExceptionDates,
                       tessel::TesselAttribute_Calendars_Task_ExceptionDates});
}

bool isStatusKey(std::string_view key) {
  return isAnyOf(key, {tessel::TesselAttribute_Calendars_Event_Status,
                       tessel::TesselAttribute_Calendars_Task_Status});
}

// Folds the line that starts at `start` of `out` (RFC 2445 section 4.1, at the device's
// limit). Most lines are short and are never copied.
void foldFrom(std::string& out, std::size_t start) {
  foldRFC2445From(out, start);
}

// Title and order are written as they stand.
void appendPlainText(std::string& out, const Value& value) {
  if (const std::string* text = value.asString()) {
    out += *text;
  } else {
    out += value.description();
  }
}

// Elements that are not records give what an empty record gives.
const Dictionary& recordOrEmpty(const Value& value) {
  static const Dictionary empty;
  const Dictionary* record = value.asDictionary();
  return record ? *record : empty;
}

const Array* nonEmptyArray(const Value& value) {
  const Array* array = value.asArray();
  return array && !array->empty() ? array : nullptr;
}

}  // namespace

void ZetoCalendarExporter::setupData(std::vector<std::uint8_t>& buffer, const Dictionary& record) {
  const ZetoCalendarExporter exporter;
  std::string text = exporter.calendarFromRecords(record);
  // One block copy of the bytes; the text goes at once.
  const auto* bytes = reinterpret_cast<const std::uint8_t*>(text.data());
  buffer.assign(bytes, bytes + text.size());
}

ZetoCalendarExporter::ZetoCalendarExporter()
    : _keyMapping{
          {std::string(tessel::TesselAttribute_Calendars_Event_Summary), "SUMMARY"},
          {"uid", "UID"},
          {std::string(tessel::TesselAttribute_Calendars_Event_StartDate), "DTSTART"},
          {std::string(tessel::TesselAttribute_Calendars_Task_CompletionDate), "COMPLETED"},
          {std::string(tessel::TesselAttribute_Calendars_Task_DueDate), "DUE"},
          {std::string(tessel::TesselAttribute_Calendars_Event_OriginalDate), "RECURRENCE-ID"},
          {std::string(tessel::TesselAttribute_Calendars_Event_EndDate), "DTEND"},
          {std::string(tessel::TesselAttribute_Calendars_Event_Location), "LOCATION"},
          {std::string(tessel::TesselAttribute_Calendars_Event_Description), "DESCRIPTION"},
          {std::string(tessel::TesselAttribute_Calendars_Event_Priority), "PRIORITY"},
          {std::string(tessel::TesselAttribute_Calendars_Event_Url), "URL"},
      } {
  _directMapping.reserve(_keyMapping.size());
  for (const auto& [key, property] : _keyMapping) _directMapping.push_back(key);
}

std::string ZetoCalendarExporter::calendarFromRecords(const Dictionary& record) const {
  const Array* eventArray = record.arrayAt(tessel::TesselEntity_Calendars_Event);
  const Array* taskArray = record.arrayAt(tessel::TesselEntity_Calendars_Task);

  std::string out;
  out.reserve(1024 +
              512 * ((eventArray ? eventArray->size() : 0) + (taskArray ? taskArray->size() : 0)));
  appendRFC2445ComponentStart(out, "VCALENDAR");
  out +=
      "VERSION:2.0\r\n"
      "CALSCALE:GREGORIAN\r\n"
      "PRODID:-//Kestro Computer\\, Inc//Tessel 2.0//EN\r\n";

  out += "X-WR-CALNAME:";
  if (const Value* title = record.find(tessel::TesselAttribute_Calendars_Calendar_Title)) {
    appendPlainText(out, *title);
  } else {
    out += "Calendar";
  }
  out += "\r\n";
  if (const Value* order = record.find(tessel::TesselEntity_Calendars_CalendarOrder)) {
    out += "X-WR-CALORDER:";
    appendPlainText(out, *order);
    out += "\r\n";
  }

  for (const std::string& name : timeZoneIdentifiersInCalendar(record)) {
    if (std::optional<platform::TimeZone> zone = platform::TimeZone::named(name)) {
      icalendar::appendCalendarRepresentationTo(*zone, out);
    }
  }

  if (eventArray) {
    for (const Value& event : *eventArray) {
      if (const Dictionary* fields = event.asDictionary()) {
        appendCalendarRepresentationTo(out, *fields, "VEVENT");
      }
    }
  }
  if (taskArray) {
    for (const Value& task : *taskArray) {
      if (const Dictionary* fields = task.asDictionary()) {
        appendCalendarRepresentationTo(out, *fields, "VTODO");
      }
    }
  }
  appendRFC2445ComponentEnd(out, "VCALENDAR");
  return out;
}

std::vector<std::string> ZetoCalendarExporter::timeZoneIdentifiersInCalendar(
    const Dictionary& record) const {
  static constexpr std::string_view kDateKeys[] = {
      tessel::TesselAttribute_Calendars_Event_StartDate,
      tessel::TesselAttribute_Calendars_Task_CompletionDate,
      tessel::TesselAttribute_Calendars_Task_DueDate,
      tessel::TesselAttribute_Calendars_Event_OriginalDate,
      tessel::TesselAttribute_Calendars_Event_EndDate,
  };
  std::vector<std::string> names;
  // Zones already looked at: equal named zones have equal names, and the others have none.
  std::vector<platform::TimeZone> seen;
  // Exception dates and rule end dates are written in UTC or with their own TZID and are
  // not looked at here.
  for (std::string_view entity :
       {tessel::TesselEntity_Calendars_Event, tessel::TesselEntity_Calendars_Task}) {
    const Array* array = record.arrayAt(entity);
    if (!array) continue;
    for (const Value& element : *array) {
      const Dictionary* fields = element.asDictionary();
      if (!fields) continue;
      for (std::string_view key : kDateKeys) {
        const CalendarDate* date = fields->dateAt(key);
        if (!date) continue;
        const platform::TimeZone& zone = date->timeZone();
        if (std::find(seen.begin(), seen.end(), zone) != seen.end()) continue;
        if (isUniversalZone(zone) || zone.isLocal()) continue;
        seen.push_back(zone);
        std::optional<std::string> name = zone.name();
        if (name && std::find(names.begin(), names.end(), *name) == names.end()) {
          names.push_back(std::move(*name));
        }
      }
    }
  }
  return names;
}

void ZetoCalendarExporter::appendCalendarRepresentationTo(std::string& out,
                                                          const Dictionary& record,
                                                          std::string_view entity) const {
  appendRFC2445ComponentStart(out, entity);
  for (const auto& [key, value] : record) appendPropertyForKey(out, key, entity, &value);
  appendRFC2445ComponentEnd(out, entity);
}

std::optional<std::string> ZetoCalendarExporter::propertyForKey(std::string_view key,
                                                                std::string_view entity,
                                                                const Value* value) const {
  std::string lines;
  if (!appendPropertyForKey(lines, key, entity, value)) return std::nullopt;
  return lines;
}

bool ZetoCalendarExporter::appendPropertyForKey(std::string& out, std::string_view key,
                                                std::string_view entity, const Value* value) const {
  if (!value) return false;
  if (std::optional<std::string_view> property = mappingForSyncKey(key, entity)) {
    appendMappedProperty(out, *property, *value);
    return true;
  }
  if (isExceptionDatesKey(key)) {
    const Array* dates = value->asArray();
    if (dates) appendExceptionDates(out, *dates);
    return dates != nullptr;
  }
  if (isStatusKey(key)) return appendStatus(out, value);
  if (key == tessel::TesselEntity_Calendars_Organizer) return appendOrganizer(out, *value);

  // The remaining keys hold lists of related records, and an empty list gives nothing.
  const Array* records = nonEmptyArray(*value);
  if (!records) return false;
  if (isAlarmKey(key)) {
    for (const Value& alarm : *records) appendAlarm(out, recordOrEmpty(alarm));
    return true;
  }
  if (key == tessel::TesselEntity_Calendars_Attendee) {
    appendAttendees(out, *records);
    return true;
  }
  if (key == tessel::TesselEntity_Calendars_Recurrence) return appendRecurrence(out, *records);
  return false;
}

void ZetoCalendarExporter::appendMappedProperty(std::string& out, std::string_view property,
                                                const Value& value) const {
  if (value.asDate()) {
    // Written as if switched to GMT; the record stays as the caller gave it.
    appendDatePropertyLine(out, property, value);
    return;
  }
  const std::size_t start = out.size();
  out += property;
  out += ':';
  if (const std::string* text = value.asString()) {
    appendEscapedRFC2445Value(out, *text);
  } else {
    appendEscapedRFC2445Value(out, iCalendarRepresentation(value));
  }
  foldFrom(out, start);
  out += "\r\n";
}

bool ZetoCalendarExporter::appendOrganizer(std::string& out, const Value& value) const {
  bool written = false;
  if (const Dictionary* organizer = value.asDictionary()) {
    written = appendAddressLine(out, "ORGANIZER", *organizer);
  } else if (const Array* organizers = value.asArray()) {
    // The flattened record lists the organizer like any related record; an empty list
    // is a broken record, and the export of the whole calendar is abandoned.
    if (organizers->empty()) throw std::out_of_range("organizer array is empty");
    written = appendAddressLine(out, "ORGANIZER", recordOrEmpty(organizers->front()));
  }
  if (!written) {
    platform::Log::standardError("Organizer translation error");
    return false;
  }
  return true;
}

void ZetoCalendarExporter::appendAttendees(std::string& out, const Array& attendees) const {
  for (const Value& attendee : attendees) {
    appendAddressLine(out, "ATTENDEE", recordOrEmpty(attendee));
  }
}

bool ZetoCalendarExporter::appendRecurrence(std::string& out, const Array& rules) const {
  // The device follows one rule per event; further rules are dropped.
  const Dictionary* first = rules.front().asDictionary();
  if (!first) {
    platform::Log::standardError("Recurrence translation error");
    return false;
  }
  const std::size_t start = out.size();
  out += "RRULE:";
  appendRecurrenceRule(out, *first);
  foldFrom(out, start);
  out += "\r\n";
  return true;
}

std::optional<std::string_view> ZetoCalendarExporter::mappingForSyncKey(
    std::string_view key, std::optional<std::string_view> /*entity*/) const {
  const auto it = _keyMapping.find(key);
  if (it == _keyMapping.end()) return std::nullopt;
  return std::string_view(it->second);
}

bool ZetoCalendarExporter::isDirectMapping(std::string_view key) const {
  return mappingForSyncKey(key, std::nullopt).has_value();
}

std::string ZetoCalendarExporter::alarmForRecord(const Dictionary& alarm) const {
  std::string text;
  appendAlarm(text, alarm);
  return text;
}

void ZetoCalendarExporter::appendAlarm(std::string& out, const Dictionary& alarm) const {
  appendRFC2445ComponentStart(out, "VALARM");
  out += "ACTION:DISPLAY\r\n";
  for (const auto& [key, value] : alarm) {
    const std::size_t start = out.size();
    if (isAnyOf(key, {tessel::TesselAttribute_Calendars_AudioAlarm_Description,
                      tessel::TesselAttribute_Calendars_DisplayAlarm_Description,
                      tessel::TesselAttribute_Calendars_MailAlarm_Description})) {
      out += "DESCRIPTION:";
      if (const std::string* description = value.asString()) {
        appendEscapedRFC2445Value(out, *description);
      } else {
        appendEscapedRFC2445Value(out, iCalendarRepresentation(value));
      }
    } else if (isAnyOf(key, {tessel::TesselAttribute_Calendars_AudioAlarm_Triggerduration,
                             tessel::TesselAttribute_Calendars_DisplayAlarm_Triggerduration,
                             tessel::TesselAttribute_Calendars_MailAlarm_Triggerduration})) {
      const platform::Number* seconds = value.asNumber();
      if (!seconds) continue;
      out += "TRIGGER:";
      out += iCalendarDurationRepresentation(*seconds);
    } else {
      continue;
    }
    // These two lines are folded with their line end counted, which the device's reader
    // expects: a fold can land after the CR LF, or between CR and LF.
    out += "\r\n";
    foldFrom(out, start);
  }
  appendRFC2445ComponentEnd(out, "VALARM");
}

bool ZetoCalendarExporter::appendAddressLine(std::string& out, std::string_view name,
                                             const Dictionary& address) const {
  const Value* email = address.find(tessel::TesselAttribute_Calendars_Attendee_Email);
  if (!email) {
    // Nothing is written, but the parameters are read as addressForRecord reads them.
    (void)addressForRecord(address);
    return false;
  }
  const std::size_t start = out.size();
  out += name;
  for (const auto& [key, value] : address) {
    if (key == tessel::TesselAttribute_Calendars_Attendee_CommonName) {
      // RFC 2445 section 4.2.2: the name is quoted, as it may hold ":" ";" or ",".
      appendRFC2445ParameterName(out, "CN");
      if (const std::string* commonName = value.asString()) {
        appendQuotedString(out, *commonName);
      } else {
        out += iCalendarQuoted(iCalendarRepresentation(value));
      }
    } else if (key == tessel::TesselAttribute_Calendars_Attendee_Status) {
      if (const std::string* word = value.asString()) {
        appendRFC2445Parameter(out, "PARTSTAT", iCalendarRepresentationPartStat(*word));
      }
    }
  }
  out += ':';
  if (const std::string* text = email->asString()) {
    out += *text;
  } else {
    out += iCalendarRepresentation(*email);
  }
  foldFrom(out, start);
  out += "\r\n";
  return true;
}

std::optional<std::string> ZetoCalendarExporter::addressForRecord(const Dictionary& address) const {
  std::string text;
  for (const auto& [key, value] : address) {
    if (key == tessel::TesselAttribute_Calendars_Attendee_CommonName) {
      // RFC 2445 section 4.2.2: the name is quoted, as it may hold ":" ";" or ",".
      appendRFC2445Parameter(text, "CN", iCalendarQuoted(iCalendarRepresentation(value)));
    } else if (key == tessel::TesselAttribute_Calendars_Attendee_Status) {
      if (const std::string* word = value.asString()) {
        appendRFC2445Parameter(text, "PARTSTAT", iCalendarRepresentationPartStat(*word));
      }
    }
  }
  const Value* email = address.find(tessel::TesselAttribute_Calendars_Attendee_Email);
  if (!email) return std::nullopt;
  text += ':';
  text += iCalendarRepresentation(*email);
  return text;
}

std::optional<std::string> ZetoCalendarExporter::recurrenceRuleForRecord(
    const Dictionary& rule) const {
  std::string text;
  appendRecurrenceRule(text, rule);
  return text;
}

void ZetoCalendarExporter::appendRecurrenceRule(std::string& text, const Dictionary& rule) const {
  struct Part {
    std::string_view key;
    std::string_view name;
  };
  static constexpr Part kParts[] = {
      {tessel::TesselAttribute_Calendars_Recurrence_Count, "COUNT"},
      {tessel::TesselAttribute_Calendars_Recurrence_Interval, "INTERVAL"},
      {tessel::TesselAttribute_Calendars_Recurrence_Until, "UNTIL"},
      {tessel::TesselAttribute_Calendars_Recurrence_Bymonth, "BYMONTH"},
      {tessel::TesselAttribute_Calendars_Recurrence_Byweeknumber, "BYWEEKNO"},
      {tessel::TesselAttribute_Calendars_Recurrence_Byyearday, "BYYEARDAY"},
      {tessel::TesselAttribute_Calendars_Recurrence_Bymonthday, "BYMONTHDAY"},
      {tessel::TesselAttribute_Calendars_Recurrence_Bysetpos, "BYSETPOS"},
  };

  // RFC 2445 section 4.3.10 wants FREQ first.
  text += "FREQ=";
  const Value* frequency = rule.find(tessel::TesselAttribute_Calendars_Recurrence_Frequency);
  text += iCalendarRepresentationForFrequency(frequency ? iCalendarRepresentation(*frequency)
                                                        : std::string());

  for (const auto& [key, value] : rule) {
    if (key == tessel::TesselAttribute_Calendars_Recurrence_Weekstartday) {
      const std::string* day = value.asString();
      appendRFC2445Parameter(text, "WKST",
                             day ? iCalendarRepresentationForDay(*day) : std::string_view("ERROR"));
      continue;
    }
    for (const Part& part : kParts) {
      if (key == part.key) {
        // An until date is written from a copy: whole day, UTC with Z, or floating.
        appendRFC2445Parameter(text, part.name, iCalendarRepresentation(value));
        break;
      }
    }
  }

  const Array* freqs = rule.arrayAt(tessel::TesselAttribute_Calendars_Recurrence_Bydayfreq);
  const Array* days = rule.arrayAt(tessel::TesselAttribute_Calendars_Recurrence_Bydaydays);
  if (freqs && days) {
    if (std::optional<std::string> byDay = iCalendarRepresentationForByDayFreq(*freqs, *days)) {
      appendRFC2445Parameter(text, "BYDAY", *byDay);
    }
  }
}

std::string ZetoCalendarExporter::lineForExceptionDates(const Array& dates) const {
  std::string text;
  appendExceptionDates(text, dates);
  return text;
}

void ZetoCalendarExporter::appendExceptionDates(std::string& out, const Array& dates) const {
  // One EXDATE per date rather than a list: each date may carry its own TZID.
  for (const Value& date : dates) appendDatePropertyLine(out, "EXDATE", date);
}

std::optional<std::string> ZetoCalendarExporter::lineForStatus(const Value* value) const {
  std::string line;
  if (!appendStatus(line, value)) return std::nullopt;
  return line;
}

bool ZetoCalendarExporter::appendStatus(std::string& out, const Value* value) const {
  const std::string* word = value ? value->asString() : nullptr;
  if (!word || word->empty() || platform::equalsIgnoringAsciiCase(*word, "none")) return false;
  const std::size_t start = out.size();
  out += "STATUS:";
  out += platform::upperAscii(*word);
  foldFrom(out, start);
  out += "\r\n";
  return true;
}

}  // namespace zt::icalendar
