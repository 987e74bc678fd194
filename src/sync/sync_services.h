#pragma once

#include <filesystem>
#include <functional>
#include <string>

#include "platform/device_library.h"
#include "platform/file_system.h"
#include "platform/notification_center.h"
#include "platform/run_loop.h"
#include "platform/user_defaults.h"
#include "sync/data_class_syncer.h"

namespace zt::sync {

// The platform services one run uses, chosen by whoever starts the run (the program, or a
// test with its own store and players). The manager owns none of them.
struct SyncServices {
  platform::DeviceLibrary& devices;
  platform::NotificationCenter& notifications;
  const platform::UserDefaults& defaults;
  const platform::FileSystem& files;
  platform::RunLoop& runLoop;
  // The engine's store file.
  std::filesystem::path storePath;
  SyncerMakers syncers;
  // Whether the player mounted at the volume path takes contact pictures; answers false
  // when it cannot tell. None: no player is ever asked.
  std::function<bool(const std::string& volumePath)> deviceSupportsContactPictures;
  // How long to wait for the player's volume to mount before giving up. The program keeps
  // this; tests shorten it.
  double mountWaitSeconds = 20.0;
};

}  // namespace zt::sync
