#include "tessel/change_enumerator.h"

#include "tessel/session_state.h"
#include "tessel/statement.h"
#include "tessel/value_codec.h"

namespace tessel {

ChangeEnumerator::ChangeEnumerator(std::shared_ptr<detail::SessionState> state,
                                   std::unique_ptr<detail::Statement> statement)
    : state_(std::move(state)), statement_(std::move(statement)) {}

ChangeEnumerator::ChangeEnumerator(ChangeEnumerator&&) noexcept = default;

ChangeEnumerator& ChangeEnumerator::operator=(ChangeEnumerator&& other) noexcept {
  // The old statement must end before the old session it belongs to may be released.
  statement_.reset();
  state_ = std::move(other.state_);
  statement_ = std::move(other.statement_);
  return *this;
}

ChangeEnumerator::~ChangeEnumerator() {
  // The statement belongs to the session's connection: end it before letting the session go.
  statement_.reset();
}

std::optional<Change> ChangeEnumerator::next() {
  if (!statement_ || !statement_->step()) {
    statement_.reset();
    return std::nullopt;
  }
  Change change{static_cast<ChangeType>(statement_->integer(0)), std::string(statement_->text(1)),
                std::string(statement_->text(2)), std::nullopt};
  if (!statement_->isNull(3)) change.record = detail::decodeRecord(statement_->blob(3));
  return change;
}

}  // namespace tessel
