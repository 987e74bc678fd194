#include "tessel/database.h"

#include <chrono>
#include <string>
#include <system_error>
#include <vector>

#include "tessel/exception.h"
#include "tessel/record_links.h"

namespace tessel::detail {

namespace {

// One step of the schema: its SQL, then what SQL alone cannot fill (records are encoded).
struct Migration {
  const char* sql;
  void (*fill)(Connection&) = nullptr;
};

// Each step brings the schema from version i to i + 1. Steps are never edited once shipped:
// a change of the schema is a new step.
const std::vector<Migration>& migrations() {
  static const std::vector<Migration> steps = {
      {R"sql(
CREATE TABLE store_state(
  id INTEGER PRIMARY KEY CHECK (id = 1),
  generation INTEGER NOT NULL);
INSERT INTO store_state(id, generation) VALUES (1, 0);

CREATE TABLE records(
  key INTEGER PRIMARY KEY,
  id TEXT NOT NULL UNIQUE,
  entity TEXT NOT NULL,
  generation INTEGER NOT NULL UNIQUE,
  deleted INTEGER NOT NULL DEFAULT 0,
  data BLOB);
CREATE INDEX records_by_entity ON records(entity, deleted);

CREATE TABLE clients(
  id TEXT PRIMARY KEY,
  display_name TEXT NOT NULL,
  registered_at INTEGER NOT NULL) WITHOUT ROWID;

CREATE TABLE client_entities(
  client_id TEXT NOT NULL REFERENCES clients(id) ON DELETE CASCADE,
  entity TEXT NOT NULL,
  PRIMARY KEY (client_id, entity)) WITHOUT ROWID;

CREATE TABLE client_settings(
  client_id TEXT NOT NULL REFERENCES clients(id) ON DELETE CASCADE,
  key TEXT NOT NULL,
  value BLOB NOT NULL,
  PRIMARY KEY (client_id, key)) WITHOUT ROWID;

CREATE TABLE client_filters(
  client_id TEXT NOT NULL REFERENCES clients(id) ON DELETE CASCADE,
  position INTEGER NOT NULL,
  class_name TEXT NOT NULL,
  payload BLOB NOT NULL,
  PRIMARY KEY (client_id, position)) WITHOUT ROWID;

CREATE TABLE mirror(
  client_id TEXT NOT NULL REFERENCES clients(id) ON DELETE CASCADE,
  record_id TEXT NOT NULL,
  entity TEXT NOT NULL,
  generation INTEGER NOT NULL,
  PRIMARY KEY (client_id, record_id)) WITHOUT ROWID;
CREATE INDEX mirror_by_entity ON mirror(client_id, entity);

CREATE TABLE sessions(
  client_id TEXT PRIMARY KEY REFERENCES clients(id) ON DELETE CASCADE,
  token TEXT NOT NULL,
  owner_pid INTEGER NOT NULL,
  owner_start INTEGER NOT NULL,
  began_at INTEGER NOT NULL,
  ended_at INTEGER,
  outcome INTEGER NOT NULL,
  cancel_requested INTEGER NOT NULL DEFAULT 0) WITHOUT ROWID;
)sql"},
      // Who names whom, so that deleting a record can take it out of the relationships that
      // name it without reading the whole truth (record_links.h). Targets are identifier
      // hashes, sources record keys.
      {R"sql(
CREATE TABLE record_links(
  target INTEGER NOT NULL,
  source INTEGER NOT NULL,
  PRIMARY KEY (target, source)) WITHOUT ROWID;
CREATE INDEX record_links_by_source ON record_links(source);
)sql",
       indexEveryRecord},
      // The change pass reads identifier, generation and tombstone of the entities a session
      // asks for; with them in the entity index it reads that index alone, never the rows of
      // other entities or a row per record. It replaces the index by entity, whose queries it
      // serves as well.
      {R"sql(
DROP INDEX records_by_entity;
CREATE INDEX records_by_entity_id ON records(entity, id, generation, deleted);
)sql"},
  };
  return steps;
}

}  // namespace

std::int64_t unixNow() {
  return std::chrono::duration_cast<std::chrono::seconds>(
             std::chrono::system_clock::now().time_since_epoch())
      .count();
}

Database::Database(std::filesystem::path path, StoreOpening opening) : path_(std::move(path)) {
  std::error_code error;
  if (opening == StoreOpening::MustExist) {
    if (!std::filesystem::exists(path_, error)) {
      throw Exception(TesselStoreException, "no store at " + path_.string());
    }
  } else if (path_.has_parent_path()) {
    std::filesystem::create_directories(path_.parent_path(), error);
    if (error) {
      throw Exception(TesselStoreException,
                      "cannot create the folder of " + path_.string() + ": " + error.message());
    }
  }
  writer_ = std::make_unique<Connection>(
      path_, opening == StoreOpening::MustExist ? FileCreation::Forbidden : FileCreation::Allowed);
  // Up to 32 MiB of pages: the indexes that a write of a hundred thousand records touches stay
  // in memory instead of being read again page by page.
  writer_->execute("PRAGMA cache_size = -32768");
  migrate();
}

std::unique_ptr<Connection> Database::openReader() const {
  // No memory mapping here: mapped pages count in the resident memory of a process that
  // streams a large store, and measured no faster than SQLite's own reads.
  return std::make_unique<Connection>(path_, FileCreation::Forbidden);
}

int Database::schemaVersion() {
  Statement& query = writer_->cached("SELECT version FROM schema_version");
  StatementReset reset(query);
  return query.step() ? static_cast<int>(query.integer(0)) : 0;
}

void Database::migrate() {
  const auto& steps = migrations();
  const int latest = static_cast<int>(steps.size());
  // Most opens find the schema current; check without taking the write lock.
  writer_->execute("CREATE TABLE IF NOT EXISTS schema_version(version INTEGER NOT NULL)");
  if (schemaVersion() == latest) return;

  WriteTransaction transaction(*writer_);
  int version = schemaVersion();
  if (version > latest) {
    throw Exception(TesselStoreException, path_.string() +
                                              " was written by a newer engine "
                                              "(schema " +
                                              std::to_string(version) + ")");
  }
  for (int step = version; step < latest; ++step) {
    writer_->execute(steps[step].sql);
    if (steps[step].fill) steps[step].fill(*writer_);
  }
  writer_->execute("DELETE FROM schema_version");
  writer_->cached("INSERT INTO schema_version(version) VALUES (?)").bind(1, latest).run();
  transaction.commit();
}

}  // namespace tessel::detail
