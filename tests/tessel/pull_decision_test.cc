#include "tessel/pull_decision.h"

#include <gtest/gtest.h>

#include <optional>
#include <tuple>

namespace tessel::detail {
namespace {

constexpr auto Live = TruthState::Live;
constexpr auto Gone = TruthState::Gone;
constexpr auto Passes = FilterVerdict::Passes;
constexpr auto Fails = FilterVerdict::Fails;
constexpr auto Update = PullMode::Update;
constexpr auto Replace = PullMode::Replace;

TEST(PullDecision, EveryStateOfTruthMirrorFilterAndMode) {
  const std::tuple<TruthState, std::int64_t, std::optional<std::int64_t>, FilterVerdict, PullMode,
                   PullAction>
      cases[] = {
          // Bringing the client up to date.
          {Live, 5, std::nullopt, Passes, Update, PullAction::Add},
          {Live, 5, 4, Passes, Update, PullAction::Modify},
          {Live, 5, 5, Passes, Update, PullAction::Nothing},
          {Live, 5, 7, Passes, Update, PullAction::Nothing},  // the client is ahead
          {Live, 5, std::nullopt, Fails, Update, PullAction::Nothing},
          {Live, 5, 4, Fails, Update, PullAction::Delete},  // filtered out since it was sent
          {Gone, 5, 4, Passes, Update, PullAction::Delete},
          {Gone, 5, std::nullopt, Passes, Update, PullAction::Nothing},
          // Replacing: everything that passes is sent again, the rest leaves the mirror unsaid.
          {Live, 5, std::nullopt, Passes, Replace, PullAction::Add},
          {Live, 5, 5, Passes, Replace, PullAction::Add},
          {Live, 5, 5, Fails, Replace, PullAction::Prune},
          {Live, 5, std::nullopt, Fails, Replace, PullAction::Nothing},
          {Gone, 5, 5, Passes, Replace, PullAction::Prune},
          {Gone, 5, std::nullopt, Passes, Replace, PullAction::Nothing},
      };
  for (const auto& [truth, generation, mirror, verdict, mode, action] : cases)
    EXPECT_EQ(decidePull(truth, generation, mirror, verdict, mode), action)
        << "truth " << (truth == Live ? "live" : "gone") << " at " << generation << ", mirror "
        << (mirror ? std::to_string(*mirror) : "none") << ", "
        << (verdict == Passes ? "passes" : "fails") << ", "
        << (mode == Update ? "update" : "replace");
}

}  // namespace
}  // namespace tessel::detail
