#include "device/scsi_inquiry.h"

#include <gtest/gtest.h>

#include <optional>
#include <vector>

#include "device/checkpoint_data.h"
#include "device/probe_test_support.h"
#include "device/sense_data.h"
#include "platform/linux/linux_scsi_pass_through.h"
#include "platform/virtual/virtual_hardware_registry.h"
#include "platform/virtual/virtual_scsi_pass_through.h"
#include "support/virtual_scsi_faults.h"

namespace zt::device {
namespace {

using test_support::CapturedLog;

TEST(ExecuteInquiry, EachFailingStepHasItsResultAndMessage) {
  using platform::VirtualScsiStep;
  struct Case {
    VirtualScsiStep step;
    std::int32_t result;
    const char* message;
  };
  const Case cases[] = {
      {VirtualScsiStep::CreateTask, kInquiryNoTask, nullptr},
      {VirtualScsiStep::SetCommandDescriptorBlock, kInquiryFailed,
       "Error in SetCommandDescriptorBlock"},
  };
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
  for (const Case& c : cases) {
    SCOPED_TRACE(static_cast<int>(c.step));
    CapturedLog log;
    faults.failingSteps = {c.step};
    InquiryBuffer buffer{};
    EXPECT_EQ(executeInquiry(*device, buffer, 0xC0), c.result);
    if (c.message) {
      EXPECT_TRUE(log.has(c.message));
    }
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

TEST(ExecuteInquiry, NodesThatAreNotScsiDevicesFailCleanly) {
  zt::test_support::TemporaryFolder folder;
  test_support::writeFile(folder / "plain", "not a disk");
  for (const std::filesystem::path& node : {std::filesystem::path("/dev/null"), folder / "plain"}) {
    SCOPED_TRACE(node);
    CapturedLog log;
    auto device = platform::LinuxScsiPassThrough::openTaskDevice({.disk = node, .generic = {}});
    ASSERT_TRUE(device);
    ASSERT_TRUE(device->obtainExclusiveAccess());
    InquiryBuffer buffer{};
    EXPECT_EQ(executeInquiry(*device, buffer, 0xC0), kInquiryFailed);
    EXPECT_TRUE(log.has("Error in ExecuteTaskSync"));
    device->releaseExclusiveAccess();
  }
  // A scsi-generic node that is a plain file: the exclusive open works, SG_IO does not.
  auto device =
      platform::LinuxScsiPassThrough::openTaskDevice({.disk = {}, .generic = folder / "plain"});
  ASSERT_TRUE(device);
  EXPECT_FALSE(device->createTask()) << "no node is open before exclusive access";
  ASSERT_TRUE(device->obtainExclusiveAccess());
  InquiryBuffer buffer{};
  EXPECT_EQ(executeInquiry(*device, buffer, 0xC0), kInquiryFailed);

  EXPECT_FALSE(
      platform::LinuxScsiPassThrough::openTaskDevice({.disk = folder / "missing", .generic = {}}));
}

TEST(SenseData, LogsKeyCodeAndQualifier) {
  CapturedLog log;
  std::vector<std::uint8_t> sense(18, 0);
  sense[0] = 0x70;
  sense[2] = 0xF5;  // flags in the high bits, ILLEGAL REQUEST below
  sense[12] = 0x24;
  sense[13] = 0x01;
  logSenseData(sense);
  EXPECT_EQ(log.last(), "Key: $05, ASC: $24, ASCQ: $01  ");
}

}  // namespace
}  // namespace zt::device
