#pragma once

#include <chrono>
#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/value.h"
#include "tessel/filtering.h"

namespace tessel {

namespace detail {
class Database;
}

enum class SessionOutcome { Running, Finished, Cancelled };

// What the store remembers of a client's latest session.
struct SessionSummary {
  SessionOutcome outcome;
  std::chrono::system_clock::time_point began;
  std::optional<std::chrono::system_clock::time_point> ended;
  long ownerProcess;
  // A cancel was asked (also from another process) while the session ran.
  bool cancelRequested;
};

// A registered sync client: its entities, settings, filters and the mirror of the records it
// holds. Each call reads or writes the store at once, so another process's changes are seen.
// Obtained from Store::registerClient or Store::clientWithIdentifier; stays usable after the
// Store object is gone.
class Client {
 public:
  ~Client();

  const std::string& identifier() const { return identifier_; }
  std::string displayName() const;

  std::vector<std::string> enabledEntityNames() const;
  bool isEnabledForEntityName(std::string_view entityName) const;

  // Typed settings that persist with the client; none when the key is not set.
  std::optional<zt::platform::Value> setting(std::string_view key) const;
  void setSetting(std::string_view key, const zt::platform::Value& value);
  void unsetSetting(std::string_view key);
  // Every setting, by key order.
  zt::platform::Dictionary settings() const;

  // The stored filters decoded through FilterRegistry::shared(), in order.
  FilterList filters() const;
  void setFilters(const FilterList& filters);

  // The next session begun with this object delivers every record of these entities that
  // passes the filters as an add, and the client's earlier records of them are forgotten.
  void shouldReplaceClientRecords(const std::vector<std::string>& entityNames);
  const std::vector<std::string>& entityNamesToReplace() const { return entityNamesToReplace_; }

  // How many records the client holds.
  std::size_t mirrorSize() const;
  std::optional<SessionSummary> lastSession() const;

  // Internal: made by Store.
  Client(std::shared_ptr<detail::Database> database, std::string identifier);
  detail::Database& database() const { return *database_; }
  const std::shared_ptr<detail::Database>& sharedDatabase() const { return database_; }

 private:
  std::shared_ptr<detail::Database> database_;
  std::string identifier_;
  std::vector<std::string> entityNamesToReplace_;
};

}  // namespace tessel
