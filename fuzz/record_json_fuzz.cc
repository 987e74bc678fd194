// Fuzzes the typed JSON lines that `tessel records put` reads: any input ends in records or in
// RecordJsonError, never in a crash, a leak or another exception. What is read is written back
// and must read again as the same records, so nothing is lost on the way through.
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "tessel/record_json.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  std::vector<tessel::Record> records;
  try {
    records = tessel::parseRecordLines(text);
  } catch (const tessel::RecordJsonError&) {
    return 0;
  }
  std::string written;
  for (const tessel::Record& record : records) {
    written += tessel::recordToJsonLine(record.id, record.record);
    written += '\n';
  }
  std::vector<tessel::Record> again;
  try {
    again = tessel::parseRecordLines(written);
  } catch (const tessel::RecordJsonError&) {
    __builtin_trap();  // what the writer wrote, the reader must read
  }
  if (again.size() != records.size()) __builtin_trap();
  for (std::size_t i = 0; i < records.size(); ++i) {
    if (again[i].id != records[i].id || !(again[i].record == records[i].record)) __builtin_trap();
  }
  return 0;
}
