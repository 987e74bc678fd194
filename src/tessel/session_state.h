#pragma once

#include <memory>
#include <string>
#include <vector>

#include "tessel/database.h"
#include "tessel/read_view.h"
#include "tessel/snapshot.h"

namespace tessel::detail {

// Everything a session shares with its change enumerators: the store, the session's read
// view (kept alive while any of them lives) and where the session stands.
class SessionState {
 public:
  enum class Phase { Running, CancelSeen, Cancelled, Finished };

  SessionState(std::shared_ptr<Database> database, std::string clientIdentifier, std::string token,
               std::vector<std::string> entityNames, std::vector<std::string> entityNamesToReplace);

  // Raises TesselSessionCancelledException or TesselSessionEndedException unless the session
  // runs and nobody asked to cancel it.
  void ensureRunning();
  // Asks the store whether someone cancelled this session (or took its place).
  bool cancelRequested();
  // Marks the stored session ended with that outcome, if it is still this session.
  void end(SessionOutcome outcome);

  std::shared_ptr<Database> database;
  std::shared_ptr<ReadView> view;
  std::shared_ptr<Snapshot> snapshot;
  std::string clientIdentifier;
  std::string token;
  std::vector<std::string> entityNames;
  std::vector<std::string> entityNamesToReplace;
  Phase phase = Phase::Running;
};

}  // namespace tessel::detail
