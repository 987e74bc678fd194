#include "platform/linux/linux_device_library.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <vector>

#include "platform/linux/unique_id.h"
#include "platform/run_loop.h"

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

bool machineHasUsbDisks() {
  std::error_code error;
  for (const auto& link : std::filesystem::directory_iterator("/dev/disk/by-id", error)) {
    if (link.path().filename().string().starts_with("usb-")) return true;
  }
  return false;
}

TEST(LinuxDeviceLibrary, EnumeratesThisMachine) {
  LinuxDeviceLibrary library;
  std::vector<ZetoRef> devices;
  ASSERT_EQ(library.ZetoCopyConnected(devices), kZetoSuccess);
  if (!machineHasUsbDisks()) {
    EXPECT_TRUE(devices.empty());
  }
  for (ZetoRef device : devices) {
    std::string path;
    std::int32_t result = library.ZetoCopyMountpoint(device, path);
    EXPECT_TRUE(result == kZetoSuccess || result == kZetoErrorNotMounted) << result;
  }
}

TEST(LinuxDeviceLibrary, RegistrationWatchesWithinItsModeOnly) {
  RunLoop loop;  // outlives the registration
  LinuxDeviceLibrary library;
  int events = 0;
  auto callback = [](ZetoRef, std::int32_t, void*, void* context) {
    ++*static_cast<int*>(context);
  };
  ASSERT_EQ(library.ZetoRegisterWithServer(loop, "ZetoMode", callback, &events), kZetoSuccess);
  EXPECT_EQ(loop.runInMode("Other", 0.1, RunLoop::ReturnAfter::SourceHandled),
            RunLoop::RunResult::NoSources);
  // Its sources stay quiet on a machine where nothing is attached or mounted meanwhile.
  auto result = loop.runInMode("ZetoMode", 0.2, RunLoop::ReturnAfter::TimeElapsed);
  EXPECT_EQ(result, RunLoop::RunResult::TimedOut);
  EXPECT_EQ(events, 0);
  EXPECT_EQ(library.ZetoUnregisterFromServer(), kZetoSuccess);
  EXPECT_EQ(loop.runInMode("ZetoMode", 0.1, RunLoop::ReturnAfter::SourceHandled),
            RunLoop::RunResult::NoSources);
}

}  // namespace
}  // namespace zt::platform
