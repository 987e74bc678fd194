#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "support/captured_log.h"
#include "support/files.h"
#include "support/scoped_environment.h"
#include "support/temporary_folder.h"
#include "sync/data_class_syncer.h"
#include "sync/zt_sync_manager.h"
#include "tessel/client.h"
#include "tessel/store.h"

namespace zt::contacts::testing {

inline constexpr std::string_view kClientID = "000A27001A2B3C4D";

// Whether the virtual player takes contact pictures.
enum class PlayerPhotos { Refused, Accepted };

// What one sync left behind: its status, the log lines written during the run and the
// percentages of its "TesselClientUploadingPhase" notifications.
struct SyncOutcome {
  std::int32_t lastStatus = 0;
  std::vector<std::string> log;
  std::vector<double> uploadingProgress;

  std::size_t count(std::string_view line) const {
    return static_cast<std::size_t>(std::count(log.begin(), log.end(), line));
  }
  bool logged(std::string_view line) const { return count(line) > 0; }
};

// One virtual player whose volume is a fresh folder, a store with a client registered for
// contacts, and whole syncs run in this process through the real sync manager and
// ZTContactsSyncer. Every log line is captured, debug lines included.
class ContactsSyncTest : public ::testing::Test {
 protected:
  void SetUp() override;

  // Puts records given as typed JSON lines.
  void put(std::string_view jsonLines);
  std::unique_ptr<tessel::Client> client() const { return store_->clientWithIdentifier(kClientID); }

  using SyncerMaker = std::function<std::unique_ptr<sync::ContactsSyncing>(sync::ZTSyncManager&)>;
  SyncOutcome sync(PlayerPhotos photos = PlayerPhotos::Refused, std::string_view defaults = "",
                   SyncerMaker maker = nullptr);

  std::filesystem::path vcfPath() const { return folder_ / "vol" / "Contacts" / "Tessel.vcf"; }
  std::string fileBytes() const { return zt::test_support::readFile(vcfPath()); }
  // The file's cards as UTF-8 after its byte-order mark, which must be there.
  std::string fileText() const { return zt::test_support::utf8OfUtf16BigEndian(fileBytes()); }
  static std::string dataFile(std::string_view name) {
    return zt::test_support::readFile(std::filesystem::path(ZT_TEST_DATA_DIR) / "data" / name);
  }

  zt::test_support::TemporaryFolder folder_;
  zt::test_support::ScopedEnvironment environment_;
  zt::test_support::CapturedLog log_;
  std::filesystem::path storePath_;
  std::unique_ptr<tessel::Store> store_;

 private:
  std::size_t logOffset_ = 0;
};

}  // namespace zt::contacts::testing
