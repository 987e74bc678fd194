#include "platform/linux/linux_device_library.h"

#include <gtest/gtest.h>

#include "platform/linux/unique_id.h"

namespace zt::platform {
namespace {

TEST(UniqueId, SerialsOfOneToSixteenHexDigits) {
  EXPECT_EQ(parseUniqueId("000A27001A2B3C4D"), 0xA27001A2B3C4DULL);
  EXPECT_EQ(parseUniqueId("1a2B"), 0x1A2BULL);
  EXPECT_EQ(parseUniqueId("FFFFFFFFFFFFFFFF"), UINT64_MAX);
  EXPECT_EQ(parseUniqueId("10000000000000000"), std::nullopt);  // 17 digits
  EXPECT_EQ(parseUniqueId("0x12"), std::nullopt);
  EXPECT_EQ(parseUniqueId("WD-WCC4E1234567"), std::nullopt);  // an ordinary disk's serial
  EXPECT_EQ(formatUniqueId(0xA27001A2B3C4DULL), "A27001A2B3C4D");
}

}  // namespace
}  // namespace zt::platform
