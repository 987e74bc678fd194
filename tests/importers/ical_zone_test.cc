// The zones and times of imported iCalendar files: times at noon UTC stay times through the
// writer.

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
      for (const auto& [key, value] : record.record) {
        text += exporter.propertyForKey(key, component, &value).value_or("");
      }
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

}  // namespace
}  // namespace tessel::importers
