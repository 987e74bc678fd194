#include "tessel/client.h"

#include <algorithm>

#include "tessel/database.h"
#include "tessel/filter_registry.h"
#include "tessel/process_identity.h"
#include "tessel/session_outcome_codes.h"
#include "tessel/value_codec.h"

namespace tessel {

namespace {

std::chrono::system_clock::time_point fromUnix(std::int64_t seconds) {
  return std::chrono::system_clock::time_point(std::chrono::seconds(seconds));
}

}  // namespace

Client::Client(std::shared_ptr<detail::Database> database, std::string identifier)
    : database_(std::move(database)), identifier_(std::move(identifier)) {}

Client::~Client() = default;

std::string Client::displayName() const {
  auto& query = database_->writer().cached("SELECT display_name FROM clients WHERE id = ?");
  detail::StatementReset reset(query);
  query.bind(1, identifier_);
  return query.step() ? std::string(query.text(0)) : std::string();
}

std::vector<std::string> Client::enabledEntityNames() const {
  auto& query = database_->writer().cached(
      "SELECT entity FROM client_entities WHERE client_id = ? ORDER BY entity");
  detail::StatementReset reset(query);
  query.bind(1, identifier_);
  std::vector<std::string> names;
  while (query.step()) names.emplace_back(query.text(0));
  return names;
}

bool Client::isEnabledForEntityName(std::string_view entityName) const {
  auto& query = database_->writer().cached(
      "SELECT 1 FROM client_entities WHERE client_id = ? AND entity = ?");
  detail::StatementReset reset(query);
  query.bind(1, identifier_).bind(2, entityName);
  return query.step();
}

std::optional<zt::platform::Value> Client::setting(std::string_view key) const {
  auto& query = database_->writer().cached(
      "SELECT value FROM client_settings WHERE client_id = ? AND key = ?");
  detail::StatementReset reset(query);
  query.bind(1, identifier_).bind(2, key);
  if (!query.step()) return std::nullopt;
  return detail::decodeValue(query.blob(0));
}

void Client::setSetting(std::string_view key, const zt::platform::Value& value) {
  auto bytes = detail::encodeValue(value);
  database_->writer()
      .cached(
          "INSERT INTO client_settings(client_id, key, value) VALUES (?, ?, ?) "
          "ON CONFLICT(client_id, key) DO UPDATE SET value = excluded.value")
      .bind(1, identifier_)
      .bind(2, key)
      .bindBlob(3, bytes)
      .run();
}

void Client::unsetSetting(std::string_view key) {
  database_->writer()
      .cached("DELETE FROM client_settings WHERE client_id = ? AND key = ?")
      .bind(1, identifier_)
      .bind(2, key)
      .run();
}

zt::platform::Dictionary Client::settings() const {
  auto& query = database_->writer().cached(
      "SELECT key, value FROM client_settings WHERE client_id = ? ORDER BY key");
  detail::StatementReset reset(query);
  query.bind(1, identifier_);
  zt::platform::Dictionary result;
  while (query.step()) result.set(std::string(query.text(0)), detail::decodeValue(query.blob(1)));
  return result;
}

FilterList Client::filters() const {
  std::vector<std::pair<std::string, zt::platform::Data>> stored;
  {
    auto& query = database_->writer().cached(
        "SELECT class_name, payload FROM client_filters WHERE client_id = ? ORDER BY position");
    detail::StatementReset reset(query);
    query.bind(1, identifier_);
    while (query.step()) {
      auto payload = query.blob(1);
      stored.emplace_back(std::string(query.text(0)),
                          zt::platform::Data(payload.begin(), payload.end()));
    }
  }
  // Decoders run after the query has ended: they may read the store themselves.
  FilterList filters;
  for (const auto& [className, payload] : stored) {
    filters.push_back(FilterRegistry::shared().decode(className, payload));
  }
  return filters;
}

void Client::setFilters(const FilterList& filters) {
  // Encode first so that a filter failing to encode leaves the stored list as it was.
  std::vector<std::pair<std::string, zt::platform::Data>> coded;
  for (const auto& filter : filters) {
    coded.emplace_back(filter->className(), FilterRegistry::encode(*filter));
  }
  detail::Connection& writer = database_->writer();
  detail::WriteTransaction transaction(writer);
  writer.cached("DELETE FROM client_filters WHERE client_id = ?").bind(1, identifier_).run();
  auto& insert = writer.cached(
      "INSERT INTO client_filters(client_id, position, class_name, payload) VALUES (?, ?, ?, ?)");
  std::int64_t position = 0;
  for (const auto& [className, payload] : coded) {
    insert.bind(1, identifier_).bind(2, position++).bind(3, className).bindBlob(4, payload).run();
  }
  transaction.commit();
}

void Client::shouldReplaceClientRecords(const std::vector<std::string>& entityNames) {
  for (const std::string& name : entityNames) {
    if (std::find(entityNamesToReplace_.begin(), entityNamesToReplace_.end(), name) ==
        entityNamesToReplace_.end()) {
      entityNamesToReplace_.push_back(name);
    }
  }
}

std::size_t Client::mirrorSize() const {
  auto& query = database_->writer().cached("SELECT count(*) FROM mirror WHERE client_id = ?");
  detail::StatementReset reset(query);
  query.bind(1, identifier_);
  return query.step() ? static_cast<std::size_t>(query.integer(0)) : 0;
}

std::optional<SessionSummary> Client::lastSession() const {
  auto& query = database_->writer().cached(
      "SELECT outcome, began_at, ended_at, owner_pid, cancel_requested, owner_start FROM sessions "
      "WHERE client_id = ?");
  detail::StatementReset reset(query);
  query.bind(1, identifier_);
  if (!query.step()) return std::nullopt;
  SessionSummary summary{detail::outcomeFromStored(query.integer(0)), fromUnix(query.integer(1)),
                         std::nullopt, static_cast<long>(query.integer(3)), query.integer(4) != 0};
  if (!query.isNull(2)) summary.ended = fromUnix(query.integer(2));
  // A session whose process died without ending it counts as cancelled.
  detail::ProcessIdentity owner{summary.ownerProcess, query.integer(5)};
  if (summary.outcome == SessionOutcome::Running && !owner.isAlive()) {
    summary.outcome = SessionOutcome::Cancelled;
  }
  return summary;
}

}  // namespace tessel
