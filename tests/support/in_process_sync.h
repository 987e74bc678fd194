#pragma once

// Header only: included by the tests that link the sync library.

#include <filesystem>
#include <functional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/file_system.h"
#include "platform/notification_center.h"
#include "platform/run_loop.h"
#include "platform/user_defaults.h"
#include "platform/virtual/virtual_device_library.h"
#include "sync/sync_services.h"

namespace zt::test_support {

// What a sync manager run in the test's process needs: the virtual players of a device file,
// the tool's defaults from text, the real file system and this thread's run loop. The
// notifications it posts are kept.
class InProcessSync {
 public:
  InProcessSync(const std::filesystem::path& deviceFile, std::string_view defaults)
      : devices_(deviceFile.string()), defaults_(platform::UserDefaults::fromText(defaults)) {}

  sync::SyncServices services(std::filesystem::path storePath, sync::SyncerMakers makers,
                              std::function<bool(const std::string&)> photos) {
    return {devices_,
            center_,
            defaults_,
            files_,
            platform::RunLoop::current(),
            std::move(storePath),
            std::move(makers),
            std::move(photos)};
  }
  const std::vector<platform::Notification>& posted() const { return center_.posted; }

 private:
  class RecordingCenter final : public platform::NotificationCenter {
   public:
    void post(std::string_view name, std::string_view sender,
              const platform::Dictionary& userInfo) override {
      posted.push_back({std::string(name), std::string(sender), userInfo});
    }
    std::vector<platform::Notification> posted;
  };

  platform::VirtualDeviceLibrary devices_;
  RecordingCenter center_;
  const platform::UserDefaults defaults_;
  const platform::FileSystem files_{};
};

}  // namespace zt::test_support
