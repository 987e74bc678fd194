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
#include "platform/scoped_environment.h"
#include "platform/temporary_folder.h"
#include "sync/data_class_syncer.h"
#include "sync/zt_sync_manager.h"
#include "tessel/client.h"
#include "tessel/record.h"
#include "tessel/store.h"

namespace zt::contacts::testing {

inline constexpr std::string_view kClientID = "000A27001A2B3C4D";

// The cards of a contacts file as UTF-8, checking its byte-order mark and UTF-16BE form.
std::string cardsOf(const std::string& fileBytes);
std::string readFile(const std::filesystem::path& path);

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
  void TearDown() override;

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

  platform::test_support::TemporaryFolder folder_;
  platform::test_support::ScopedEnvironment environment_;
  std::filesystem::path storePath_;
  std::unique_ptr<tessel::Store> store_;

 private:
  std::uintmax_t logOffset_ = 0;
};

// The first line where two CR LF texts differ, as a readable message; empty when equal.
std::string firstDifference(std::string_view expected, std::string_view actual);

}  // namespace zt::contacts::testing
