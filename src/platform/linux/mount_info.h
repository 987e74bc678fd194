#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace zt::platform {

// One line of /proc/self/mountinfo, with the kernel's octal escapes ("\040" for a space)
// undone in the path fields.
struct MountInfoEntry {
  int mountId = 0;
  int parentId = 0;
  unsigned major = 0;
  unsigned minor = 0;
  std::string root;        // the folder of the file system that is mounted
  std::string mountPoint;  // where it is mounted
  std::string fsType;
  std::string source;  // what it is mounted from: "/dev/sdb1", "tmpfs"...
};

// The entries of a mountinfo text, in the file's order; lines that do not have the
// mountinfo form are left out.
std::vector<MountInfoEntry> parseMountInfo(std::string_view text);

// Undoes the octal escapes ("\040", "\011", "\012", "\134") of a mountinfo field.
std::string unescapeMountInfoField(std::string_view field);

// The text of /proc/self/mountinfo; none when it cannot be read.
std::optional<std::string> readMountInfo();

}  // namespace zt::platform
