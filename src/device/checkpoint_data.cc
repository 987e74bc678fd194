#include "device/checkpoint_data.h"

#include <algorithm>
#include <memory>
#include <new>
#include <string_view>

#include "device/scsi_inquiry.h"
#include "platform/log.h"

namespace zt::device {

using platform::Log;

namespace {

constexpr std::uint8_t kTableOfContents = 0xC0;
// 0xC0 is the table and 0xC1 is not part of the document; pages start above.
constexpr std::uint8_t kLastReservedPage = 0xC1;
constexpr std::size_t kMaxPages = 62;
// A page's payload ends where the 255-byte transfer ends, whatever its length byte claims.
constexpr std::size_t kMaxPayload = 255 - 4;

constexpr std::string_view kUnparsableEntity = "&xff;";

std::optional<CheckpointData> readPages(platform::ScsiTaskDevice& device) {
  InquiryBuffer buffer;
  Log::debug("Injecting command");
  if (executeInquiry(device, buffer, kTableOfContents) != kInquirySuccess) {
    Log::debug("Error getting first checkpoint");
    return std::nullopt;
  }
  const std::size_t pageCount = buffer[3];
  if (pageCount > kMaxPages) {
    Log::debug("Invalid Checkpoint page count");
    return std::nullopt;
  }
  if (pageCount == 0) {
    Log::debug("0 entry in TOC");
    return std::nullopt;
  }
  const std::vector<std::uint8_t> pages(
      buffer.begin() + 4, buffer.begin() + 4 + static_cast<std::ptrdiff_t>(pageCount));
  for (std::size_t index = 0; index < pages.size(); ++index) {
    if (pages[index] <= kLastReservedPage) {
      Log::debug("Invalid Checkpoint page index #%ul", index);
      return std::nullopt;
    }
  }

  CheckpointData data;
  try {
    data.reserve(pageCount * buffer.size());
  } catch (const std::bad_alloc&) {
    Log::debug("Can't allocate memory for data");
    return std::nullopt;
  }
  std::int32_t result = kInquirySuccess;
  for (std::uint8_t page : pages) {
    result = executeInquiry(device, buffer, page);
    if (result != kInquirySuccess) continue;
    const std::size_t length = std::min<std::size_t>(buffer[3], kMaxPayload);
    data.insert(data.end(), buffer.begin() + 4,
                buffer.begin() + 4 + static_cast<std::ptrdiff_t>(length));
  }
  // Only the last page's failure counts: an earlier one has merely left a gap.
  if (result != kInquirySuccess) return std::nullopt;
  return data;
}

}  // namespace

void replaceUnparsableEntities(CheckpointData& data) {
  // One pass finds what searching again from the start after each replacement would: the
  // zeros written cannot be part of another occurrence.
  std::size_t index = 0;
  while (index + kUnparsableEntity.size() <= data.size() && data[index] != 0) {
    if (std::equal(kUnparsableEntity.begin(), kUnparsableEntity.end(),
                   data.begin() + static_cast<std::ptrdiff_t>(index))) {
      std::fill_n(data.begin() + static_cast<std::ptrdiff_t>(index), kUnparsableEntity.size(), '0');
      index += kUnparsableEntity.size();
    } else {
      ++index;
    }
  }
}

std::optional<CheckpointData> readCheckpointData(platform::ScsiPassThrough& passThrough,
                                                 const platform::RegistryEntry& driver) {
  Log::debug("Getting plugin interface");
  std::unique_ptr<platform::ScsiPlugIn> plugIn = passThrough.createPlugIn(driver);
  if (!plugIn) return std::nullopt;
  Log::debug("Getting SCSI Interface");
  std::unique_ptr<platform::ScsiTaskDevice> device = plugIn->scsiTaskDevice();
  if (!device) return std::nullopt;
  Log::debug("Acquiring exclusive access to the device");
  if (!device->obtainExclusiveAccess()) return std::nullopt;

  std::optional<CheckpointData> data = readPages(*device);

  device->releaseExclusiveAccess();
  device.reset();
  plugIn.reset();

  if (!data || data->empty()) return std::nullopt;
  replaceUnparsableEntities(*data);
  Log::debug("Checkpoint data is %ul bytes long", data->size());
  return data;
}

}  // namespace zt::device
