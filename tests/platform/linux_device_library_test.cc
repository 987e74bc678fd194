#include "platform/linux/linux_device_library.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <vector>

#include "platform/linux/mount_info.h"
#include "platform/linux/unique_id.h"
#include "platform/run_loop.h"

namespace zt::platform {
namespace {

TEST(MountInfo, ParsesFieldsAndUndoesEscapes) {
  const std::string text =
      "22 1 8:1 / / rw,relatime shared:1 - ext4 /dev/sda1 rw\n"
      "97 22 8:17 / /media/me/My\\040Zeto rw,nosuid shared:50 master:3 - vfat /dev/sdb1 rw\n"
      "98 22 8:33 /sub\\134dir /mnt/tab\\011and\\012newline rw - fuseblk "
      "/dev/disk\\040by\\040label rw\n";
  auto entries = parseMountInfo(text);
  ASSERT_EQ(entries.size(), 3u);
  EXPECT_EQ(entries[0].mountId, 22);
  EXPECT_EQ(entries[0].fsType, "ext4");

  // Several optional fields before the separator.
  EXPECT_EQ(entries[1].major, 8u);
  EXPECT_EQ(entries[1].minor, 17u);
  EXPECT_EQ(entries[1].mountPoint, "/media/me/My Zeto");
  EXPECT_EQ(entries[1].source, "/dev/sdb1");

  // No optional field at all; every escaped character of the kernel.
  EXPECT_EQ(entries[2].root, "/sub\\dir");
  EXPECT_EQ(entries[2].mountPoint, "/mnt/tab\tand\nnewline");
  EXPECT_EQ(entries[2].source, "/dev/disk by label");
}

TEST(MountInfo, SkipsLinesWithoutTheMountinfoForm) {
  const std::string text =
      "garbage\n"
      "22 1 8:1 / / rw shared:1 ext4 /dev/sda1 rw\n"  // no separator
      "23 1 81 / /a rw - ext4 /dev/sda1 rw\n"         // no major:minor
      "24 1 8:1 / /b rw -\n"                          // separator at the end
      "25 22 0:5 / /dev/shm rw - tmpfs tmpfs rw";     // last line without its newline
  auto entries = parseMountInfo(text);
  ASSERT_EQ(entries.size(), 1u);
  EXPECT_EQ(entries[0].mountId, 25);
  EXPECT_EQ(entries[0].mountPoint, "/dev/shm");
}

TEST(MountInfo, KeepsBackslashesThatAreNoEscape) {
  EXPECT_EQ(unescapeMountInfoField("a\\9b"), "a\\9b");
  EXPECT_EQ(unescapeMountInfoField("big\\777"), "big\\777");
  EXPECT_EQ(unescapeMountInfoField("\\134\\040"), "\\ ");
}

TEST(MountInfo, ReadsThisProcesssTable) {
  auto text = readMountInfo();
  ASSERT_TRUE(text);
  auto entries = parseMountInfo(*text);
  ASSERT_FALSE(entries.empty());
  bool hasRoot = false;
  for (const auto& entry : entries) hasRoot = hasRoot || entry.mountPoint == "/";
  EXPECT_TRUE(hasRoot);
}

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
