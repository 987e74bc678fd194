#include "MainSynctool/synctool_entry.h"

#include <cstring>
#include <memory>
#include <optional>
#include <string>

#include "calendars/zt_calendars_syncer.h"
#include "contacts/zt_contacts_syncer.h"
#include "device/contact_pictures.h"
#include "platform/device_library.h"
#include "platform/file_system.h"
#include "platform/log.h"
#include "platform/notification_center.h"
#include "platform/run_loop.h"
#include "platform/user_defaults.h"
#include "sync/zt_sync_manager.h"

namespace zt::synctool {

using platform::Log;
using sync::SyncerMakers;
using sync::SyncServices;
using sync::ZTSyncManager;

namespace {

// Everything one run needs. It is made once and never torn down: the process ends with it
// alive, so the manager's teardown does not run on the way out.
struct Tool {
  std::unique_ptr<platform::DeviceLibrary> devices = platform::makeDeviceLibrary();
  platform::FileSystem files;
  std::unique_ptr<ZTSyncManager> manager;
};

}  // namespace

void usage() {
  Log::always("zetosynctool --oneshot --sync <sync_client_id>");
}

int synctoolMain(int argc, const char* const argv[]) {
  Log::setDebugEnabled(platform::UserDefaults::standard().boolForKey("DebugLog").value_or(false));

  std::optional<std::string> syncClientID;
  for (int index = 1; index < argc; ++index) {
    if (std::strcmp(argv[index], "--sync") == 0) {
      ++index;
      if (index < argc) syncClientID = argv[index];
    }
  }
  if (!syncClientID) {
    usage();
    return 1;
  }

  Log::debug("Starting sync for Zeto with ID %@", *syncClientID);
  static Tool* tool = new Tool;
  SyncServices services{*tool->devices,
                        platform::NotificationCenter::system(),
                        platform::UserDefaults::standard(),
                        tool->files,
                        platform::RunLoop::current(),
                        tessel::Store::resolvePath(),
                        SyncerMakers{.contacts = contacts::makeContactsSyncer,
                                     .calendars = calendars::makeCalendarsSyncer},
                        [](const std::string& volumePath) {
                          return device::deviceSupportsContactPictures(volumePath);
                        }};
  tool->manager = std::make_unique<ZTSyncManager>(std::move(*syncClientID), std::move(services));
  tool->manager->doSync();
  Log::debug("Done sync'ing Zeto");
  return 0;
}

}  // namespace zt::synctool
