#include "tessel/store.h"

#include <cstdlib>
#include <unordered_set>

#include "tessel/database.h"
#include "tessel/exception.h"
#include "tessel/process_identity.h"
#include "tessel/read_view.h"
#include "tessel/record_links.h"
#include "tessel/schema.h"
#include "tessel/session_outcome_codes.h"
#include "tessel/value_codec.h"

namespace tessel {

namespace {

using zt::platform::Dictionary;
using zt::platform::Value;

// The identifier the CalendarOrder record gets when the store has none yet.
constexpr std::string_view kCalendarOrderIdentifier = "tessel.calendars.order";

std::optional<std::string> environment(const char* name) {
  const char* value = std::getenv(name);
  if (!value || !*value) return std::nullopt;
  return std::string(value);
}

std::string_view entityOf(const Record& record) {
  const Value* entity = record.record.find(TesselRecordEntityNameKey);
  if (!entity || !entity->asString() || entity->asString()->empty()) {
    throw Exception(
        TesselInvalidRecordException,
        "record " + record.id + " names no entity under " + std::string(TesselRecordEntityNameKey));
  }
  return *entity->asString();
}

// Takes the next generation number; the caller writes the counter back before committing.
class GenerationCounter {
 public:
  explicit GenerationCounter(detail::Connection& connection) : connection_(connection) {
    auto& query = connection_.cached("SELECT generation FROM store_state WHERE id = 1");
    detail::StatementReset reset(query);
    if (query.step()) value_ = query.integer(0);
  }
  std::int64_t next() { return ++value_; }
  void undo() { --value_; }
  void save() {
    connection_.cached("UPDATE store_state SET generation = ? WHERE id = 1").bind(1, value_).run();
  }

 private:
  detail::Connection& connection_;
  std::int64_t value_ = 0;
};

// Inserts or replaces records inside the caller's transaction; answers how many changed.
std::size_t writeRecords(detail::Connection& writer, const std::vector<Record>& records,
                         const std::vector<std::string_view>& entities) {
  GenerationCounter generation(writer);
  detail::LinkIndexer links(writer);
  // The WHERE clause leaves a record that is already stored exactly so untouched, so that
  // writing the same data again offers the clients no change. No RETURNING clause: SQLite
  // gathers its rows in a temporary table on every run, a third of the cost of a new record;
  // a new record's key is the inserted row's, and only a replaced one is looked up.
  auto& upsert = writer.cached(
      "INSERT INTO records(id, entity, generation, deleted, data) VALUES (?1, ?2, ?3, 0, ?4) "
      "ON CONFLICT(id) DO UPDATE SET entity = excluded.entity, generation = excluded.generation, "
      "deleted = 0, data = excluded.data "
      "WHERE records.deleted <> 0 OR records.entity <> excluded.entity "
      "OR records.data IS NOT excluded.data");
  auto& keyOf = writer.cached("SELECT key FROM records WHERE id = ?");
  std::size_t written = 0;
  std::vector<std::uint8_t> bytes;
  for (std::size_t i = 0; i < records.size(); ++i) {
    bytes.clear();
    detail::ValueWriter(bytes).record(records[i].record);
    std::optional<std::int64_t> key;  // none when the stored record was left as it was
    writer.forgetLastInsertKey();
    upsert.bind(1, records[i].id, detail::Lifetime::UntilReset)
        .bind(2, entities[i], detail::Lifetime::UntilReset)
        .bind(3, generation.next())
        .bindBlob(4, bytes, detail::Lifetime::UntilReset)
        .run();
    if (writer.changes() != 0) {
      key = writer.lastInsertKey();
      if (*key == 0) {
        detail::StatementReset reset(keyOf);
        keyOf.bind(1, records[i].id);
        if (keyOf.step()) key = keyOf.integer(0);
      }
    }
    if (key) {
      ++written;
      links.written(*key, entities[i], records[i].record);
    } else {
      generation.undo();
    }
  }
  links.flush();
  generation.save();
  return written;
}

}  // namespace

std::filesystem::path Store::resolvePath(const std::optional<std::filesystem::path>& given) {
  if (given && !given->empty()) return *given;
  if (auto path = environment("TESSEL_STORE")) return *path;
  if (auto data = environment("XDG_DATA_HOME")) {
    return std::filesystem::path(*data) / "tessel" / "truth.db";
  }
  if (auto home = environment("HOME")) {
    return std::filesystem::path(*home) / ".local" / "share" / "tessel" / "truth.db";
  }
  throw Exception(TesselStoreException,
                  "no store path: neither --store, $TESSEL_STORE, $XDG_DATA_HOME nor $HOME");
}

std::unique_ptr<Store> Store::open(const std::filesystem::path& path, StoreOpening opening) {
  return std::make_unique<Store>(std::make_shared<detail::Database>(path, opening));
}

Store::Store(std::shared_ptr<detail::Database> database) : database_(std::move(database)) {}

Store::~Store() = default;

const std::filesystem::path& Store::path() const {
  return database_->path();
}

int Store::schemaVersion() const {
  return database_->schemaVersion();
}

std::int64_t Store::generation() const {
  auto& query = database_->writer().cached("SELECT generation FROM store_state WHERE id = 1");
  detail::StatementReset reset(query);
  return query.step() ? query.integer(0) : 0;
}

namespace {

// The entity of every record, checked before anything is written; views of the records' own.
std::vector<std::string_view> checkedEntities(const std::vector<Record>& records) {
  std::vector<std::string_view> entities;
  entities.reserve(records.size());
  for (const Record& record : records) {
    if (record.id.empty()) throw Exception(TesselInvalidRecordException, "empty record identifier");
    entities.push_back(entityOf(record));
  }
  return entities;
}

std::size_t tombstoneRecords(detail::Connection& writer,
                             const std::vector<std::string>& identifiers, MissingRecords missing);
void writeCalendarOrder(detail::Connection& writer,
                        const std::vector<std::string>& calendarIdentifiers);

}  // namespace

std::size_t Store::putRecords(const std::vector<Record>& records) {
  std::vector<std::string_view> entities = checkedEntities(records);
  detail::Connection& writer = database_->writer();
  detail::WriteTransaction transaction(writer);
  std::size_t written = writeRecords(writer, records, entities);
  transaction.commit();
  return written;
}

AppliedChanges Store::applyChanges(const StoreChanges& changes) {
  std::vector<std::string_view> entities = checkedEntities(changes.put);
  detail::Connection& writer = database_->writer();
  detail::WriteTransaction transaction(writer);
  AppliedChanges applied;
  applied.written = writeRecords(writer, changes.put, entities);
  applied.deleted = tombstoneRecords(writer, changes.remove, MissingRecords::Ignore);
  if (changes.calendarOrder) writeCalendarOrder(writer, *changes.calendarOrder);
  transaction.commit();
  return applied;
}

std::size_t Store::deleteRecords(const std::vector<std::string>& identifiers,
                                 MissingRecords missing) {
  detail::Connection& writer = database_->writer();
  detail::WriteTransaction transaction(writer);
  std::size_t deleted = tombstoneRecords(writer, identifiers, missing);
  transaction.commit();
  return deleted;
}

namespace {

// Deletes, then takes the deleted identifiers out of every relationship that names them, so
// that no record points at nothing: an event whose organizer is gone would otherwise fail its
// calendar's export on every sync. Those records are written with new generations, so
// clients see them modified, in the same transaction as the deletes.
std::size_t tombstoneRecords(detail::Connection& writer,
                             const std::vector<std::string>& identifiers, MissingRecords missing) {
  GenerationCounter generation(writer);
  detail::LinkIndexer links(writer);
  auto& tombstone = writer.cached(
      "UPDATE records SET deleted = 1, data = NULL, generation = ? WHERE id = ? AND deleted = 0 "
      "RETURNING key");
  std::vector<std::string> deleted;
  for (const std::string& identifier : identifiers) {
    std::optional<std::int64_t> key;
    {
      detail::StatementReset reset(tombstone);
      tombstone.bind(1, generation.next()).bind(2, identifier);
      if (tombstone.step()) key = tombstone.integer(0);
    }
    if (key) {
      deleted.push_back(identifier);
      links.deleted(*key);
      continue;
    }
    generation.undo();
    if (missing == MissingRecords::Fail) {
      throw Exception(TesselUnknownRecordException, "no record " + identifier);
    }
  }
  generation.save();
  if (!deleted.empty()) {
    std::vector<std::string> entities;
    std::vector<Record> unlinked = detail::recordsWithoutLinksTo(writer, deleted, entities);
    writeRecords(writer, unlinked, std::vector<std::string_view>(entities.begin(), entities.end()));
  }
  return deleted.size();
}

}  // namespace

std::optional<Dictionary> Store::record(std::string_view identifier) const {
  auto& query = database_->writer().cached("SELECT data FROM records WHERE id = ? AND deleted = 0");
  detail::StatementReset reset(query);
  query.bind(1, identifier);
  if (!query.step()) return std::nullopt;
  return detail::decodeRecord(query.blob(0));
}

void Store::forEachRecord(const std::function<void(const Record&)>& visit,
                          std::optional<std::string_view> entityName) const {
  // A read view of its own keeps the listing consistent and leaves the writer connection free
  // for whatever the visitor does.
  detail::ReadView view(*database_);
  detail::Statement query(
      view.connection(),
      entityName ? "SELECT id, data FROM records WHERE deleted = 0 AND entity = ? ORDER BY id"
                 : "SELECT id, data FROM records WHERE deleted = 0 ORDER BY id");
  if (entityName) query.bind(1, *entityName);
  Record record;
  while (query.step()) {
    record.id = query.text(0);
    record.record = detail::decodeRecord(query.blob(1));
    visit(record);
  }
}

std::size_t Store::recordCount(std::optional<std::string_view> entityName) const {
  auto& query = database_->writer().cached(
      entityName ? "SELECT count(*) FROM records WHERE deleted = 0 AND entity = ?"
                 : "SELECT count(*) FROM records WHERE deleted = 0");
  detail::StatementReset reset(query);
  if (entityName) query.bind(1, *entityName);
  return query.step() ? static_cast<std::size_t>(query.integer(0)) : 0;
}

void Store::setCalendarOrder(const std::vector<std::string>& calendarIdentifiers) {
  detail::Connection& writer = database_->writer();
  // One transaction for the check and the write, so no calendar vanishes in between.
  detail::WriteTransaction transaction(writer);
  writeCalendarOrder(writer, calendarIdentifiers);
  transaction.commit();
}

namespace {

void writeCalendarOrder(detail::Connection& writer,
                        const std::vector<std::string>& calendarIdentifiers) {
  auto& calendar = writer.cached("SELECT entity FROM records WHERE id = ? AND deleted = 0");
  zt::platform::Array order;
  for (const std::string& identifier : calendarIdentifiers) {
    detail::StatementReset reset(calendar);
    calendar.bind(1, identifier);
    if (!calendar.step() || calendar.text(0) != TesselEntity_Calendars_Calendar) {
      throw Exception(TesselUnknownRecordException, "no calendar " + identifier);
    }
    order.emplace_back(identifier);
  }
  std::string identifier(kCalendarOrderIdentifier);
  {
    auto& existing = writer.cached(
        "SELECT id FROM records WHERE entity = ? AND deleted = 0 ORDER BY generation LIMIT 1");
    detail::StatementReset reset(existing);
    existing.bind(1, TesselEntity_Calendars_CalendarOrder);
    if (existing.step()) identifier = existing.text(0);
  }
  Dictionary record{
      {std::string(TesselRecordEntityNameKey), Value(TesselEntity_Calendars_CalendarOrder)},
      {std::string(TesselRelationship_Calendars_CalendarOrder_Calendars), Value(std::move(order))}};
  std::vector<Record> records{Record{identifier, std::move(record)}};
  writeRecords(writer, records, {TesselEntity_Calendars_CalendarOrder});
}

}  // namespace

std::unique_ptr<Client> Store::registerClient(std::string_view identifier,
                                              std::string_view displayName,
                                              const std::vector<std::string>& entityNames) {
  if (identifier.empty()) throw Exception(TesselUnknownClientException, "empty client identifier");
  detail::Connection& writer = database_->writer();
  detail::WriteTransaction transaction(writer);
  writer
      .cached(
          "INSERT INTO clients(id, display_name, registered_at) VALUES (?, ?, ?) "
          "ON CONFLICT(id) DO UPDATE SET display_name = excluded.display_name")
      .bind(1, identifier)
      .bind(2, displayName)
      .bind(3, detail::unixNow())
      .run();
  writer.cached("DELETE FROM client_entities WHERE client_id = ?").bind(1, identifier).run();
  auto& insert =
      writer.cached("INSERT OR IGNORE INTO client_entities(client_id, entity) VALUES (?, ?)");
  for (const std::string& entity : entityNames) insert.bind(1, identifier).bind(2, entity).run();
  transaction.commit();
  return std::make_unique<Client>(database_, std::string(identifier));
}

std::unique_ptr<Client> Store::clientWithIdentifier(std::string_view identifier) const {
  auto& query = database_->writer().cached("SELECT 1 FROM clients WHERE id = ?");
  detail::StatementReset reset(query);
  query.bind(1, identifier);
  if (!query.step()) return nullptr;
  return std::make_unique<Client>(database_, std::string(identifier));
}

std::vector<std::string> Store::clientIdentifiers() const {
  auto& query = database_->writer().cached("SELECT id FROM clients ORDER BY id");
  detail::StatementReset reset(query);
  std::vector<std::string> identifiers;
  while (query.step()) identifiers.emplace_back(query.text(0));
  return identifiers;
}

bool Store::cancelSession(std::string_view clientIdentifier) {
  detail::Connection& writer = database_->writer();
  detail::WriteTransaction transaction(writer);
  {
    auto& client = writer.cached("SELECT 1 FROM clients WHERE id = ?");
    detail::StatementReset reset(client);
    client.bind(1, clientIdentifier);
    if (!client.step()) {
      throw Exception(TesselUnknownClientException, "no client " + std::string(clientIdentifier));
    }
  }
  detail::ProcessIdentity owner{0, 0};
  {
    auto& session = writer.cached(
        "SELECT owner_pid, owner_start FROM sessions WHERE client_id = ? AND outcome = ?");
    detail::StatementReset reset(session);
    session.bind(1, clientIdentifier).bind(2, detail::storedOutcome(SessionOutcome::Running));
    if (!session.step()) return false;
    owner = {static_cast<long>(session.integer(0)), session.integer(1)};
  }
  if (owner.isAlive()) {
    // The owner sees the request and ends the session itself.
    writer.cached("UPDATE sessions SET cancel_requested = 1 WHERE client_id = ?")
        .bind(1, clientIdentifier)
        .run();
  } else {
    writer
        .cached(
            "UPDATE sessions SET cancel_requested = 1, outcome = ?, ended_at = ? "
            "WHERE client_id = ?")
        .bind(1, detail::storedOutcome(SessionOutcome::Cancelled))
        .bind(2, detail::unixNow())
        .bind(3, clientIdentifier)
        .run();
  }
  transaction.commit();
  return true;
}

std::shared_ptr<Snapshot> Store::snapshotOfRecordsInTruth(
    const std::vector<std::string>& entityNames, const Client& client) const {
  if (!clientWithIdentifier(client.identifier())) {
    throw Exception(TesselUnknownClientException, "no client " + client.identifier());
  }
  return std::make_shared<Snapshot>(std::make_shared<detail::ReadView>(*database_), entityNames);
}

}  // namespace tessel
