// Fuzzes the vCard import over arbitrary bytes: reading the cards, decoding every value
// (encodings, charsets, escapes) and building the records, both refusing faults and stepping
// over them with warnings. A malformed input must end in ImportError or warnings, never in a
// crash, a leak or another exception.
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "importers/import_error.h"
#include "importers/vcard_import.h"

namespace {

void readAndCheck(std::string_view text, tessel::importers::OnFault onFault) {
  tessel::importers::ImportWarnings warnings(onFault);
  tessel::importers::VCardImport import(warnings);
  try {
    import.addText(text, "fuzz.vcf");
  } catch (const tessel::importers::ImportError&) {
    return;
  }
  // Converted cards always make records that name their entity, with unique identifiers.
  const auto records = import.records();
  for (const tessel::Record& record : records) {
    if (record.id.empty() || record.record.empty()) __builtin_trap();
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  readAndCheck(text, tessel::importers::OnFault::Refuse);
  readAndCheck(text, tessel::importers::OnFault::Skip);
  return 0;
}
