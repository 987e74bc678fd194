#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/notification_center.h"
#include "support/captured_log.h"
#include "support/files.h"
#include "support/scoped_environment.h"
#include "support/temporary_folder.h"
#include "sync/data_class_syncer.h"
#include "sync/zt_sync_manager.h"
#include "tessel/client.h"
#include "tessel/record.h"
#include "tessel/store.h"

namespace zt::contacts::testing {

inline constexpr std::string_view kClientID = "000A27001A2B3C4D";

using zt::test_support::readFile;
// The cards of a contacts file as UTF-8, checking its byte-order mark and UTF-16BE form.
inline std::string cardsOf(const std::string& bytes) {
  return zt::test_support::utf8OfUtf16BigEndian(bytes);
}

// Whether the virtual player takes contact pictures.
enum class PlayerPhotos { Refused, Accepted };

// What one sync left behind.
struct SyncOutcome {
  std::int32_t lastStatus = 0;
  // The log lines written during the run.
  std::vector<std::string> log;
  // The percentages of the "TesselClientUploadingPhase" notifications, in order.
  std::vector<double> uploadingProgress;

  bool logged(std::string_view line) const;
  std::size_t count(std::string_view line) const;
};

// One virtual player whose volume is a fresh folder, a store with a client registered for
// contacts, and whole syncs run in this process through the real sync manager and
// ZTContactsSyncer. Every log line is captured, debug lines included.
class ContactsSyncTest : public ::testing::Test {
 protected:
  void SetUp() override;

  // Puts records given as typed JSON lines.
  void put(std::string_view jsonLines);
  std::unique_ptr<tessel::Client> client() const;

  using SyncerMaker = std::function<std::unique_ptr<sync::ContactsSyncing>(sync::ZTSyncManager&)>;
  SyncOutcome sync(PlayerPhotos photos = PlayerPhotos::Refused, std::string_view defaults = "",
                   SyncerMaker maker = nullptr);

  std::filesystem::path contactsFolder() const { return folder_ / "vol" / "Contacts"; }
  std::filesystem::path vcfPath() const { return contactsFolder() / "Tessel.vcf"; }
  std::string fileBytes() const;
  // The file's cards as UTF-8 after its byte-order mark, which must be there.
  std::string fileText() const { return cardsOf(fileBytes()); }

  static std::string dataFile(std::string_view name);

  zt::test_support::TemporaryFolder folder_;
  zt::test_support::ScopedEnvironment environment_;
  zt::test_support::CapturedLog log_;
  std::filesystem::path storePath_;
  std::unique_ptr<tessel::Store> store_;

 private:
  std::uintmax_t logOffset_ = 0;
};

}  // namespace zt::contacts::testing
