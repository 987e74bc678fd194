#pragma once

#include <array>
#include <cstdint>

#include "platform/scsi_task_device.h"

namespace zt::device {

// The buffer an INQUIRY answers into, laid out as vital product data: byte 3 is the page
// length n and bytes 4 to 4+n-1 the page's payload.
using InquiryBuffer = std::array<std::uint8_t, 256>;

// Results of executeInquiry.
inline constexpr std::int32_t kInquirySuccess = 0;
inline constexpr std::int32_t kInquiryNoTask = -4;
inline constexpr std::int32_t kInquiryNoRange = -41;
inline constexpr std::int32_t kInquiryFailed = -17;

// Asks the device for one vital product data page (INQUIRY with EVPD, 255 bytes, 10 s)
// into the zeroed buffer. Sense data and task status are not looked at: a page the device
// refuses leaves the buffer zeroed, which reads as an empty page.
std::int32_t executeInquiry(platform::ScsiTaskDevice& device, InquiryBuffer& buffer,
                            std::uint8_t pageCode);

}  // namespace zt::device
