#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>

#include "filters/zeto_contact_filter.h"
#include "platform/atomic_file.h"
#include "sync/data_class_syncer.h"
#include "tessel/change_enumerator.h"
#include "tessel/snapshot.h"

namespace zt::sync {
class ZTSyncManager;
}

namespace zt::contacts {

// The contacts half of one sync: accepts every contact change the session offers, decides
// whether "Tessel.vcf" on the player must be rewritten, and if so builds it whole from the
// truth snapshot and writes it. The file is rewritten when anything changed, and also
// whenever the tool cannot be sure that the player holds the file it wrote last time with
// the same settings. It is the contact filter's helper for as long as it lives.
class ZTContactsSyncer final : public sync::ContactsSyncing {
 public:
  // Keeps the first contact filter of the sync client's filter list.
  explicit ZTContactsSyncer(sync::ZTSyncManager& syncManager);
  ~ZTContactsSyncer() override;
  ZTContactsSyncer(const ZTContactsSyncer&) = delete;
  ZTContactsSyncer& operator=(const ZTContactsSyncer&) = delete;

  // The whole contacts step, progress included. False when the run must stop; the manager's
  // status then says why.
  bool doSync() override;

  // Accepts the changes and decides whether to push (shouldPushFile).
  bool getChanges();
  // Builds the file: one card per selected contact, in UTF-16BE after one byte-order mark; no
  // bytes at all when no contact is selected. The cards go to a temporary file beside
  // Tessel.vcf as they are made, so the whole text is never in memory.
  bool disassembleData();
  // Puts the built file in place on the player, remembers its date and the photo setting with
  // the sync client, and commits the accepted changes.
  bool uploadChanges();

  // The session's truth snapshot, fetched at the first call.
  std::shared_ptr<tessel::Snapshot> contactTruthSnapshot();
  // The filter's groups and, breadth first, every group they contain, computed once. Each
  // group is expanded once, so groups that contain each other end.
  const std::set<std::string>& expandedFilteredGroupsIDs();
  bool shouldApplyContactGroupWithIdentifier(const std::string& identifier) override;

  bool shouldPushFile() const { return _shouldPushFile; }

  static constexpr std::string_view kFileName = "Tessel.vcf";
  // Settings kept with the sync client: the date of the file last written, and whether it
  // carried photos.
  static constexpr std::string_view kLastModDateForVCF = "LastModDateForVCF";
  static constexpr std::string_view kDidSyncContactImages = "DidSyncContactImages";

 private:
  bool fileOnZetoNeedsPush();
  bool photoSettingNeedsPush();
  bool isSelected(const platform::Dictionary& contact);
  // Appends UTF-16BE bytes to the file being built; writes them out once enough are waiting,
  // or all of them with Flush::All.
  enum class Flush { WhenFull, All };
  void appendToFile(std::string_view utf8, Flush flush);

  sync::ZTSyncManager& _syncManager;
  // Declared and never used: the manager keeps the status.
  [[maybe_unused]] int _lastStatus = 0;
  std::shared_ptr<filters::ZetoContactFilter> _contactFilter;
  std::optional<tessel::ChangeEnumerator> _contactChangeEnumerator;
  std::shared_ptr<tessel::Snapshot> _contactTruthSnapshot;
  // The file being built: its temporary file on the player (none when it could not be made
  // or a write failed, and the upload then fails), the bytes not yet written, and the size.
  std::optional<platform::AtomicFile> _vcardFile;
  std::string _vcardPending;
  std::uint64_t _vcardSize = 0;
  bool _shouldPushFile = false;
  std::optional<std::set<std::string>> _filteredGroups;
};

// The maker the tool gives its sync manager.
std::unique_ptr<sync::ContactsSyncing> makeContactsSyncer(sync::ZTSyncManager& syncManager);

}  // namespace zt::contacts
