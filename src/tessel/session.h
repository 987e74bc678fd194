#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "tessel/change_enumerator.h"
#include "tessel/snapshot.h"

namespace tessel {

class Client;

namespace detail {
class SessionState;
}

// A push sync session of one client. At most one runs per client across all processes.
// Beginning fixes the truth the whole session sees; writes made later by anyone wait for the
// next session. After a cancel (here or from another process) every call but isCancelled()
// and cancelSyncing() raises TesselSessionCancelledException. A session destroyed while
// running is cancelled.
class Session {
 public:
  // Raises TesselSessionRunningException when a live session of the client runs already; a
  // session whose process is gone counts as cancelled and no longer blocks.
  static std::unique_ptr<Session> begin(const Client& client,
                                        const std::vector<std::string>& entityNames);
  ~Session();

  const std::string& clientIdentifier() const;
  const std::vector<std::string>& entityNames() const;

  // Compares truth, through the client's filters, with what the client holds.
  void prepareToPullChanges(const std::vector<std::string>& entityNames);
  // With ChangeRecords::Omitted the changes carry no record (Change::record is none) and the
  // records are neither read nor decoded: for a client that only needs to know what changed.
  ChangeEnumerator changeEnumerator(const std::vector<std::string>& entityNames,
                                    ChangeRecords records = ChangeRecords::Decoded);
  // Marks the prepared change of that record as taken by the client.
  void clientAcceptedChanges(std::string_view recordIdentifier);
  // The same for many records at once, with one statement per batch of identifiers.
  void clientAcceptedChangesOf(const std::vector<std::string>& recordIdentifiers);
  // Applies the accepted changes to the client's mirror, in one transaction.
  void clientCommittedAcceptedChanges();

  void finishSyncing();
  void cancelSyncing();
  bool isCancelled();

  // The session's view of truth (the same object on every call).
  std::shared_ptr<Snapshot> snapshotOfRecordsInTruth();

  // Internal.
  explicit Session(std::shared_ptr<detail::SessionState> state);

 private:
  std::shared_ptr<detail::SessionState> state_;
};

}  // namespace tessel
