// Fuzzes the typed JSON lines that `tessel records put` reads: any input ends in records or in
// RecordJsonError, never in a crash, a leak or another exception. What is read is written back
// and must read again as the same records, so nothing is lost on the way through. A line that
// the quick scanner takes must read the same when its text is read whole by the thorough reader.
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "tessel/record_json.h"
#include "tessel/record_json_scanner.h"

namespace {

void checkScannedLine(std::string_view line) {
  tessel::typed_json::RecordLineScanner scanner;
  const std::optional<tessel::Record> scanned = scanner.scan(line);
  if (!scanned) return;
  zt::platform::Dictionary whole;
  try {
    whole = tessel::recordFromJson(line);
  } catch (const tessel::RecordJsonError&) {
    __builtin_trap();  // the scanner took a line that the thorough reader refuses
  }
  const std::string* id = whole.stringAt("id");
  const zt::platform::Dictionary* record = whole.dictionaryAt("record");
  if (id == nullptr || *id != scanned->id || record == nullptr || !(*record == scanned->record)) {
    __builtin_trap();
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  for (std::string_view rest = text; !rest.empty();) {
    const std::size_t end = rest.find('\n');
    checkScannedLine(rest.substr(0, end));
    rest = end == std::string_view::npos ? std::string_view{} : rest.substr(end + 1);
  }
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
