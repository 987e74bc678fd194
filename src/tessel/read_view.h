#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "tessel/connection.h"
#include "tessel/record_reference.h"

namespace tessel::detail {

class Database;

// A read transaction on a connection of its own, opened at once so that the view of truth is
// fixed from construction until destruction whatever other connections write meanwhile.
// Also holds the session's change list in a temporary table of that connection, so the
// change list can be joined with the records of the very same view.
class ReadView {
 public:
  explicit ReadView(const Database& database);
  ~ReadView();
  ReadView(const ReadView&) = delete;
  ReadView& operator=(const ReadView&) = delete;

  Connection& connection() { return *connection_; }
  std::int64_t generation() const { return generation_; }

  static RecordReference referenceForKey(std::int64_t key);
  static std::optional<std::int64_t> keyForReference(const RecordReference& reference);

 private:
  std::unique_ptr<Connection> connection_;
  std::int64_t generation_ = 0;
};

}  // namespace tessel::detail
