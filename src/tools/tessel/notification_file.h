#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/notification_center.h"

namespace tessel::cli {

// The notifications log ($TESSEL_NOTIFICATIONS_LOG) read as it grows: each call answers the
// sync notifications of the whole lines appended since the last one. Without a session bus,
// this is how a running sync is followed.
class NotificationFile {
 public:
  // Reading starts at `offset` (see startOfFollowing).
  NotificationFile(std::filesystem::path path, std::uintmax_t offset)
      : path_(std::move(path)), offset_(offset) {}

  // Where following starts: the end of the file, or for one client whose sync is under way (it
  // began and has not ended), the start of that sync, so a watch started just after the tool
  // misses nothing.
  static std::uintmax_t startOfFollowing(const std::filesystem::path& path,
                                         const std::optional<std::string>& client);

  std::vector<zt::platform::Notification> readNew();

 private:
  std::filesystem::path path_;
  std::uintmax_t offset_;
  std::string pending_;  // the start of a line still being written
};

}  // namespace tessel::cli
