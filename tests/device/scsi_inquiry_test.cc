#include "device/scsi_inquiry.h"

#include <gtest/gtest.h>

#include <optional>
#include <utility>

#include "device/checkpoint_data.h"
#include "device/probe_test_support.h"
#include "platform/virtual/virtual_hardware_registry.h"
#include "platform/virtual/virtual_scsi_pass_through.h"
#include "support/virtual_scsi_faults.h"

namespace zt::device {
namespace {

using test_support::CapturedLog;

TEST(ExecuteInquiry, EachFailingStepHasItsResultAndMessage) {
  using platform::VirtualScsiStep;
  test_support::VirtualPlayerFolder player(test_support::checkpointDocument("<true/>"));
  platform::VirtualHardwareRegistry registry(player.players());
  platform::VirtualScsiPassThrough passThrough(player.players());
  zt::test_support::ScsiFaults faults;
  passThrough.setFaults(&faults);
  std::optional<platform::RegistryIterator> media = registry.matchingServices({"zetovirt0"});
  ASSERT_TRUE(media);
  auto nub = registry.parent(*registry.parent(*media->next()));
  ASSERT_TRUE(nub);
  auto plugIn = passThrough.createPlugIn(*nub);
  ASSERT_TRUE(plugIn);
  auto device = plugIn->scsiTaskDevice();
  ASSERT_TRUE(device);
  for (const auto& [step, result] :
       {std::pair{VirtualScsiStep::CreateTask, kInquiryNoTask},
        std::pair{VirtualScsiStep::SetCommandDescriptorBlock, kInquiryFailed}}) {
    faults.failingSteps = {step};
    InquiryBuffer buffer{};
    EXPECT_EQ(executeInquiry(*device, buffer, 0xC0), result);
  }
  faults.failingSteps.clear();
  InquiryBuffer buffer;
  buffer.fill(0xAA);
  EXPECT_EQ(executeInquiry(*device, buffer, 0xC0), kInquirySuccess);
  // The buffer is zeroed first, so what the device did not send reads as zeros.
  EXPECT_EQ(buffer[255], 0);
  EXPECT_EQ(buffer[1], 0xC0);
  // The short document fills two pages.
  EXPECT_EQ(buffer[3], 2);
  EXPECT_EQ(buffer[4], 0xC2);
  EXPECT_EQ(buffer[5], 0xC3);
}

}  // namespace
}  // namespace zt::device
