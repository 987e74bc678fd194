#pragma once

#include <cstdint>

#include "tessel/client.h"

namespace tessel::detail {

// How the sessions table stores an outcome. Part of the file format: never renumber.
inline std::int64_t storedOutcome(SessionOutcome outcome) {
  switch (outcome) {
    case SessionOutcome::Running:
      return 0;
    case SessionOutcome::Finished:
      return 1;
    case SessionOutcome::Cancelled:
      return 2;
  }
  return 2;
}

inline SessionOutcome outcomeFromStored(std::int64_t code) {
  switch (code) {
    case 0:
      return SessionOutcome::Running;
    case 1:
      return SessionOutcome::Finished;
    default:
      return SessionOutcome::Cancelled;
  }
}

}  // namespace tessel::detail
