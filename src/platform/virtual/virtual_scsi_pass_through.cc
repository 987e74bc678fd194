#include "platform/virtual/virtual_scsi_pass_through.h"

#include <algorithm>
#include <fstream>
#include <iterator>
#include <utility>

#include "platform/virtual/virtual_hardware_registry.h"

namespace zt::platform {
namespace {

constexpr std::uint8_t kInquiry = 0x12;
constexpr std::uint8_t kTableOfContents = 0xC0;
constexpr std::uint8_t kFirstPage = 0xC2;

using Bytes = std::vector<std::uint8_t>;

std::optional<Bytes> readDocument(const std::optional<std::string>& path) {
  if (!path) return std::nullopt;
  std::ifstream file(*path, std::ios::binary);
  if (!file) return std::nullopt;
  return Bytes(std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>());
}

// The player: its document cut into pages, and the faults it suffers.
class VirtualPlayerPages {
 public:
  VirtualPlayerPages(std::optional<Bytes> document, VirtualScsiPassThrough& owner)
      : document_(std::move(document)), owner_(owner) {}

  bool fails(VirtualScsiStep step) const {
    return owner_.faults() && owner_.faults()->stepFails(step);
  }
  VirtualScsiPassThrough::Trace& trace() { return owner_.mutableTrace(); }

  // The payload of a page; none when the player has no such page.
  std::optional<Bytes> payload(std::uint8_t page) const {
    if (const VirtualScsiFaults* faults = owner_.faults()) {
      if (faults->pageFails(page)) return std::nullopt;
      if (auto injected = faults->injectedPage(page)) return injected;
    }
    if (!document_) return std::nullopt;
    const std::size_t count = (document_->size() + VirtualScsiPassThrough::kPagePayload - 1) /
                              VirtualScsiPassThrough::kPagePayload;
    if (page == kTableOfContents) {
      // Codes past 0xFF wrap around, as a one-byte code would on a device with too much to say.
      Bytes codes;
      for (std::size_t i = 0; i < std::min<std::size_t>(count, 255); ++i) {
        codes.push_back(static_cast<std::uint8_t>(kFirstPage + i));
      }
      return codes;
    }
    if (page < kFirstPage || static_cast<std::size_t>(page - kFirstPage) >= count) {
      return std::nullopt;
    }
    const std::size_t begin =
        static_cast<std::size_t>(page - kFirstPage) * VirtualScsiPassThrough::kPagePayload;
    const std::size_t end =
        std::min(document_->size(), begin + VirtualScsiPassThrough::kPagePayload);
    return Bytes(document_->begin() + static_cast<std::ptrdiff_t>(begin),
                 document_->begin() + static_cast<std::ptrdiff_t>(end));
  }

 private:
  std::optional<Bytes> document_;
  VirtualScsiPassThrough& owner_;
};

class VirtualScsiTask final : public ScsiTask {
 public:
  explicit VirtualScsiTask(VirtualPlayerPages& player) : player_(player) {}

  bool setCommandDescriptorBlock(std::span<const std::uint8_t> cdb) override {
    if (player_.fails(VirtualScsiStep::SetCommandDescriptorBlock)) return false;
    if (cdb.empty() || cdb.size() > 16) return false;
    cdb_.assign(cdb.begin(), cdb.end());
    return true;
  }

  bool setScatterGatherEntries(std::span<const ScatterGatherEntry> entries,
                               std::uint64_t transferCount, TransferDirection direction) override {
    if (player_.fails(VirtualScsiStep::SetScatterGatherEntries)) return false;
    std::uint64_t room = 0;
    for (const auto& entry : entries) room += entry.size();
    if (transferCount > room) return false;
    entries_.assign(entries.begin(), entries.end());
    transferCount_ = transferCount;
    direction_ = direction;
    return true;
  }

  bool setTimeoutDuration(std::chrono::milliseconds timeout) override {
    if (player_.fails(VirtualScsiStep::SetTimeout)) return false;
    return timeout.count() > 0;
  }

  std::optional<ScsiTaskOutcome> executeTaskSync() override {
    // The players understand INQUIRY for vital product data and nothing else.
    if (cdb_.size() != 6 || cdb_[0] != kInquiry || (cdb_[1] & 0x01) == 0) return std::nullopt;
    if (direction_ != TransferDirection::FromDevice) return std::nullopt;
    const std::uint8_t page = cdb_[2];
    player_.trace().inquiries.push_back(page);
    auto payload = player_.payload(page);
    if (!payload) return std::nullopt;

    Bytes answer = {0x00, page, 0x00,
                    static_cast<std::uint8_t>(std::min<std::size_t>(payload->size(), 255))};
    answer.insert(answer.end(), payload->begin(), payload->end());
    // The device sends no more than the allocation length, and the host takes no more than
    // the transfer count.
    const std::size_t allocation = cdb_[4];
    std::size_t remaining = std::min<std::size_t>(
        {answer.size(), allocation, static_cast<std::size_t>(transferCount_)});
    ScsiTaskOutcome outcome;
    std::size_t offset = 0;
    for (const auto& entry : entries_) {
      const std::size_t piece = std::min(remaining, entry.size());
      std::copy_n(answer.begin() + static_cast<std::ptrdiff_t>(offset), piece, entry.begin());
      offset += piece;
      remaining -= piece;
    }
    outcome.bytesTransferred = offset;
    return outcome;
  }

 private:
  VirtualPlayerPages& player_;
  Bytes cdb_;
  std::vector<ScatterGatherEntry> entries_;
  std::uint64_t transferCount_ = 0;
  TransferDirection direction_ = TransferDirection::None;
};

class VirtualScsiTaskDevice final : public ScsiTaskDevice {
 public:
  explicit VirtualScsiTaskDevice(VirtualPlayerPages& player) : player_(player) {}
  ~VirtualScsiTaskDevice() override { releaseExclusiveAccess(); }

  bool obtainExclusiveAccess() override {
    if (player_.fails(VirtualScsiStep::ExclusiveAccess)) return false;
    if (!held_) ++player_.trace().exclusiveAccessHeld;
    held_ = true;
    return true;
  }

  void releaseExclusiveAccess() override {
    if (held_) --player_.trace().exclusiveAccessHeld;
    held_ = false;
  }

  std::unique_ptr<ScsiTask> createTask() override {
    if (player_.fails(VirtualScsiStep::CreateTask)) return nullptr;
    return std::make_unique<VirtualScsiTask>(player_);
  }

 private:
  VirtualPlayerPages& player_;
  bool held_ = false;
};

class VirtualScsiPlugIn final : public ScsiPlugIn {
 public:
  VirtualScsiPlugIn(std::optional<Bytes> document, VirtualScsiPassThrough& owner)
      : player_(std::move(document), owner) {
    ++player_.trace().openPlugIns;
  }
  ~VirtualScsiPlugIn() override { --player_.trace().openPlugIns; }

  std::unique_ptr<ScsiTaskDevice> scsiTaskDevice() override {
    if (player_.fails(VirtualScsiStep::QueryTaskDevice)) return nullptr;
    return std::make_unique<VirtualScsiTaskDevice>(player_);
  }

 private:
  VirtualPlayerPages player_;
};

}  // namespace

VirtualScsiPassThrough::VirtualScsiPassThrough(std::optional<std::vector<VirtualPlayer>> players)
    : players_(std::move(players)) {}

std::unique_ptr<ScsiPlugIn> VirtualScsiPassThrough::createPlugIn(const RegistryEntry& entry) {
  if (!players_ || (faults_ && faults_->stepFails(VirtualScsiStep::CreatePlugIn))) return nullptr;
  auto index = VirtualHardwareRegistry::playerOfNubPath(entry.path());
  if (!index || *index >= players_->size()) return nullptr;
  // The document is read when the player is opened, as a device reports what it is now.
  return std::make_unique<VirtualScsiPlugIn>(readDocument((*players_)[*index].checkpoint), *this);
}

}  // namespace zt::platform
