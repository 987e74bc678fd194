#include "contacts/contacts_sync_fixture.h"

#include <fstream>

#include "contacts/zt_contacts_syncer.h"
#include "support/in_process_sync.h"
#include "tessel/record_json.h"
#include "tessel/schema.h"

namespace zt::contacts::testing {

void ContactsSyncTest::SetUp() {
  std::filesystem::create_directories(folder_ / "vol");
  const std::filesystem::path devices = folder_ / "devices.json";
  std::ofstream(devices) << R"([{"id": ")" << kClientID << R"(", "volume": ")"
                         << (folder_ / "vol").string() << R"(", "mounted": true}])";
  environment_.set("ZETO_VIRTUAL_DEVICES", devices.string());
  environment_.set("XDG_RUNTIME_DIR", folder_.path().string());
  // The photo cache of the process stays out of the user's own.
  environment_.set("XDG_CACHE_HOME", (folder_ / "cache").string());

  storePath_ = folder_ / "truth.db";
  store_ = tessel::Store::open(storePath_);
  store_->registerClient(kClientID, "Zeto", sync::ZTSyncManager::entitiesForContacts());
}

void ContactsSyncTest::put(std::string_view jsonLines) {
  store_->putRecords(tessel::parseRecordLines(jsonLines));
}

SyncOutcome ContactsSyncTest::sync(PlayerPhotos photos, std::string_view defaults,
                                   SyncerMaker maker) {
  zt::test_support::InProcessSync inProcess(folder_ / "devices.json", defaults);
  sync::SyncServices services = inProcess.services(
      storePath_,
      sync::SyncerMakers{.contacts = maker ? maker : SyncerMaker(makeContactsSyncer),
                         .calendars = nullptr},
      [photos](const std::string&) { return photos == PlayerPhotos::Accepted; });

  SyncOutcome outcome;
  {
    sync::ZTSyncManager manager(std::string(kClientID), std::move(services));
    manager.doSync();
    outcome.lastStatus = manager.lastStatus();
  }
  const std::string log = log_.text();
  outcome.log = zt::test_support::splitLines(std::string_view(log).substr(logOffset_));
  logOffset_ = log.size();
  for (const platform::Notification& notification : inProcess.posted()) {
    const platform::Value* phase = notification.userInfo.find("TesselClientCurrentPhase");
    const platform::Value* percent =
        notification.userInfo.find("TesselClientPercentProgressionPhase");
    if (phase && *phase == platform::Value("TesselClientUploadingPhase") && percent &&
        percent->asNumber()) {
      outcome.uploadingProgress.push_back(percent->asNumber()->doubleValue());
    }
  }
  return outcome;
}

}  // namespace zt::contacts::testing
