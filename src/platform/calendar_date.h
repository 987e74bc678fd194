#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/time_zone.h"

namespace zt::platform {

// A point in time together with the time zone in which its calendar fields are read.
//
// The instant is kept to the nanosecond (file dates read with statx compare equal to the
// value stored earlier) over the full range of 64-bit seconds, so recurrence end dates far
// in the future (year 4500 is common in exported calendars) are held exactly.
class CalendarDate {
 public:
  struct Fields {
    int year = 1970;  // of the common era
    int month = 1;    // 1-12
    int day = 1;      // 1-31
    int hour = 0;     // 0-23
    int minute = 0;
    int second = 0;
  };

  CalendarDate(std::chrono::sys_seconds instant, TimeZone zone, std::uint32_t nanoseconds = 0);

  // The date whose fields in `zone` are `fields` (see TimeZone::instantAt for gaps and folds).
  static CalendarDate fromFields(const Fields& fields, TimeZone zone);

  // Reads the "2002-2-1 00:00:00 +0000" form: year-month-day (one or two digits for month
  // and day), hours:minutes:seconds, and a signed four-digit offset. The date's zone is GMT
  // for +0000, else an unnamed zone of that offset. Nothing for any other text.
  static std::optional<CalendarDate> fromString(std::string_view text);

  std::chrono::sys_seconds instant() const { return instant_; }
  std::uint32_t nanoseconds() const { return nanoseconds_; }
  const TimeZone& timeZone() const { return zone_; }
  // Keeps the instant; the fields are read in the new zone from now on.
  void setTimeZone(TimeZone zone) { zone_ = std::move(zone); }

  // The fields of the instant read in the date's own zone.
  Fields fields() const;
  int yearOfCommonEra() const { return fields().year; }
  int monthOfYear() const { return fields().month; }
  int dayOfMonth() const { return fields().day; }
  int hourOfDay() const { return fields().hour; }
  int minuteOfHour() const { return fields().minute; }
  int secondOfMinute() const { return fields().second; }

  bool isSameInstant(const CalendarDate& other) const {
    return instant_ == other.instant_ && nanoseconds_ == other.nanoseconds_;
  }
  // The same instant and an equal zone.
  bool operator==(const CalendarDate& other) const {
    return isSameInstant(other) && zone_ == other.zone_;
  }

  // "2007-03-15 12:30:00 +0100", read in the date's zone.
  std::string description() const;

 private:
  std::chrono::sys_seconds instant_;
  std::uint32_t nanoseconds_;
  TimeZone zone_;
};

}  // namespace zt::platform
