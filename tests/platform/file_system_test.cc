#include "platform/file_system.h"

#include <gtest/gtest.h>

#include "support/temporary_folder.h"

namespace zt::platform {
namespace {

using zt::test_support::TemporaryFolder;

class FileSystemTest : public ::testing::Test {
 protected:
  FileSystem fs;
  TemporaryFolder folder;
};

TEST_F(FileSystemTest, StatisticsOfAMountedFolder) {
  const auto statistics = fs.statistics(folder.path());
  ASSERT_TRUE(statistics.has_value());
  EXPECT_GT(statistics->blockSize, 0u);
  EXPECT_GE(statistics->totalBlocks, statistics->freeBlocks);
  EXPECT_GE(statistics->freeBlocks, statistics->availableBlocks);
  EXPECT_TRUE(statistics->mountedFrom.has_value());
  EXPECT_EQ(fs.statistics(folder / "absent"), std::nullopt);
}

}  // namespace
}  // namespace zt::platform
