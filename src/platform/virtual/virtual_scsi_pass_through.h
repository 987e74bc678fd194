#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/scsi_pass_through.h"
#include "platform/virtual/virtual_players.h"

namespace zt::platform {

// The steps of a conversation with a virtual player that a test can make fail.
enum class VirtualScsiStep {
  CreatePlugIn,
  QueryTaskDevice,
  ExclusiveAccess,
  CreateTask,
  SetCommandDescriptorBlock,
  SetScatterGatherEntries,
  SetTimeout,
};

// Where a test makes the players misbehave (tests/support/virtual_scsi_faults.h): a step
// that fails, an INQUIRY page that fails or answers with other bytes (0xC0 included: its
// payload is the list of page codes, its length the page count).
class VirtualScsiFaults {
 public:
  virtual ~VirtualScsiFaults() = default;
  virtual bool stepFails(VirtualScsiStep step) const = 0;
  virtual bool pageFails(std::uint8_t page) const = 0;
  virtual std::optional<std::vector<std::uint8_t>> injectedPage(std::uint8_t page) const = 0;
};

// SCSI pass-through to the virtual players. The plug-in of player N's nub
// (VirtualHardwareRegistry) answers INQUIRY for vital product data pages from the player's
// "checkpoint" document, split into pages of at most 251 bytes: page 0xC0 gives their count
// and lists their codes 0xC2, 0xC3... in order (a document too long for 62 pages gives a
// table the probe refuses), and each listed page carries its piece. Without a readable
// document every INQUIRY fails.
class VirtualScsiPassThrough final : public ScsiPassThrough {
 public:
  // What the players were asked.
  struct Trace {
    std::vector<std::uint8_t> inquiries;  // page codes, in the order asked
    int exclusiveAccessHeld = 0;          // obtained and not yet released
    int openPlugIns = 0;
  };

  static constexpr std::size_t kPagePayload = 251;

  // None: the device file could not be read, and no plug-in can be made.
  explicit VirtualScsiPassThrough(std::optional<std::vector<VirtualPlayer>> players);

  std::unique_ptr<ScsiPlugIn> createPlugIn(const RegistryEntry& entry) override;

  // None: the players answer as their documents say. The faults outlive their use here.
  void setFaults(const VirtualScsiFaults* faults) { faults_ = faults; }
  const VirtualScsiFaults* faults() const { return faults_; }
  const Trace& trace() const { return trace_; }
  // For the player objects this pass-through hands out, which record into it.
  Trace& mutableTrace() { return trace_; }

 private:
  std::optional<std::vector<VirtualPlayer>> players_;
  const VirtualScsiFaults* faults_ = nullptr;
  Trace trace_;
};

}  // namespace zt::platform
