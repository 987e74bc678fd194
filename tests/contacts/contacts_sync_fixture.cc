#include "contacts/contacts_sync_fixture.h"

#include <fstream>

#include "contacts/zt_contacts_syncer.h"
#include "support/in_process_sync.h"
#include "tessel/record_json.h"
#include "tessel/schema.h"

namespace zt::contacts::testing {

namespace {}  // namespace

bool SyncOutcome::logged(std::string_view line) const {
  return count(line) > 0;
}

std::size_t SyncOutcome::count(std::string_view line) const {
  std::size_t n = 0;
  for (const std::string& written : log) n += written == line ? 1 : 0;
  return n;
}

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

std::unique_ptr<tessel::Client> ContactsSyncTest::client() const {
  return store_->clientWithIdentifier(kClientID);
}

std::string ContactsSyncTest::dataFile(std::string_view name) {
  return zt::test_support::readFile(std::filesystem::path(ZT_TEST_DATA_DIR) / "data" / name);
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

std::string ContactsSyncTest::fileBytes() const {
  return zt::test_support::readFile(vcfPath());
}

}  // namespace zt::contacts::testing
