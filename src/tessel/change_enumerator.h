#pragma once

#include <memory>
#include <optional>

#include "tessel/change.h"

namespace tessel {

namespace detail {
class SessionState;
class Statement;
}  // namespace detail

// The prepared changes of some entities, one by one, in a stable order (the order in which
// truth changed). It reads from the session's snapshot and stays usable while the session
// lives; changes already committed are not offered again.
class ChangeEnumerator {
 public:
  ChangeEnumerator(ChangeEnumerator&&) noexcept;
  ChangeEnumerator& operator=(ChangeEnumerator&&) noexcept;
  ~ChangeEnumerator();

  // The next change, or none at the end.
  std::optional<Change> next();

  // Internal: made by Session::changeEnumerator.
  ChangeEnumerator(std::shared_ptr<detail::SessionState> state,
                   std::unique_ptr<detail::Statement> statement);

 private:
  std::shared_ptr<detail::SessionState> state_;
  std::unique_ptr<detail::Statement> statement_;
};

}  // namespace tessel
