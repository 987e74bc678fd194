#pragma once

#include <cstddef>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include "platform/value.h"
#include "tessel/record.h"

namespace tessel {

// The typed JSON form of records: the text that `tessel records put` reads and
// `tessel records list --json` writes, one record per line:
//   {"id": "<record id>", "record": {<key>: <value>, ...}}
// Keys keep their record order both ways. Values that JSON has no kind for are objects with
// one `$` key: {"$url": ...}, {"$data": "<base64>"}, {"$date": "2007-03-15T12:30:00", "tz": ZONE}.

// What is wrong with a typed JSON text, and where: the line of a JSON Lines text (when
// reading one) and the path of keys and array indexes down to the faulty value.
class RecordJsonError : public std::runtime_error {
 public:
  RecordJsonError(std::optional<std::size_t> line, std::string path, std::string reason);

  // 1-based line number; absent when the text was not read as JSON Lines.
  std::optional<std::size_t> line() const { return line_; }
  // `record."start date".tz`, `record."exception dates"[2]`; empty for the whole text.
  const std::string& path() const { return path_; }
  const std::string& reason() const { return reason_; }

 private:
  std::optional<std::size_t> line_;
  std::string path_;
  std::string reason_;
};

// Compact JSON of one value or one record. A dictionary key that starts with `$` cannot be
// written (it would read back as a typed value): RecordJsonError.
std::string valueToJson(const zt::platform::Value& value);
std::string recordToJson(const zt::platform::Dictionary& record);
// One JSON Lines line, without the line end.
std::string recordToJsonLine(std::string_view id, const zt::platform::Dictionary& record);

// Strict readers: anything but exactly the typed form is a RecordJsonError, never a crash.
zt::platform::Value valueFromJson(std::string_view json);
zt::platform::Dictionary recordFromJson(std::string_view json);

// Reads a whole JSON Lines text before the caller writes anything, so that a fault on any
// line leaves the store untouched. Blank lines are skipped. Each record must name its entity
// under TesselRecordEntityNameKey, and an identifier may appear only once.
std::vector<Record> parseRecordLines(std::string_view text);

}  // namespace tessel
