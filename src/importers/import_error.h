#pragma once

#include <cstddef>
#include <optional>
#include <stdexcept>
#include <string>

namespace tessel::importers {

// "contacts.vcf: line 12: <text>", or "contacts.vcf: <text>" without a line: how faults and
// warnings point at what they are about.
std::string locatedText(const std::string& source, std::optional<std::size_t> line,
                        const std::string& text);

// What is wrong with an imported file, and where: the file (or the name the text was given)
// and the 1-based line on which the faulty property, card or component starts. Its text reads
// "contacts.vcf: line 12: bad base64 in PHOTO" or "work.ics: line 12: DTSTART: February has
// no day 30".
class ImportError : public std::runtime_error {
 public:
  ImportError(std::string source, std::optional<std::size_t> line, std::string reason);

  const std::string& source() const { return source_; }
  // Absent when the fault is the file as a whole (it cannot be read).
  std::optional<std::size_t> line() const { return line_; }
  const std::string& reason() const { return reason_; }

 private:
  std::string source_;
  std::optional<std::size_t> line_;
  std::string reason_;
};

}  // namespace tessel::importers
