#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>

#include "sync/data_class_syncer.h"

namespace zt::synctool {

// What one run wrote onto the player, seen from outside the syncers: the files of their folders
// that a run replaced. It changes nothing the run does and is read only for the summary line.
struct RunReport {
  std::optional<std::size_t> contactsWritten;   // cards of a rewritten Tessel.vcf
  std::optional<std::size_t> calendarsWritten;  // calendar files written
};

// The syncer makers of the tool, each syncer wrapped so that it fills in `report`.
sync::SyncerMakers reportingMakers(sync::SyncerMakers makers, std::shared_ptr<RunReport> report);

// Why a run ended as it did, found after the run.
struct RunFacts {
  std::int32_t reportedStatus = 0;  // the final notification's status
  std::int32_t lastStatus = 0;      // the manager's own outcome code
  std::string clientID;
  std::filesystem::path storePath;
  bool storeExists = true;
  bool clientExists = true;
  RunReport written;
};

// The one line a person at a terminal reads at the end of a run, such as
// "zetosynctool: synced: Contacts/Tessel.vcf (31 contacts), 3 calendars".
std::string outcomeLine(const RunFacts& facts);

}  // namespace zt::synctool
