#include "device/checkpoint_data.h"

#include <gtest/gtest.h>

#include <optional>
#include <string>
#include <vector>

#include "device/driver_entry_lookup.h"
#include "device/probe_test_support.h"
#include "platform/virtual/virtual_hardware_registry.h"
#include "platform/virtual/virtual_scsi_pass_through.h"
#include "support/virtual_scsi_faults.h"

namespace zt::device {
namespace {

using platform::VirtualScsiPassThrough;
using platform::VirtualScsiStep;
using test_support::bytesOf;
using test_support::CapturedLog;
using test_support::checkpointDocument;
using test_support::textOf;
using test_support::VirtualPlayerFolder;

constexpr std::size_t kPage = VirtualScsiPassThrough::kPagePayload;

// One virtual player, its registry and pass-through, and the driver entry the probe would
// have found for it.
class CheckpointTest : public ::testing::Test {
 protected:
  void usePlayer(std::optional<std::string> document) {
    player_.emplace(std::move(document));
    registry_.emplace(player_->players());
    passThrough_.emplace(player_->players());
    faults_ = {};  // each player starts without faults
    passThrough_->setFaults(&faults_);
    ASSERT_TRUE(findDriverEntry(*registry_, "/dev/zetovirt0", kZetoDriverClassNames, &driver_));
  }

  std::optional<CheckpointData> read() { return readCheckpointData(*passThrough_, *driver_); }
  VirtualScsiPassThrough& passThrough() { return *passThrough_; }
  const std::vector<std::uint8_t>& inquiries() { return passThrough_->trace().inquiries; }

  CapturedLog log_;
  zt::test_support::ScsiFaults faults_;

 private:
  std::optional<VirtualPlayerFolder> player_;
  std::optional<platform::VirtualHardwareRegistry> registry_;
  std::optional<VirtualScsiPassThrough> passThrough_;
  std::optional<platform::RegistryEntry> driver_;
};

TEST_F(CheckpointTest, SixtyTwoPagesAreTheMostThatAreRead) {
  const std::string document = checkpointDocument("<true/>", 62 * kPage);
  ASSERT_EQ(document.size(), 62 * kPage);
  usePlayer(document);
  auto data = read();
  ASSERT_TRUE(data);
  EXPECT_EQ(textOf(*data), document);
  EXPECT_EQ(inquiries().size(), 63u);

  // One byte more needs a 63rd page: the table is refused and no page is asked for.
  usePlayer(checkpointDocument("<true/>", 62 * kPage + 1));
  EXPECT_FALSE(read());
  EXPECT_EQ(inquiries(), std::vector<std::uint8_t>{0xC0});
}

TEST_F(CheckpointTest, TableIsCheckedWholeBeforeAnyPageIsRead) {
  usePlayer(checkpointDocument("<true/>", 3 * kPage));
  faults_.pages[0xC0] = {0xC2, 0xC3, 0xC1};
  EXPECT_FALSE(read());
  EXPECT_EQ(inquiries(), std::vector<std::uint8_t>{0xC0});

  // 0xC2 is the lowest page the table may list.
  usePlayer(checkpointDocument("<true/>", 2 * kPage));
  faults_.pages[0xC0] = {0xC3, 0xC2};
  auto data = read();
  ASSERT_TRUE(data);
  EXPECT_EQ(inquiries(), (std::vector<std::uint8_t>{0xC0, 0xC3, 0xC2}));
  const std::string document = checkpointDocument("<true/>", 2 * kPage);
  EXPECT_EQ(textOf(*data), document.substr(kPage) + document.substr(0, kPage));

  // An empty or failing table, or pages that all come back empty, make no document.
  usePlayer(checkpointDocument("<true/>"));
  faults_.pages[0xC0] = {};
  EXPECT_FALSE(read());
  usePlayer(checkpointDocument("<true/>"));
  faults_.failingPages = {0xC0};
  EXPECT_FALSE(read());
  usePlayer(checkpointDocument("<true/>"));
  faults_.pages[0xC0] = {0xC2};
  faults_.pages[0xC2] = {};
  EXPECT_FALSE(read());
  EXPECT_EQ(inquiries(), (std::vector<std::uint8_t>{0xC0, 0xC2}));
}

TEST_F(CheckpointTest, FailedMiddlePageLeavesGapFailedLastPageLosesAll) {
  const std::string document = checkpointDocument("<true/>", 3 * kPage);
  usePlayer(document);
  faults_.failingPages = {0xC3};
  auto data = read();
  ASSERT_TRUE(data);
  EXPECT_EQ(textOf(*data), document.substr(0, kPage) + document.substr(2 * kPage));
  EXPECT_EQ(inquiries(), (std::vector<std::uint8_t>{0xC0, 0xC2, 0xC3, 0xC4}));

  usePlayer(document);
  faults_.failingPages = {0xC4};
  EXPECT_FALSE(read());
  EXPECT_EQ(inquiries().size(), 4u);
}

TEST_F(CheckpointTest, PayloadEndsWithTheTransfer) {
  // A page whose length byte claims more than a 255-byte transfer can carry: only what
  // arrived is kept.
  usePlayer(checkpointDocument("<true/>"));
  faults_.pages[0xC0] = {0xC2};
  faults_.pages[0xC2] = std::vector<std::uint8_t>(255, 'a');
  auto data = read();
  ASSERT_TRUE(data);
  EXPECT_EQ(data->size(), 251u);
}

TEST_F(CheckpointTest, EntityTheParserRejectsIsOverwritten) {
  const std::string document = checkpointDocument("<true/>");
  std::string withEntities = document;
  withEntities.replace(withEntities.find("Zeto 4"), 6, "Z&xff;eto&xff;4");
  usePlayer(withEntities);
  auto data = read();
  ASSERT_TRUE(data);
  EXPECT_EQ(data->size(), withEntities.size());
  EXPECT_NE(textOf(*data).find("<string>Z00000eto000004</string>"), std::string::npos);

  // The search stops at a NUL byte.
  CheckpointData bytes = bytesOf(std::string("&xff;&xff\0&xff;", 15));
  replaceUnparsableEntities(bytes);
  EXPECT_EQ(textOf(bytes), std::string("00000&xff\0&xff;", 15));
}

TEST_F(CheckpointTest, ResourcesAreGivenBackWhateverHappens) {
  for (VirtualScsiStep step : {VirtualScsiStep::CreatePlugIn, VirtualScsiStep::CreateTask}) {
    SCOPED_TRACE(static_cast<int>(step));
    usePlayer(checkpointDocument("<true/>"));
    faults_.failingSteps = {step};
    EXPECT_FALSE(read());
    EXPECT_EQ(passThrough().trace().exclusiveAccessHeld, 0);
    EXPECT_EQ(passThrough().trace().openPlugIns, 0);
  }
  usePlayer(checkpointDocument("<true/>", 3 * kPage));
  faults_.failingPages = {0xC3};
  EXPECT_TRUE(read());
  EXPECT_EQ(passThrough().trace().exclusiveAccessHeld, 0);
  EXPECT_EQ(passThrough().trace().openPlugIns, 0);
}

}  // namespace
}  // namespace zt::device
