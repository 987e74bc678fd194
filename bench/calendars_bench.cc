// Calendar export throughput on a realistic store: 20 calendars holding 50,000 events, or as
// many as the first argument says (a quarter recurring, a third with an alarm, a tenth with
// an organizer and attendees), flattened from a real store's snapshot and exported calendar
// by calendar as a sync does. The same events are then serialised with libical
// (icalcomponent_as_ical_string) for comparison, each writer alone on prebuilt input. Reports
// events per second, the peak resident memory of the export (of one calendar alone and of all
// twenty: the second should not be larger, since each calendar is released before the next), and
// the ratio to libical.
#include <libical/ical.h>
#include <stdlib.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <string>
#include <system_error>
#include <vector>

#include "calendars/calendar_flattener.h"
#include "icalendar/zeto_calendar_exporter.h"
#include "platform/calendar_date.h"
#include "platform/time_zone.h"
#include "platform/value.h"
#include "tessel/record.h"
#include "tessel/schema.h"
#include "tessel/store.h"

namespace {

namespace fs = std::filesystem;
using zt::calendars::CalendarFlattener;
using zt::platform::Array;
using zt::platform::CalendarDate;
using zt::platform::Dictionary;
using zt::platform::TimeZone;
using zt::platform::Value;

constexpr int kCalendars = 20;
// The number of events; a first argument changes it (a smaller store for callgrind).
int kEvents = 50'000;
constexpr int kRounds = 5;

// The high-water mark of resident memory, reset so that each phase is measured alone.
long peakResidentKiB() {
  std::ifstream status("/proc/self/status");
  std::string line;
  while (std::getline(status, line)) {
    if (line.rfind("VmHWM:", 0) == 0) return std::strtol(line.c_str() + 6, nullptr, 10);
  }
  return -1;
}
void resetPeakResident() {
  std::ofstream("/proc/self/clear_refs") << "5";
}
long currentResidentKiB() {
  std::ifstream status("/proc/self/status");
  std::string line;
  while (std::getline(status, line)) {
    if (line.rfind("VmRSS:", 0) == 0) return std::strtol(line.c_str() + 6, nullptr, 10);
  }
  return -1;
}

Array identifiers(const std::vector<std::string>& ids) {
  Array array;
  array.reserve(ids.size());
  for (const std::string& id : ids) array.emplace_back(id);
  return array;
}

std::string calendarID(int c) {
  return "cal-" + std::to_string(c);
}

// Fills the store; answers the calendar identifiers.
std::vector<std::string> fillStore(tessel::Store& store) {
  const TimeZone paris = *TimeZone::named("Europe/Paris");
  const TimeZone newYork = *TimeZone::named("America/New_York");
  std::vector<tessel::Record> records;
  std::vector<std::vector<std::string>> members(kCalendars);
  const auto base = std::chrono::sys_days{std::chrono::year{2007} / 1 / 1};
  for (int e = 0; e < kEvents; ++e) {
    const int c = e % kCalendars;
    const std::string id = "ev-" + std::to_string(e);
    members[c].push_back(id);
    const TimeZone& zone = e % 3 == 0 ? TimeZone::utc() : (e % 3 == 1 ? paris : newYork);
    const auto start = std::chrono::sys_seconds(base) + std::chrono::hours(e * 5);
    Dictionary event{
        {tessel::TesselRecordEntityNameKey, tessel::TesselEntity_Calendars_Event},
        {tessel::TesselAttribute_Calendars_Event_Summary,
         "Meeting number " + std::to_string(e) + ", with notes; and more"},
        {tessel::TesselAttribute_Calendars_Event_StartDate, CalendarDate(start, zone)},
        {tessel::TesselAttribute_Calendars_Event_EndDate,
         CalendarDate(start + std::chrono::minutes(45), zone)},
        {tessel::TesselAttribute_Calendars_Event_Location, "Room " + std::to_string(e % 40)},
        {tessel::TesselAttribute_Calendars_Event_Description,
         "A description long enough to be folded at least once when it is written, as real "
         "descriptions often are: agenda, people, links."},
        {tessel::TesselAttribute_Calendars_Event_Status, "confirmed"},
        {tessel::TesselRelationship_Calendars_Event_Calendar, identifiers({calendarID(c)})},
    };
    if (e % 4 == 0) {
      const std::string rule = id + "-rule";
      event.set(tessel::TesselRelationship_Calendars_Event_Recurrences, identifiers({rule}));
      records.push_back(
          {rule, Dictionary{
                     {tessel::TesselRecordEntityNameKey, tessel::TesselEntity_Calendars_Recurrence},
                     {tessel::TesselAttribute_Calendars_Recurrence_Frequency, "weekly"},
                     {tessel::TesselAttribute_Calendars_Recurrence_Interval, Value::integer(2)},
                     {tessel::TesselAttribute_Calendars_Recurrence_Count, Value::integer(10)},
                     {tessel::TesselAttribute_Calendars_Recurrence_Bydayfreq,
                      Array{Value::integer(0), Value::integer(0)}},
                     {tessel::TesselAttribute_Calendars_Recurrence_Bydaydays,
                      Array{Value("monday"), Value("wednesday")}}}});
    }
    if (e % 3 == 0) {
      const std::string alarm = id + "-alarm";
      event.set(tessel::TesselRelationship_Calendars_Event_DisplayAlarms, identifiers({alarm}));
      records.push_back(
          {alarm,
           Dictionary{
               {tessel::TesselRecordEntityNameKey, tessel::TesselEntity_Calendars_DisplayAlarm},
               {tessel::TesselAttribute_Calendars_DisplayAlarm_Triggerduration,
                Value::integer(-900)},
               {tessel::TesselAttribute_Calendars_DisplayAlarm_Description, "Reminder"}}});
    }
    if (e % 10 == 0) {
      const std::string organizer = id + "-org";
      std::vector<std::string> attendees = {id + "-att-1", id + "-att-2"};
      event.set(tessel::TesselRelationship_Calendars_Event_Organizer, identifiers({organizer}));
      event.set(tessel::TesselRelationship_Calendars_Event_Attendees, identifiers(attendees));
      records.push_back(
          {organizer,
           Dictionary{
               {tessel::TesselRecordEntityNameKey, tessel::TesselEntity_Calendars_Organizer},
               {tessel::TesselAttribute_Calendars_Organizer_CommonName, "Ann Organizer"},
               {tessel::TesselAttribute_Calendars_Organizer_Email, "mailto:ann@example.org"}}});
      for (std::size_t a = 0; a < attendees.size(); ++a) {
        records.push_back(
            {attendees[a],
             Dictionary{
                 {tessel::TesselRecordEntityNameKey, tessel::TesselEntity_Calendars_Attendee},
                 {tessel::TesselAttribute_Calendars_Attendee_CommonName,
                  "Guest " + std::to_string(a)},
                 {tessel::TesselAttribute_Calendars_Attendee_Email,
                  "mailto:guest" + std::to_string(a) + "@example.org"},
                 {tessel::TesselAttribute_Calendars_Attendee_Status, "accepted"}}});
      }
    }
    records.push_back({id, std::move(event)});
  }
  std::vector<std::string> calendars;
  for (int c = 0; c < kCalendars; ++c) {
    calendars.push_back(calendarID(c));
    records.push_back(
        {calendarID(c),
         Dictionary{
             {tessel::TesselRecordEntityNameKey, tessel::TesselEntity_Calendars_Calendar},
             {tessel::TesselAttribute_Calendars_Calendar_Title, "Calendar " + std::to_string(c)},
             {tessel::TesselRelationship_Calendars_Calendar_Events, identifiers(members[c])}}});
  }
  store.putRecords(records);
  return calendars;
}

// The flattened record of one calendar, as a sync builds it.
Dictionary flattenedCalendar(const tessel::Snapshot& snapshot, const std::string& id,
                             std::size_t order) {
  Dictionary calendar = *snapshot.recordWithIdentifier(id);
  const std::string title =
      *calendar.find(tessel::TesselAttribute_Calendars_Calendar_Title)->asString();
  return *CalendarFlattener(snapshot).flattenCalendar(calendar, title, order);
}

// --- libical: the same flattened events as a libical component tree. ---

icaltimetype icalTime(const CalendarDate& date) {
  icaltimezone* utc = icaltimezone_get_utc_timezone();
  std::optional<std::string> name = date.timeZone().name();
  if (date.timeZone().kind() == TimeZone::Kind::Named && name && *name != "UTC" && *name != "GMT") {
    icaltimezone* zone = icaltimezone_get_builtin_timezone(name->c_str());
    return icaltime_from_timet_with_zone(date.instant().time_since_epoch().count(), 0,
                                         zone ? zone : utc);
  }
  return icaltime_from_timet_with_zone(date.instant().time_since_epoch().count(), 0, utc);
}

icalproperty* withZone(icalproperty* property, const CalendarDate& date) {
  std::optional<std::string> name = date.timeZone().name();
  if (date.timeZone().kind() == TimeZone::Kind::Named && name && *name != "UTC" && *name != "GMT") {
    icalproperty_add_parameter(property, icalparameter_new_tzid(name->c_str()));
  }
  return property;
}

const Dictionary* firstOf(const Dictionary& event, std::string_view key) {
  const Value* value = event.find(key);
  const Array* array = value ? value->asArray() : nullptr;
  return array && !array->empty() ? (*array)[0].asDictionary() : nullptr;
}

std::string text(const Dictionary& record, std::string_view key) {
  const Value* value = record.find(key);
  return value && value->asString() ? *value->asString() : std::string();
}

icalcomponent* icalCalendar(const Dictionary& flattened) {
  icalcomponent* calendar = icalcomponent_new(ICAL_VCALENDAR_COMPONENT);
  icalcomponent_add_property(calendar, icalproperty_new_version("2.0"));
  icalcomponent_add_property(calendar, icalproperty_new_calscale("GREGORIAN"));
  icalcomponent_add_property(calendar,
                             icalproperty_new_prodid("-//Kestro Computer, Inc//Tessel 2.0//EN"));
  icalproperty* name =
      icalproperty_new_x(text(flattened, tessel::TesselAttribute_Calendars_Calendar_Title).c_str());
  icalproperty_set_x_name(name, "X-WR-CALNAME");
  icalcomponent_add_property(calendar, name);
  for (const char* zone : {"Europe/Paris", "America/New_York"}) {
    icalcomponent_add_component(calendar, icalcomponent_new_clone(icaltimezone_get_component(
                                              icaltimezone_get_builtin_timezone(zone))));
  }
  for (const Value& value : *flattened.find(tessel::TesselEntity_Calendars_Event)->asArray()) {
    const Dictionary& event = *value.asDictionary();
    icalcomponent* vevent = icalcomponent_new(ICAL_VEVENT_COMPONENT);
    icalcomponent_add_property(
        vevent, icalproperty_new_summary(
                    text(event, tessel::TesselAttribute_Calendars_Event_Summary).c_str()));
    const CalendarDate& start =
        *event.find(tessel::TesselAttribute_Calendars_Event_StartDate)->asDate();
    const CalendarDate& end =
        *event.find(tessel::TesselAttribute_Calendars_Event_EndDate)->asDate();
    icalcomponent_add_property(vevent, withZone(icalproperty_new_dtstart(icalTime(start)), start));
    icalcomponent_add_property(vevent, withZone(icalproperty_new_dtend(icalTime(end)), end));
    icalcomponent_add_property(
        vevent, icalproperty_new_description(
                    text(event, tessel::TesselAttribute_Calendars_Event_Description).c_str()));
    icalcomponent_add_property(
        vevent, icalproperty_new_location(
                    text(event, tessel::TesselAttribute_Calendars_Event_Location).c_str()));
    icalcomponent_add_property(vevent, icalproperty_new_status(ICAL_STATUS_CONFIRMED));
    if (firstOf(event, tessel::TesselEntity_Calendars_Recurrence)) {
      struct icalrecurrencetype rule =
          icalrecurrencetype_from_string("FREQ=WEEKLY;INTERVAL=2;COUNT=10;BYDAY=MO,WE");
      icalcomponent_add_property(vevent, icalproperty_new_rrule(rule));
    }
    if (const Dictionary* alarm = firstOf(event, tessel::TesselEntity_Calendars_DisplayAlarm)) {
      icalcomponent* valarm = icalcomponent_new(ICAL_VALARM_COMPONENT);
      icalcomponent_add_property(valarm, icalproperty_new_action(ICAL_ACTION_DISPLAY));
      icalcomponent_add_property(
          valarm,
          icalproperty_new_description(
              text(*alarm, tessel::TesselAttribute_Calendars_DisplayAlarm_Description).c_str()));
      struct icaltriggertype trigger = icaltriggertype_from_int(0);
      trigger.duration = icaldurationtype_from_int(static_cast<int>(
          alarm->find(tessel::TesselAttribute_Calendars_DisplayAlarm_Triggerduration)
              ->asNumber()
              ->int64Value()));
      icalcomponent_add_property(valarm, icalproperty_new_trigger(trigger));
      icalcomponent_add_component(vevent, valarm);
    }
    if (const Dictionary* organizer = firstOf(event, tessel::TesselEntity_Calendars_Organizer)) {
      icalproperty* property = icalproperty_new_organizer(
          text(*organizer, tessel::TesselAttribute_Calendars_Attendee_Email).c_str());
      icalproperty_add_parameter(
          property,
          icalparameter_new_cn(
              text(*organizer, tessel::TesselAttribute_Calendars_Attendee_CommonName).c_str()));
      icalcomponent_add_property(vevent, property);
    }
    if (const Value* attendees = event.find(tessel::TesselEntity_Calendars_Attendee)) {
      for (const Value& attendeeValue : *attendees->asArray()) {
        const Dictionary& attendee = *attendeeValue.asDictionary();
        icalproperty* property = icalproperty_new_attendee(
            text(attendee, tessel::TesselAttribute_Calendars_Attendee_Email).c_str());
        icalproperty_add_parameter(
            property,
            icalparameter_new_cn(
                text(attendee, tessel::TesselAttribute_Calendars_Attendee_CommonName).c_str()));
        icalproperty_add_parameter(property, icalparameter_new_partstat(ICAL_PARTSTAT_ACCEPTED));
        icalcomponent_add_property(vevent, property);
      }
    }
    icalcomponent_add_component(calendar, vevent);
  }
  return calendar;
}

double seconds(const std::function<void()>& work, int rounds = kRounds) {
  double best = 1e30;
  for (int round = 0; round < rounds; ++round) {
    const auto start = std::chrono::steady_clock::now();
    work();
    best = std::min(
        best, std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count());
  }
  return best;
}

// Fills the store in a child process, so that the memory of building 100,000 records does
// not hide the export's own peak in this process.
bool fillStoreInChild(const fs::path& storePath, std::vector<std::string>& calendars) {
  for (int c = 0; c < kCalendars; ++c) calendars.push_back(calendarID(c));
  const pid_t child = ::fork();
  if (child < 0) return false;
  if (child == 0) {
    std::unique_ptr<tessel::Store> store = tessel::Store::open(storePath);
    fillStore(*store);
    store->registerClient("bench", "Zeto", {});
    store.reset();
    ::_exit(0);
  }
  int status = 0;
  ::waitpid(child, &status, 0);
  return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc > 1) kEvents = std::max(kCalendars, std::atoi(argv[1]));
  std::string pattern = (fs::temp_directory_path() / "zt-calendars-bench-XXXXXX").string();
  if (::mkdtemp(pattern.data()) == nullptr) return 1;
  const fs::path folder = pattern;
  int result = 0;
  std::vector<std::string> calendars;
  if (!fillStoreInChild(folder / "truth.db", calendars)) {
    std::fprintf(stderr, "could not fill the store\n");
    return 1;
  }
  {
    std::unique_ptr<tessel::Store> store = tessel::Store::open(folder / "truth.db");
    std::unique_ptr<tessel::Client> client = store->clientWithIdentifier("bench");
    std::shared_ptr<tessel::Snapshot> snapshot = store->snapshotOfRecordsInTruth({}, *client);

    // What a sync does, calendar by calendar: flatten, export, let both go.
    std::size_t bytes = 0;
    auto syncAll = [&] {
      bytes = 0;
      for (std::size_t c = 0; c < calendars.size(); ++c) {
        std::vector<std::uint8_t> data;
        zt::icalendar::ZetoCalendarExporter::setupData(
            data, flattenedCalendar(*snapshot, calendars[c], c));
        bytes += data.size();
      }
    };
    const long baseline = currentResidentKiB();
    resetPeakResident();
    {
      std::vector<std::uint8_t> data;
      zt::icalendar::ZetoCalendarExporter::setupData(data,
                                                     flattenedCalendar(*snapshot, calendars[0], 0));
    }
    const long peakOne = peakResidentKiB();
    resetPeakResident();
    const double fromStore = seconds(syncAll);
    // FNV-1a of all the files, untimed, to compare the output of two builds.
    std::uint64_t digest = 14695981039346656037ULL;
    for (std::size_t c = 0; c < calendars.size(); ++c) {
      std::vector<std::uint8_t> data;
      zt::icalendar::ZetoCalendarExporter::setupData(data,
                                                     flattenedCalendar(*snapshot, calendars[c], c));
      for (std::uint8_t byte : data) digest = (digest ^ byte) * 1099511628211ULL;
    }
    std::printf("output: %zu bytes, FNV-1a %016llx\n", bytes,
                static_cast<unsigned long long>(digest));
    const long peakAll = peakResidentKiB();

    const double flattenOnly = seconds([&] {
      for (std::size_t c = 0; c < calendars.size(); ++c) {
        Dictionary flattened = flattenedCalendar(*snapshot, calendars[c], c);
      }
    });

    // Export alone and libical alone, on the same flattened records.
    std::vector<Dictionary> flattened;
    for (std::size_t c = 0; c < calendars.size(); ++c) {
      flattened.push_back(flattenedCalendar(*snapshot, calendars[c], c));
    }
    std::size_t icalBytes = 0;
    const double libicalBuildAndWrite = seconds([&] {
      icalBytes = 0;
      for (const Dictionary& calendar : flattened) {
        icalcomponent* component = icalCalendar(calendar);
        char* written = icalcomponent_as_ical_string_r(component);
        icalBytes += std::char_traits<char>::length(written);
        std::free(written);
        icalcomponent_free(component);
      }
    });
    // The two writers alone, each on its own prebuilt input (our flattened records, libical's
    // component trees of the same events), in alternating rounds so that a busy machine
    // slows both alike; the best round of each counts.
    std::vector<icalcomponent*> components;
    for (const Dictionary& calendar : flattened) components.push_back(icalCalendar(calendar));
    double exportOnly = 1e30;
    double libicalWriteOnly = 1e30;
    for (int round = 0; round < kRounds; ++round) {
      exportOnly = std::min(exportOnly, seconds(
                                            [&] {
                                              for (const Dictionary& calendar : flattened) {
                                                std::vector<std::uint8_t> data;
                                                zt::icalendar::ZetoCalendarExporter::setupData(
                                                    data, calendar);
                                              }
                                            },
                                            1));
      libicalWriteOnly = std::min(libicalWriteOnly,
                                  seconds(
                                      [&] {
                                        for (icalcomponent* component : components) {
                                          char* written = icalcomponent_as_ical_string_r(component);
                                          std::free(written);
                                        }
                                      },
                                      1));
    }
    for (icalcomponent* component : components) icalcomponent_free(component);

    auto rate = [](double s) { return kEvents / s; };
    std::printf("calendars: %d, events: %d (best of %d rounds)\n", kCalendars, kEvents, kRounds);
    std::printf(
        "sync path (store, flatten, export), per calendar: %7.3f s %9.0f events/s (%zu bytes)\n",
        fromStore, rate(fromStore), bytes);
    std::printf("  of which flattening from the store:            %7.3f s %9.0f events/s\n",
                flattenOnly, rate(flattenOnly));
    std::printf("exporter alone, on flattened records:            %7.3f s %9.0f events/s\n",
                exportOnly, rate(exportOnly));
    std::printf("libical icalcomponent_as_ical_string alone:      %7.3f s %9.0f events/s\n",
                libicalWriteOnly, rate(libicalWriteOnly));
    std::printf(
        "libical building components + as_ical_string:    %7.3f s %9.0f events/s (%zu bytes)\n",
        libicalBuildAndWrite, rate(libicalBuildAndWrite), icalBytes);
    std::printf("ratio exporter / libical as_ical_string: %.2fx faster\n",
                libicalWriteOnly / exportOnly);
    std::printf("ratio exporter / libical build + write:  %.2fx faster\n",
                libicalBuildAndWrite / exportOnly);
    std::printf(
        "resident memory: %ld KiB at start; peak %ld KiB for one calendar, %ld KiB for all %d\n",
        baseline, peakOne, peakAll, kCalendars);
    if (exportOnly >= libicalWriteOnly) result = 2;
  }
  std::error_code ignored;
  fs::remove_all(folder, ignored);
  return result;
}
