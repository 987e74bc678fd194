#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

// ISO 8601 wall-clock times as the tool's texts write them, "2026-11-21T10:00:00.5": read
// field by field first and checked afterwards, so that each reader can say (or not) which
// part is wrong, and go on with what follows (a zone designator, say).
namespace zt::platform::iso {

// The fields as written, not yet checked against the calendar or the clock.
struct WallClock {
  std::int64_t year = 0, month = 0, day = 0, hour = 0, minute = 0, second = 0;
  std::uint32_t nanoseconds = 0;
};

enum class YearForm {
  // Exactly four digits.
  FourDigits,
  // An optional "-" and four to nine digits: every year a 64-bit instant reaches.
  Extended,
};

enum class SecondsForm { Required, Optional };

enum class ReadFault {
  // Not "YYYY-MM-DDTHH:MM[:SS[.fraction]]".
  Form,
  // More than nine fractional digits, finer than a nanosecond.
  LongFraction,
};

// Reads "YYYY-MM-DDTHH:MM[:SS[.fraction]]" at `pos` and moves `pos` past it. None, with
// `fault` filled in when given, when the text there is not of that form; whatever follows
// is the caller's.
std::optional<WallClock> readWallClock(std::string_view text, std::size_t& pos, YearForm year,
                                       SecondsForm seconds, ReadFault* fault = nullptr);

// The first field, in the order written, that names no day or time.
enum class Field { None, Month, Day, Hour, Minute, Second };
Field firstInvalidField(const WallClock& clock);

// ".5", ".000001": the fraction of a second without its trailing zeros; empty for none.
std::string fraction(std::uint32_t nanoseconds);

}  // namespace zt::platform::iso
