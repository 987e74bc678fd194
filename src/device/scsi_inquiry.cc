#include "device/scsi_inquiry.h"

#include <chrono>
#include <memory>
#include <new>
#include <vector>

#include "platform/log.h"

namespace zt::device {

using platform::Log;

namespace {

constexpr std::uint8_t kInquiryOperation = 0x12;
constexpr std::uint8_t kEnableVitalProductData = 0x01;
// One byte short of the buffer, as the allocation length field of a 6-byte INQUIRY is one
// byte wide.
constexpr std::uint8_t kAllocationLength = 0xFF;
constexpr std::chrono::milliseconds kTimeout{10000};

}  // namespace

std::int32_t executeInquiry(platform::ScsiTaskDevice& device, InquiryBuffer& buffer,
                            std::uint8_t pageCode) {
  std::unique_ptr<platform::ScsiTask> task = device.createTask();
  if (!task) return kInquiryNoTask;
  buffer.fill(0);

  std::vector<platform::ScatterGatherEntry> ranges;
  try {
    ranges.emplace_back(buffer.data(), kAllocationLength);
  } catch (const std::bad_alloc&) {
    Log::debug("Unable to allocate Range");
    return kInquiryNoRange;
  }

  const std::uint8_t cdb[6] = {
      kInquiryOperation, kEnableVitalProductData, pageCode, 0x00, kAllocationLength, 0x00};
  if (!task->setCommandDescriptorBlock(cdb)) {
    Log::debug("Error in SetCommandDescriptorBlock");
    return kInquiryFailed;
  }
  if (!task->setScatterGatherEntries(ranges, kAllocationLength,
                                     platform::TransferDirection::FromDevice)) {
    Log::debug("Error in SetScatterGatherEntries");
    return kInquiryFailed;
  }
  if (!task->setTimeoutDuration(kTimeout)) {
    Log::debug("Error in SetTimeoutDuration");
    return kInquiryFailed;
  }
  if (!task->executeTaskSync()) {
    Log::debug("Error in ExecuteTaskSync");
    return kInquiryFailed;
  }
  return kInquirySuccess;
}

}  // namespace zt::device
