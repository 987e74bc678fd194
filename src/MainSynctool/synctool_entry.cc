#include "MainSynctool/synctool_entry.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "MainSynctool/run_report.h"
#include "calendars/zt_calendars_syncer.h"
#include "contacts/zt_contacts_syncer.h"
#include "device/contact_pictures.h"
#include "platform/device_library.h"
#include "platform/file_system.h"
#include "platform/log.h"
#include "platform/notification_center.h"
#include "platform/process_memory.h"
#include "platform/run_loop.h"
#include "platform/terminal.h"
#include "platform/user_defaults.h"
#include "sync/sync_status.h"
#include "sync/zt_sync_manager.h"
#include "tessel/client.h"

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

// A person at a terminal reads what the log alone would tell a journal.
bool onTerminal() {
  return platform::isTerminal(platform::StandardStream::Error);
}

void tellTerminal(const std::string& line) {
  std::fprintf(stderr, "%s\n", line.c_str());
  std::fflush(stderr);
}

// Whether the store exists and holds the client, asked after the run for its summary.
RunFacts factsAfter(const ZTSyncManager& manager, const std::filesystem::path& storePath,
                    const RunReport& written) {
  RunFacts facts;
  facts.lastStatus = manager.lastStatus();
  facts.reportedStatus = sync::reportedStatus(facts.lastStatus);
  facts.clientID = manager.syncClientID();
  facts.storePath = storePath;
  facts.written = written;
  if (facts.reportedStatus == 0 && (written.contactsWritten || written.calendarsWritten)) {
    return facts;
  }
  std::error_code error;
  facts.storeExists = std::filesystem::exists(storePath, error);
  if (facts.storeExists) {
    try {
      facts.clientExists = tessel::Store::open(storePath, tessel::StoreOpening::MustExist)
                               ->clientWithIdentifier(facts.clientID) != nullptr;
    } catch (...) {
      facts.clientExists = true;  // unreadable: the log says why
    }
  }
  return facts;
}

}  // namespace

void usage() {
  Log::always("zetosynctool --oneshot --sync <sync_client_id>");
  // With the log on standard error, the line is already there.
  const char* log = std::getenv("ZETOSYNCTOOL_LOG");
  const bool logOnTerminal = log != nullptr && std::string_view(log) == "stderr";
  if (onTerminal() && !logOnTerminal) {
    tellTerminal("usage: zetosynctool --oneshot --sync <sync_client_id>");
  }
}

int synctoolMain(int argc, const char* const argv[]) {
  Log::setDebugEnabled(platform::UserDefaults::standard().boolForKey("DebugLog").value_or(false));

  std::optional<std::string> syncClientID;
  bool versionAsked = false;
  for (int index = 1; index < argc; ++index) {
    if (std::strcmp(argv[index], "--version") == 0) versionAsked = true;
    if (std::strcmp(argv[index], "--sync") == 0) {
      ++index;
      if (index < argc) syncClientID = argv[index];
    }
  }
  if (!syncClientID) {
    if (versionAsked && onTerminal()) tellTerminal("zetosynctool " ZT_PROJECT_VERSION);
    usage();
    return 1;
  }

  // The photo conversions of a first sync run on several threads; what one frees, the next
  // batch reuses instead of each thread keeping its own.
  platform::useOneMemoryArena();
  Log::debug("Starting sync for Zeto with ID %@", *syncClientID);
  static Tool* tool = new Tool;
  auto report = std::make_shared<RunReport>();
  const std::filesystem::path storePath = tessel::Store::resolvePath();
  SyncerMakers makers{.contacts = contacts::makeContactsSyncer,
                      .calendars = calendars::makeCalendarsSyncer};
  // The report is read only for the terminal's line: without one, nothing looks at the files.
  const bool reporting = onTerminal();
  if (reporting) makers = reportingMakers(std::move(makers), report);
  SyncServices services{*tool->devices,
                        platform::NotificationCenter::system(),
                        platform::UserDefaults::standard(),
                        tool->files,
                        platform::RunLoop::current(),
                        storePath,
                        std::move(makers),
                        [](const std::string& volumePath) {
                          return device::deviceSupportsContactPictures(volumePath);
                        }};
  tool->manager = std::make_unique<ZTSyncManager>(std::move(*syncClientID), std::move(services));
  tool->manager->doSync();
  Log::debug("Done sync'ing Zeto");
  if (reporting) tellTerminal(outcomeLine(factsAfter(*tool->manager, storePath, *report)));
  return 0;
}

}  // namespace zt::synctool
