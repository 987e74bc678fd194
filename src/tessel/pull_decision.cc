#include "tessel/pull_decision.h"

namespace tessel::detail {

PullAction decidePull(TruthState truth, std::int64_t generation,
                      std::optional<std::int64_t> mirrorGeneration, FilterVerdict verdict,
                      PullMode mode) {
  const bool held = mirrorGeneration.has_value();
  const bool replace = mode == PullMode::Replace;
  if (truth == TruthState::Gone) {
    if (!held) return PullAction::Nothing;
    return replace ? PullAction::Prune : PullAction::Delete;
  }
  const bool passes = verdict == FilterVerdict::Passes;
  if (replace) {
    // A replacing session sends every record that passes, held or not.
    if (passes) return PullAction::Add;
    return held ? PullAction::Prune : PullAction::Nothing;
  }
  if (!passes) return held ? PullAction::Delete : PullAction::Nothing;
  if (!held) return PullAction::Add;
  return generation > *mirrorGeneration ? PullAction::Modify : PullAction::Nothing;
}

}  // namespace tessel::detail
