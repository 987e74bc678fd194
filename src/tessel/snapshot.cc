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
  forEachRecordMatching(criteria, [&](Record& record) {
    result.emplace_hint(result.end(), std::move(record.id), std::move(record.record));
  });
  return result;
}

std::vector<std::string> Snapshot::recordIdentifiersOfEntity(std::string_view entity) const {
  std::vector<std::string> identifiers;
  if (!sees(entity)) return identifiers;
  detail::Statement query(view_->connection(),
                          "SELECT id FROM records WHERE entity = ? AND deleted = 0");
  query.bind(1, entity);
  while (query.step()) identifiers.emplace_back(query.text(0));
  std::sort(identifiers.begin(), identifiers.end());
  return identifiers;
}

RecordsVersion Snapshot::versionOfEntities(const std::vector<std::string>& entities) const {
  RecordsVersion version;
  std::vector<std::string_view> seen;
  for (const std::string& entity : entities) {
    if (sees(entity)) seen.push_back(entity);
  }
  if (seen.empty()) return version;
  std::string inList = "?";
  for (std::size_t i = 1; i < seen.size(); ++i) inList += ", ?";
  // The entity index answers the count alone. The generation index, walked from the top,
  // reaches the latest of these records after the other records written since, which are
  // the few written after it.
  detail::Statement& count =
      view_->connection().cached("SELECT count(*) FROM records WHERE entity IN (" + inList + ")");
  detail::Statement& latest =
      view_->connection().cached("SELECT generation FROM records WHERE +entity IN (" + inList +
                                 ") ORDER BY generation DESC LIMIT 1");
  for (detail::Statement* query : {&count, &latest}) {
    detail::StatementReset reset(*query);
    for (std::size_t i = 0; i < seen.size(); ++i) query->bind(static_cast<int>(i) + 1, seen[i]);
    if (!query->step()) continue;
    (query == &count ? version.records : version.latestGeneration) = query->integer(0);
  }
  return version;
}

void Snapshot::forEachRecordMatching(const zt::platform::Dictionary& criteria,
                                     const std::function<void(Record&)>& visit,
                                     const std::vector<std::string>& omitted) const {
  const zt::platform::Value* entity = criteria.find(TesselRecordEntityNameKey);
  if (entity && (!entity->asString() || !sees(*entity->asString()))) return;
  // First the keys of the candidates in identifier order (the row's first columns only, never
  // its data pages), then each record by key: the records are never all in memory at once.
  std::vector<std::pair<std::string, std::int64_t>> candidates;
  {
    detail::Statement query(
        view_->connection(),
        entity ? "SELECT id, key, entity FROM records WHERE entity = ? AND deleted = 0"
               : "SELECT id, key, entity FROM records WHERE deleted = 0");
    if (entity) query.bind(1, *entity->asString());
    while (query.step()) {
      if (!entity && !sees(query.text(2))) continue;
      candidates.emplace_back(query.text(0), query.integer(1));
    }
  }
  std::sort(candidates.begin(), candidates.end());
  // An omitted attribute that the criteria name is read to be compared, then dropped.
  std::vector<std::string> skipped;
  std::vector<std::string> dropped;
  for (const std::string& name : omitted) {
    (criteria.find(name) ? dropped : skipped).push_back(name);
  }
  detail::Statement load(view_->connection(), "SELECT data, generation FROM records WHERE key = ?");
  Record record;
  for (auto& [identifier, key] : candidates) {
    {
      detail::StatementReset reset(load);
      load.bind(1, key);
      if (!load.step()) continue;
      record.record = detail::decodeRecordWithout(load.blob(0), skipped);
      record.generation = load.integer(1);
    }
    if (!matches(record.record, criteria)) continue;
    for (const std::string& name : dropped) record.record.erase(name);
    record.id = std::move(identifier);
    visit(record);
  }
}

void Snapshot::forEachRecordWithIdentifiers(const std::vector<std::string>& identifiers,
                                            const std::function<void(Record&)>& visit,
                                            const std::vector<std::string>& omitted) const {
  std::vector<std::string_view> wanted(identifiers.begin(), identifiers.end());
  std::sort(wanted.begin(), wanted.end());
  wanted.erase(std::unique(wanted.begin(), wanted.end()), wanted.end());
  // A few statement sizes, the last batch padded by repeating its last identifier, so that
  // every batch is one query of a statement prepared once per snapshot.
  constexpr std::size_t kSizes[] = {1, 2, 4, 8, 16, 32, 64, 128, 256};
  Record record;
  std::size_t next = 0;
  while (next < wanted.size()) {
    const std::size_t left = wanted.size() - next;
    std::size_t size = kSizes[0];
    for (std::size_t candidate : kSizes) {
      size = candidate;
      if (candidate >= left) break;
    }
    std::string sql =
        "SELECT id, entity, data, generation FROM records WHERE deleted = 0 AND id IN (?";
    for (std::size_t i = 1; i < size; ++i) sql += ", ?";
    sql += ") ORDER BY id";
    detail::Statement& query = view_->connection().cached(sql);
    detail::StatementReset reset(query);
    const std::size_t taken = std::min(size, left);
    for (std::size_t i = 0; i < size; ++i) {
      query.bind(static_cast<int>(i) + 1, wanted[next + std::min(i, taken - 1)]);
    }
    next += taken;
    while (query.step()) {
      if (!sees(query.text(1))) continue;
      record.id = query.text(0);
      record.record = omitted.empty() ? detail::decodeRecord(query.blob(2))
                                      : detail::decodeRecordWithout(query.blob(2), omitted);
      record.generation = query.integer(3);
      visit(record);
    }
  }
}

std::optional<zt::platform::Value> Snapshot::attributeOfRecord(std::string_view identifier,
                                                               std::string_view attribute) const {
  detail::Statement& query =
      view_->connection().cached("SELECT entity, data FROM records WHERE id = ? AND deleted = 0");
  detail::StatementReset reset(query);
  query.bind(1, identifier);
  if (!query.step() || !sees(query.text(0))) return std::nullopt;
  return detail::decodeRecordAttribute(query.blob(1), attribute);
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
  forEachRecordWithIdentifiers(identifiers, [&](Record& record) {
    result.emplace_hint(result.end(), std::move(record.id), std::move(record.record));
  });
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
