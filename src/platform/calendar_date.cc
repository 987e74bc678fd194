#include "platform/calendar_date.h"

#include <charconv>
#include <cstdio>

namespace zt::platform {

namespace {

using std::chrono::days;
using std::chrono::floor;
using std::chrono::seconds;

// Reads an unsigned decimal number of 1 to maxDigits digits at text[pos].
std::optional<int> readNumber(std::string_view text, std::size_t& pos, std::size_t maxDigits) {
  std::size_t start = pos;
  while (pos < text.size() && pos - start < maxDigits && text[pos] >= '0' && text[pos] <= '9') {
    ++pos;
  }
  if (pos == start) return std::nullopt;
  int value = 0;
  std::from_chars(text.data() + start, text.data() + pos, value);
  return value;
}

bool expect(std::string_view text, std::size_t& pos, char c) {
  if (pos >= text.size() || text[pos] != c) return false;
  ++pos;
  return true;
}

bool validFields(const CalendarDate::Fields& f) {
  using namespace std::chrono;
  year_month_day ymd{year{f.year}, month{static_cast<unsigned>(f.month)},
                     day{static_cast<unsigned>(f.day)}};
  return ymd.ok() && f.hour >= 0 && f.hour < 24 && f.minute >= 0 && f.minute < 60 &&
         f.second >= 0 && f.second < 61;
}

}  // namespace

CalendarDate::CalendarDate(std::chrono::sys_seconds instant, TimeZone zone,
                           std::uint32_t nanoseconds)
    : instant_(instant), nanoseconds_(nanoseconds), zone_(std::move(zone)) {}

CalendarDate CalendarDate::fromFields(const Fields& f, TimeZone zone) {
  using namespace std::chrono;
  local_days day = local_days{year{f.year} / month{static_cast<unsigned>(f.month)} /
                              std::chrono::day{static_cast<unsigned>(f.day)}};
  local_seconds wall = day + hours{f.hour} + minutes{f.minute} + seconds{f.second};
  sys_seconds instant = zone.instantAt(wall);
  return CalendarDate(instant, std::move(zone));
}

std::optional<CalendarDate> CalendarDate::fromString(std::string_view text) {
  std::size_t pos = 0;
  Fields f;
  bool negativeYear = expect(text, pos, '-');
  auto year = readNumber(text, pos, 6);
  if (!year || !expect(text, pos, '-')) return std::nullopt;
  auto month = readNumber(text, pos, 2);
  if (!month || !expect(text, pos, '-')) return std::nullopt;
  auto day = readNumber(text, pos, 2);
  if (!day || !expect(text, pos, ' ')) return std::nullopt;
  auto hour = readNumber(text, pos, 2);
  if (!hour || !expect(text, pos, ':')) return std::nullopt;
  auto minute = readNumber(text, pos, 2);
  if (!minute || !expect(text, pos, ':')) return std::nullopt;
  auto second = readNumber(text, pos, 2);
  if (!second || !expect(text, pos, ' ')) return std::nullopt;
  if (pos >= text.size() || (text[pos] != '+' && text[pos] != '-')) return std::nullopt;
  bool west = text[pos++] == '-';
  std::size_t offsetStart = pos;
  auto offset = readNumber(text, pos, 4);
  if (!offset || pos - offsetStart != 4 || pos != text.size()) return std::nullopt;
  f.year = negativeYear ? -*year : *year;
  f.month = *month;
  f.day = *day;
  f.hour = *hour;
  f.minute = *minute;
  f.second = *second;
  if (!validFields(f) || *offset % 100 >= 60) return std::nullopt;

  std::int32_t offsetSeconds = (*offset / 100 * 3600 + *offset % 100 * 60) * (west ? -1 : 1);
  std::optional<TimeZone> zone =
      offsetSeconds == 0 ? TimeZone::gmt() : TimeZone::unnamed(offsetSeconds);
  return fromFields(f, *zone);
}

CalendarDate::Fields CalendarDate::fields() const {
  using namespace std::chrono;
  sys_seconds wall = instant_ + seconds{zone_.secondsFromGMT(instant_)};
  sys_days day = floor<days>(wall);
  year_month_day ymd{day};
  hh_mm_ss<seconds> time{wall - day};
  Fields f;
  f.year = static_cast<int>(ymd.year());
  f.month = static_cast<int>(static_cast<unsigned>(ymd.month()));
  f.day = static_cast<int>(static_cast<unsigned>(ymd.day()));
  f.hour = static_cast<int>(time.hours().count());
  f.minute = static_cast<int>(time.minutes().count());
  f.second = static_cast<int>(time.seconds().count());
  return f;
}

std::string CalendarDate::description() const {
  Fields f = fields();
  std::int32_t offset = zone_.secondsFromGMT(instant_);
  std::int32_t a = offset < 0 ? -offset : offset;
  char text[64];
  std::snprintf(text, sizeof text, "%04d-%02d-%02d %02d:%02d:%02d %c%02d%02d", f.year, f.month,
                f.day, f.hour, f.minute, f.second, offset < 0 ? '-' : '+', a / 3600, a / 60 % 60);
  return text;
}

}  // namespace zt::platform
