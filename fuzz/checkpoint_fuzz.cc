// Fuzzes what a player sends the probe: the pages its self-description arrives in, joined
// into one document, and the document's parsing.
//
// The input is read twice. Whole, it is a self-description document. As pages: byte 0 is the
// length of the table of contents (page 0xC0) and the bytes after it are the table; then,
// for each code of the table in order, one byte of payload length and that many payload
// bytes answer the page; one more byte, when present, names a page that fails.
#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <vector>

#include "device/checkpoint_data.h"
#include "device/contact_pictures.h"
#include "device/driver_entry_lookup.h"
#include "platform/virtual/virtual_hardware_registry.h"
#include "platform/virtual/virtual_scsi_pass_through.h"
#include "support/virtual_scsi_faults.h"

namespace {

using zt::platform::VirtualScsiPassThrough;

class Reader {
 public:
  explicit Reader(std::span<const std::uint8_t> input) : input_(input) {}
  std::optional<std::uint8_t> byte() {
    if (position_ >= input_.size()) return std::nullopt;
    return input_[position_++];
  }
  std::vector<std::uint8_t> bytes(std::size_t count) {
    count = std::min(count, input_.size() - position_);
    std::vector<std::uint8_t> taken(
        input_.begin() + static_cast<std::ptrdiff_t>(position_),
        input_.begin() + static_cast<std::ptrdiff_t>(position_ + count));
    position_ += count;
    return taken;
  }

 private:
  std::span<const std::uint8_t> input_;
  std::size_t position_ = 0;
};

void fuzzPages(std::span<const std::uint8_t> input) {
  zt::platform::VirtualPlayer player;
  player.volume = "/nonexistent";
  const std::vector<zt::platform::VirtualPlayer> players{player};
  zt::platform::VirtualHardwareRegistry registry(players);
  VirtualScsiPassThrough passThrough(players);
  zt::test_support::ScsiFaults faults;
  passThrough.setFaults(&faults);

  Reader reader(input);
  auto& pages = faults.pages;
  const std::vector<std::uint8_t> table = reader.bytes(reader.byte().value_or(0));
  pages[0xC0] = table;
  for (std::uint8_t code : table) {
    auto length = reader.byte();
    if (!length) break;
    if (!pages.contains(code)) pages[code] = reader.bytes(*length);
  }
  if (auto failing = reader.byte()) faults.failingPages.insert(*failing);

  std::optional<zt::platform::RegistryEntry> driver;
  if (!zt::device::findDriverEntry(registry, "/dev/zetovirt0", zt::device::kZetoDriverClassNames,
                                   &driver)) {
    __builtin_trap();
  }
  if (auto data = zt::device::readCheckpointData(passThrough, *driver)) {
    zt::device::checkpointSupportsContactPictures(*data);
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::span<const std::uint8_t> input(data, size);
  zt::device::checkpointSupportsContactPictures(input);
  fuzzPages(input);
  return 0;
}
