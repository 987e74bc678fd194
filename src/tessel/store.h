#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/value.h"
#include "tessel/client.h"
#include "tessel/record.h"
#include "tessel/snapshot.h"

namespace tessel {

namespace detail {
class Database;
}

enum class StoreOpening { CreateIfMissing, MustExist };

// Writes that belong together, applied by Store::applyChanges in one transaction: records put,
// then records deleted (unknown identifiers are ignored; the others leave the relationships
// that name them), then the calendar order replaced.
struct StoreChanges {
  std::vector<Record> put;
  std::vector<std::string> remove;
  std::optional<std::vector<std::string>> calendarOrder;
};

struct AppliedChanges {
  std::size_t written = 0;
  std::size_t deleted = 0;
};
enum class MissingRecords { Ignore, Fail };

// The engine's store: one SQLite file holding truth, clients, their mirrors and sessions.
// It plays the engine's shared manager: clients and the out-of-session snapshot come from it.
// Every write is one transaction, so a failure or a killed process leaves nothing half done.
class Store {
 public:
  // The path rules: the given path, else $TESSEL_STORE, else $XDG_DATA_HOME/tessel/truth.db,
  // else ~/.local/share/tessel/truth.db.
  static std::filesystem::path resolvePath(
      const std::optional<std::filesystem::path>& given = std::nullopt);

  // Opens (creating the file and its folders when allowed) and migrates the schema. Raises
  // TesselStoreException when the file cannot be used.
  static std::unique_ptr<Store> open(const std::filesystem::path& path,
                                     StoreOpening opening = StoreOpening::CreateIfMissing);
  ~Store();

  const std::filesystem::path& path() const;
  int schemaVersion() const;
  // The store-wide generation: it grows with every record written or deleted.
  std::int64_t generation() const;

  // Truth. Each record names its entity under TesselRecordEntityNameKey
  // (TesselInvalidRecordException otherwise). Records equal to the stored ones are left as
  // they are; the others are inserted or replaced. Answers how many were written.
  std::size_t putRecords(const std::vector<Record>& records);
  // Leaves tombstones and takes the deleted identifiers out of every relationship that names
  // them (those records get new generations); answers how many were deleted. With
  // MissingRecords::Fail an unknown identifier raises TesselUnknownRecordException and nothing
  // is deleted.
  std::size_t deleteRecords(const std::vector<std::string>& identifiers,
                            MissingRecords missing = MissingRecords::Ignore);
  std::optional<zt::platform::Dictionary> record(std::string_view identifier) const;
  // Live records in identifier order, of one entity or all.
  void forEachRecord(const std::function<void(const Record&)>& visit,
                     std::optional<std::string_view> entityName = std::nullopt) const;
  std::size_t recordCount(std::optional<std::string_view> entityName = std::nullopt) const;

  // Importers' writes: everything or nothing, so an interrupted import leaves no half state.
  // Raises as putRecords and setCalendarOrder do, and then nothing is written.
  AppliedChanges applyChanges(const StoreChanges& changes);

  // Writes the single CalendarOrder record with these calendar identifiers in this order.
  // Every identifier must be a live calendar (TesselUnknownRecordException).
  void setCalendarOrder(const std::vector<std::string>& calendarIdentifiers);

  // Registers a client, or updates the display name and entities of an existing one (its
  // settings, filters and mirror stay).
  std::unique_ptr<Client> registerClient(std::string_view identifier, std::string_view displayName,
                                         const std::vector<std::string>& entityNames);
  // None when no such client is registered.
  std::unique_ptr<Client> clientWithIdentifier(std::string_view identifier) const;
  std::vector<std::string> clientIdentifiers() const;

  // Cancels the client's running session, whichever process runs it; that session sees it
  // through isCancelled(). Answers whether a session was running. Unknown client:
  // TesselUnknownClientException.
  bool cancelSession(std::string_view clientIdentifier);

  // A truth snapshot outside any session, for these entities (all when empty).
  std::shared_ptr<Snapshot> snapshotOfRecordsInTruth(const std::vector<std::string>& entityNames,
                                                     const Client& client) const;

  // Internal.
  explicit Store(std::shared_ptr<detail::Database> database);

 private:
  std::shared_ptr<detail::Database> database_;
};

}  // namespace tessel
