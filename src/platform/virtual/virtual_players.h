#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/result.h"

namespace zt::platform {

// One simulated Zeto player of the virtual device file ($ZETO_VIRTUAL_DEVICES), an array of
//   {"id": "000A27001A2B3C4D", "volume": "/path/to/dir", "mounted": true,
//    "mount_after": 1.5, "checkpoint": "/path/to/self-description.xml"}
// "id" (1 to 16 hexadecimal digits) and "volume" are required. "mounted" is false by default
// when "mount_after" is given, true otherwise; an unmounted player with "mount_after" mounts
// that many seconds after registration for events, one without it never mounts.
struct VirtualPlayer {
  std::uint64_t uniqueId = 0;
  std::string volume;
  bool mounted = true;
  std::optional<double> mountAfter;       // seconds, not negative
  std::optional<std::string> checkpoint;  // the self-description document its probe answers
};

// The players of a device file's text, in file order; the reason when the text is not a
// valid device file.
Result<std::vector<VirtualPlayer>> parseVirtualPlayers(std::string_view json);
// The same for a file.
Result<std::vector<VirtualPlayer>> loadVirtualPlayers(const std::string& path);

// The device file named by $ZETO_VIRTUAL_DEVICES; none when the variable is unset or empty.
std::optional<std::string> virtualDeviceFileFromEnvironment();

// The device file a virtual player's volume is mounted from: "/dev/zetovirtN", N its index in
// the device file. The second function reads the index back.
std::string virtualDeviceNode(std::size_t index);
std::optional<std::size_t> virtualPlayerIndexOfNode(std::string_view node);

}  // namespace zt::platform
