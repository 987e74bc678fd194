#include "tessel/snapshot.h"

#include <algorithm>

#include "tessel/read_view.h"
#include "tessel/schema.h"
#include "tessel/value_codec.h"

namespace tessel {

namespace {

bool matches(const zt::platform::Dictionary& record, const zt::platform::Dictionary& criteria) {
  for (const auto& [key, wanted] : criteria) {
    const zt::platform::Value* value = record.find(key);
    if (!value || !(*value == wanted)) return false;
  }
  return true;
}

}  // namespace

Snapshot::Snapshot(std::shared_ptr<detail::ReadView> view, std::vector<std::string> entityNames)
    : view_(std::move(view)), entityNames_(std::move(entityNames)) {}

Snapshot::~Snapshot() = default;

bool Snapshot::sees(std::string_view entityName) const {
  return entityNames_.empty() ||
         std::find(entityNames_.begin(), entityNames_.end(), entityName) != entityNames_.end();
}

RecordMap Snapshot::recordsMatchingAttributes(const zt::platform::Dictionary& criteria) const {
  RecordMap result;
  detail::Connection& connection = view_->connection();
  const zt::platform::Value* entity = criteria.find(TesselRecordEntityNameKey);
  if (entity && entity->asString()) {
    if (!sees(*entity->asString())) return result;
    detail::Statement& query =
        connection.cached("SELECT id, data FROM records WHERE entity = ? AND deleted = 0");
    detail::StatementReset reset(query);
    query.bind(1, *entity->asString());
    while (query.step()) {
      zt::platform::Dictionary record = detail::decodeRecord(query.blob(1));
      if (matches(record, criteria)) result.emplace(query.text(0), std::move(record));
    }
    return result;
  }
  if (entity) return result;  // entity names are strings: nothing can match
  detail::Statement& query =
      connection.cached("SELECT id, entity, data FROM records WHERE deleted = 0");
  detail::StatementReset reset(query);
  while (query.step()) {
    if (!sees(query.text(1))) continue;
    zt::platform::Dictionary record = detail::decodeRecord(query.blob(2));
    if (matches(record, criteria)) result.emplace(query.text(0), std::move(record));
  }
  return result;
}

std::optional<zt::platform::Dictionary> Snapshot::recordWithIdentifier(
    std::string_view identifier) const {
  detail::Statement& query =
      view_->connection().cached("SELECT entity, data FROM records WHERE id = ? AND deleted = 0");
  detail::StatementReset reset(query);
  query.bind(1, identifier);
  if (!query.step() || !sees(query.text(0))) return std::nullopt;
  return detail::decodeRecord(query.blob(1));
}

RecordMap Snapshot::recordsWithIdentifiers(const std::vector<std::string>& identifiers) const {
  RecordMap result;
  for (const std::string& identifier : identifiers) {
    if (result.find(identifier) != result.end()) continue;
    if (auto record = recordWithIdentifier(identifier)) {
      result.emplace(identifier, std::move(*record));
    }
  }
  return result;
}

std::optional<RecordReference> Snapshot::recordReferenceForRecordIdentifier(
    std::string_view identifier) const {
  detail::Statement& query =
      view_->connection().cached("SELECT key, entity FROM records WHERE id = ? AND deleted = 0");
  detail::StatementReset reset(query);
  query.bind(1, identifier);
  if (!query.step() || !sees(query.text(1))) return std::nullopt;
  return detail::ReadView::referenceForKey(query.integer(0));
}

std::optional<std::string> Snapshot::recordIdentifierForReference(
    const RecordReference& reference) const {
  auto key = detail::ReadView::keyForReference(reference);
  if (!key) return std::nullopt;
  detail::Statement& query =
      view_->connection().cached("SELECT id, entity FROM records WHERE key = ? AND deleted = 0");
  detail::StatementReset reset(query);
  query.bind(1, *key);
  if (!query.step() || !sees(query.text(1))) return std::nullopt;
  return std::string(query.text(0));
}

}  // namespace tessel
