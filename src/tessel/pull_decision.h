#pragma once

#include <cstdint>
#include <optional>

namespace tessel::detail {

// What a session does with one record when it works out the changes a client pulls.
enum class PullAction {
  Nothing,
  Add,
  Modify,
  Delete,
  // Removes from the mirror a record that a replacing session no longer delivers; never
  // offered to the client, and counted as accepted.
  Prune,
};

// Whether truth holds the record: live, or deleted (a tombstone, or gone altogether).
enum class TruthState { Live, Gone };

// Whether the client's filters let the record through; only asked of live records.
enum class FilterVerdict { Passes, Fails };

// Whether the session replaces the client's records of the entity (it sends them all again,
// and the client forgets the rest) or brings them up to date.
enum class PullMode { Update, Replace };

// The change for one record, from its state in truth (and its generation there), the
// generation the client's mirror holds (none when the client does not hold it), the filters'
// verdict and the mode of its entity.
PullAction decidePull(TruthState truth, std::int64_t generation,
                      std::optional<std::int64_t> mirrorGeneration, FilterVerdict verdict,
                      PullMode mode);

}  // namespace tessel::detail
