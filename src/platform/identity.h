#pragma once

#include <filesystem>
#include <string>

#include "platform/result.h"

namespace zt::platform {

// What a kept result depends on besides its own inputs: the program that made it, the file
// it was read from, the time-zone rules it used. Each is an opaque text that changes when
// the thing it stands for may have changed; an error when the system cannot tell, and a cache
// must then not be used.

// The GNU build ID of the running program: the linker's digest of the whole executable, so
// any change of the code gives another one.
Result<std::string> programBuildIdentity();

// The device, inode and birth time of the file at `path` (links followed): a file put in its
// place, even under the same name, answers differently. Writes to the file itself do not
// change it.
Result<std::string> fileIdentity(const std::filesystem::path& path);

// The installed time-zone database (its compiled rules file, which every update of the
// database replaces), and its size and modification time.
Result<std::string> timeZoneDatabaseIdentity();

// What the local time zone is chosen from, read without loading the time-zone database:
// $TZ, and /etc/localtime (where it leads, or the file itself) and /etc/timezone.
Result<std::string> localTimeZoneSettingIdentity();

}  // namespace zt::platform
