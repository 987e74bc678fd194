// The zones and times of imported iCalendar files: times at noon UTC stay times through the
// writer, and TZIDs resolve to the zones of the time-zone database they mean.

#include <gtest/gtest.h>

#include <regex>
#include <string>

#include "icalendar/zeto_calendar_exporter.h"
#include "importers/ical_import.h"
#include "support/files.h"
#include "tessel/schema.h"

namespace tessel::importers {
namespace {

namespace fs = std::filesystem;

const fs::path kZones = fs::path(ZT_TEST_DATA_DIR) / "data" / "ical" / "zones";

ICalCalendar readZoneFile(const std::string& name) {
  ICalCalendarSource source;
  source.identifier = "cal";
  source.files.push_back({name, zt::test_support::readFile(kZones / name)});
  source.fallbackTitle = "zones";
  return readICalCalendar(source);
}

// What the device's calendar writer makes of every imported record: the lines of events and
// tasks, the rules after "RRULE:", and the alarms.
std::string writtenBack(const ICalCalendar& calendar) {
  const zt::icalendar::ZetoCalendarExporter exporter;
  std::string text;
  for (const Record& record : calendar.records) {
    const std::string* entity = record.record.stringAt(TesselRecordEntityNameKey);
    if (entity == nullptr) continue;
    if (*entity == TesselEntity_Calendars_Recurrence) {
      text += "RRULE:" + exporter.recurrenceRuleForRecord(record.record).value_or("?") + "\n";
    } else if (entity->find("Alarm") != std::string::npos) {
      text += exporter.alarmForRecord(record.record);
    } else if (*entity == TesselEntity_Calendars_Event || *entity == TesselEntity_Calendars_Task) {
      const char* component = *entity == TesselEntity_Calendars_Event ? "VEVENT" : "VTODO";
      for (const auto& [key, value] : record.record)
        text += exporter.propertyForKey(key, component, &value).value_or("");
    }
  }
  return text;
}

// Google writes timed events in UTC; those at 12:00:00Z are no whole days, in any date the
// importer writes.
TEST(ICalZones, NoonUtcStaysATime) {
  const std::string text = writtenBack(readZoneFile("noon_utc.ics"));
  for (const char* line : {
           "DTSTART;TZID=Etc/UTC:20260112T120000\r\n",  // start
           "DTEND:20260112T123000Z\r\n",                // other UTC times as before
           "UNTIL=20260209T120000Z",                    // end of the rule
           "EXDATE;TZID=Etc/UTC:20260119T120000\r\n",   // exception date
           "DTSTART;TZID=Etc/UTC:20260126T120000\r\n",  // TZID=UTC, of a moved occurrence
           "DUE;TZID=Etc/UTC:20260113T120000\r\n",      // task
           "COMPLETED;TZID=Etc/UTC:20260112T120000\r\n",
       }) {
    EXPECT_NE(text.find(line), std::string::npos) << line << " not in\n" << text;
  }
  // No value anywhere is a bare date.
  EXPECT_FALSE(std::regex_search(text, std::regex(R"([:=]\d{8}(\r|;|\n|$))"))) << text;
}

// The zone of an event's start, by its name or, for an unnamed zone, its description.
std::string startZone(const ICalCalendar& calendar, const std::string& uid) {
  for (const Record& record : calendar.records) {
    if (record.id != "cal/event/" + uid) continue;
    const zt::platform::CalendarDate* start = record.record.dateAt("start date");
    if (start == nullptr) return "(no start)";
    return start->timeZone().name().value_or(start->timeZone().description());
  }
  return "(absent: " + uid + ")";
}

// TZIDs without a VTIMEZONE: IANA names in other forms and behind vendor prefixes, Windows
// zone names and Outlook's display names.
TEST(ICalZones, NamesWithoutVTimezone) {
  const std::pair<std::string, std::string> cases[] = {
      {"Europe/Berlin", "Europe/Berlin"},
      {"Europe_Berlin", "Europe/Berlin"},
      {"Europe/lisbon", "Europe/Lisbon"},
      {"america_new_york", "America/New_York"},
      {"America-Chicago", "America/Chicago"},
      {"/mozilla.org/20050126_1/Europe/Berlin", "Europe/Berlin"},
      {"/softwarestudio.org/Olson_20011030_5/America/New_York", "America/New_York"},
      {"/freeassociation.sourceforge.net/Tzfile/Europe/London", "Europe/London"},
      {"/freeassociation.sourceforge.net/Tzfile/America/Argentina/Buenos_Aires",
       "America/Argentina/Buenos_Aires"},
      {"W. Europe Standard Time", "Europe/Berlin"},
      {"(UTC-05:00) Eastern Time (US & Canada)", "America/New_York"},
      {"(UTC-05:00) Eastern Time (US and Canada)", "America/New_York"},
      {"(GMT+01:00) Amsterdam, Berlin, Bern, Rome, Stockholm, Vienna", "Europe/Berlin"},
      {"(GMT+01:00) Brussels, Copenhagen, Madrid, Paris", "Europe/Paris"},
      {"(GMT+10:00) Canberra, Melbourne, Sydney", "Australia/Sydney"},
      {"Kuala Lumpur\\, Singapore", "Asia/Singapore"},
      {"pacific time (us & canada)", "America/Los_Angeles"},
  };
  for (const auto& [tzid, zone] : cases) {
    SCOPED_TRACE(tzid);
    ICalCalendarSource source;
    source.identifier = "cal";
    source.files.push_back(
        {"test.ics",
         "BEGIN:VCALENDAR\r\nVERSION:2.0\r\nPRODID:-//Test//EN\r\nBEGIN:VEVENT\r\n"
         "UID:x\r\nDTSTART;TZID=\"" +
             tzid + "\":20260110T090000\r\nEND:VEVENT\r\nEND:VCALENDAR\r\n"});
    EXPECT_EQ(startZone(readICalCalendar(source), "x"), zone);
  }
}

// TZIDs that only their VTIMEZONE explains: its X-LIC-LOCATION or TZURL, an Outlook display
// name, and custom zones matched by their rules over the years the events use; a zone that
// matches no zone of the database stays unnamed.
TEST(ICalZones, NamesFromTheVTimezone) {
  // RFC 5545 does not order components: the same file with its VTIMEZONEs after the events
  // that name them means the same zones.
  ICalCalendarSource zonesLast;
  zonesLast.identifier = "cal";
  std::string text = zt::test_support::readFile(kZones / "by_vtimezone.ics");
  std::string zones;
  for (std::size_t begin; (begin = text.find("BEGIN:VTIMEZONE")) != std::string::npos;) {
    const std::size_t end = text.find('\n', text.find("END:VTIMEZONE", begin)) + 1;
    zones += text.substr(begin, end - begin);
    text.erase(begin, end - begin);
  }
  text.insert(text.rfind("END:VCALENDAR"), zones);
  zonesLast.files.push_back({"zones_last.ics", text});
  for (const ICalCalendar& calendar :
       {readZoneFile("by_vtimezone.ics"), readICalCalendar(zonesLast)}) {
    const std::pair<std::string, std::string> cases[] = {
        {"lisbon", "Europe/Lisbon"},         // X-LIC-LOCATION
        {"office", "America/Chicago"},       // TZURL
        {"customized", "America/New_York"},  // US rules since 2007, daylight time since 1970
        {"down-under", "Australia/Sydney"},  // Australian rules, AEST/AEDT
        {"outlook", "Europe/Berlin"},        // display name
        {"nowhere", "UNNAMED 11820"},        // +03:17 is no zone's offset
    };
    for (const auto& [uid, zone] : cases) EXPECT_EQ(startZone(calendar, uid), zone) << uid;
  }
}

}  // namespace
}  // namespace tessel::importers
