#pragma once

#include <cstddef>
#include <optional>
#include <stdexcept>
#include <string>

namespace tessel {

// What is wrong with an iCalendar input, and where: the file (as the user named it) and the
// 1-based line on which the faulty content line or component starts. Its text reads
// "work.ics: line 12: DTSTART: February has no day 30".
class ICalError : public std::runtime_error {
 public:
  ICalError(std::string source, std::optional<std::size_t> line, std::string reason);

  const std::string& source() const { return source_; }
  // Absent when the fault is the source as a whole (it cannot be read).
  std::optional<std::size_t> line() const { return line_; }
  const std::string& reason() const { return reason_; }

 private:
  std::string source_;
  std::optional<std::size_t> line_;
  std::string reason_;
};

}  // namespace tessel
