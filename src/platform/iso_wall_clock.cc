#include "platform/iso_wall_clock.h"

#include <cstdio>

#include "platform/calendar_day.h"

namespace zt::platform::iso {

namespace {

bool isDigit(std::string_view text, std::size_t pos) {
  return pos < text.size() && text[pos] >= '0' && text[pos] <= '9';
}

// Reads at most `maxCount` digits; false unless there were at least `minCount`.
bool digits(std::string_view text, std::size_t& pos, std::size_t minCount, std::size_t maxCount,
            std::int64_t& out) {
  const std::size_t start = pos;
  out = 0;
  while (pos - start < maxCount && isDigit(text, pos)) {
    out = out * 10 + (text[pos] - '0');
    ++pos;
  }
  return pos - start >= minCount;
}

bool expect(std::string_view text, std::size_t& pos, char c) {
  if (pos < text.size() && text[pos] == c) {
    ++pos;
    return true;
  }
  return false;
}

std::optional<WallClock> failure(ReadFault* fault, ReadFault why) {
  if (fault != nullptr) *fault = why;
  return std::nullopt;
}

}  // namespace

std::optional<WallClock> readWallClock(std::string_view text, std::size_t& pos, YearForm year,
                                       SecondsForm seconds, ReadFault* fault) {
  WallClock clock;
  const bool extended = year == YearForm::Extended;
  const bool negative = extended && expect(text, pos, '-');
  // Nine digits of year keep the arithmetic far from overflow and cover every 64-bit instant
  // anyone writes down.
  if (!digits(text, pos, 4, extended ? 9 : 4, clock.year) || !expect(text, pos, '-') ||
      !digits(text, pos, 2, 2, clock.month) || !expect(text, pos, '-') ||
      !digits(text, pos, 2, 2, clock.day) || !expect(text, pos, 'T') ||
      !digits(text, pos, 2, 2, clock.hour) || !expect(text, pos, ':') ||
      !digits(text, pos, 2, 2, clock.minute)) {
    return failure(fault, ReadFault::Form);
  }
  if (negative) clock.year = -clock.year;
  if (!expect(text, pos, ':')) {
    if (seconds == SecondsForm::Required) return failure(fault, ReadFault::Form);
    return clock;
  }
  if (!digits(text, pos, 2, 2, clock.second)) return failure(fault, ReadFault::Form);
  if (!expect(text, pos, '.')) return clock;
  std::int64_t fraction = 0;
  const std::size_t start = pos;
  if (!digits(text, pos, 1, 9, fraction)) return failure(fault, ReadFault::Form);
  for (std::size_t n = pos - start; n < 9; ++n) fraction *= 10;
  if (isDigit(text, pos)) return failure(fault, ReadFault::LongFraction);
  clock.nanoseconds = static_cast<std::uint32_t>(fraction);
  return clock;
}

Field firstInvalidField(const WallClock& clock) {
  if (clock.month < 1 || clock.month > 12) return Field::Month;
  if (!isCalendarDay(clock.year, clock.month, clock.day)) return Field::Day;
  if (clock.hour > 23) return Field::Hour;
  if (clock.minute > 59) return Field::Minute;
  if (clock.second > 59) return Field::Second;
  return Field::None;
}

std::string fraction(std::uint32_t nanoseconds) {
  if (nanoseconds == 0) return {};
  char buffer[16];
  std::snprintf(buffer, sizeof buffer, ".%09u", static_cast<unsigned>(nanoseconds));
  std::string text = buffer;
  while (text.back() == '0') text.pop_back();
  return text;
}

}  // namespace zt::platform::iso
