#include "contacts/contacts_sync_fixture.h"

#include <fstream>
#include <sstream>

#include "contacts/zt_contacts_syncer.h"
#include "platform/file_system.h"
#include "platform/log.h"
#include "platform/run_loop.h"
#include "platform/user_defaults.h"
#include "platform/utf16.h"
#include "platform/virtual/virtual_device_library.h"
#include "sync/sync_services.h"
#include "tessel/record_json.h"
#include "tessel/schema.h"

namespace zt::contacts::testing {

std::string readFile(const std::filesystem::path& path) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream text;
  text << in.rdbuf();
  return text.str();
}

namespace {

class RecordingCenter final : public platform::NotificationCenter {
 public:
  void post(std::string_view name, std::string_view sender,
            const platform::Dictionary& userInfo) override {
    posted.push_back({std::string(name), std::string(sender), userInfo});
  }
  std::vector<platform::Notification> posted;
};

std::vector<std::string> splitLines(std::string_view text, std::string_view end) {
  std::vector<std::string> lines;
  std::size_t start = 0;
  while (start < text.size()) {
    std::size_t stop = text.find(end, start);
    if (stop == std::string_view::npos) stop = text.size();
    lines.emplace_back(text.substr(start, stop - start));
    start = stop + end.size();
  }
  return lines;
}

}  // namespace

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
  environment_.set("ZETOSYNCTOOL_LOG", (folder_ / "log").string());
  platform::Log::configureFromEnvironment();
  platform::Log::setDebugEnabled(true);

  storePath_ = folder_ / "truth.db";
  store_ = tessel::Store::open(storePath_);
  store_->registerClient(kClientID, "Zeto", sync::ZTSyncManager::entitiesForContacts());
}

void ContactsSyncTest::TearDown() {
  platform::Log::setDebugEnabled(false);
  environment_.unset("ZETOSYNCTOOL_LOG");
  platform::Log::configureFromEnvironment();
}

void ContactsSyncTest::put(std::string_view jsonLines) {
  store_->putRecords(tessel::parseRecordLines(jsonLines));
}

std::unique_ptr<tessel::Client> ContactsSyncTest::client() const {
  return store_->clientWithIdentifier(kClientID);
}

std::string ContactsSyncTest::dataFile(std::string_view name) {
  return readFile(std::filesystem::path(ZT_TEST_DATA_DIR) / "data" / name);
}

SyncOutcome ContactsSyncTest::sync(PlayerPhotos photos, std::string_view defaults,
                                   SyncerMaker maker) {
  platform::VirtualDeviceLibrary devices((folder_ / "devices.json").string());
  RecordingCenter center;
  const platform::UserDefaults userDefaults = platform::UserDefaults::fromText(defaults);
  const platform::FileSystem files;
  sync::SyncServices services{
      devices,
      center,
      userDefaults,
      files,
      platform::RunLoop::current(),
      storePath_,
      sync::SyncerMakers{.contacts = maker ? maker : SyncerMaker(makeContactsSyncer),
                         .calendars = nullptr},
      [photos](const std::string&) { return photos == PlayerPhotos::Accepted; }};

  SyncOutcome outcome;
  {
    sync::ZTSyncManager manager(std::string(kClientID), std::move(services));
    manager.doSync();
    outcome.lastStatus = manager.lastStatus();
  }
  const std::string log = readFile(folder_ / "log");
  outcome.log = splitLines(std::string_view(log).substr(logOffset_), "\n");
  logOffset_ = log.size();
  for (const platform::Notification& notification : center.posted) {
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
  return readFile(vcfPath());
}

std::string cardsOf(const std::string& bytes) {
  EXPECT_GE(bytes.size(), 2u);
  if (bytes.size() < 2) return {};
  EXPECT_EQ(bytes.substr(0, 2), "\xFE\xFF") << "the file must open with one byte-order mark";
  EXPECT_EQ(bytes.size() % 2, 0u);
  std::u16string units;
  for (std::size_t i = 2; i + 1 < bytes.size(); i += 2) {
    units.push_back(static_cast<char16_t>((static_cast<unsigned char>(bytes[i]) << 8) |
                                          static_cast<unsigned char>(bytes[i + 1])));
  }
  return platform::utf16::toUtf8(units);
}

std::string firstDifference(std::string_view expected, std::string_view actual) {
  const std::vector<std::string> want = splitLines(expected, "\r\n");
  const std::vector<std::string> got = splitLines(actual, "\r\n");
  for (std::size_t i = 0; i < std::max(want.size(), got.size()); ++i) {
    const std::string* w = i < want.size() ? &want[i] : nullptr;
    const std::string* g = i < got.size() ? &got[i] : nullptr;
    if (w && g && *w == *g) continue;
    std::ostringstream message;
    message << "line " << i + 1 << " differs\n  expected: " << (w ? *w : "(end of text)")
            << "\n  actual:   " << (g ? *g : "(end of text)");
    return message.str();
  }
  if (expected != actual) return "the texts differ in their line ends";
  return {};
}

}  // namespace zt::contacts::testing
