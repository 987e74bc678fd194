#include "platform/linux/mount_info.h"

#include <gtest/gtest.h>

#include <string>

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

// Only a backslash and three octal digits of a byte value are an escape; the file system's
// mount lookup reads its sources through the same parser.
TEST(MountInfo, UndoesOnlyOctalEscapesOfAByte) {
  EXPECT_EQ(unescapeMountInfoField("\\134\\040"), "\\ ");
  EXPECT_EQ(unescapeMountInfoField("a\\9b"), "a\\9b");
  EXPECT_EQ(unescapeMountInfoField("big\\777"), "big\\777");  // more than a byte
  EXPECT_EQ(unescapeMountInfoField("trailing\\"), "trailing\\");
}

}  // namespace
}  // namespace zt::platform
