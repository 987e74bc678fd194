#include "tessel/connection.h"

#include <sqlite3.h>

#include <string>

#include "tessel/exception.h"

namespace tessel::detail {

namespace {

constexpr int kBusyTimeoutMilliseconds = 30000;

}  // namespace

Connection::Connection(const std::filesystem::path& path, FileCreation creation) {
  int flags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX;
  if (creation == FileCreation::Allowed) flags |= SQLITE_OPEN_CREATE;
  int rc = sqlite3_open_v2(path.c_str(), &db_, flags, nullptr);
  if (rc != SQLITE_OK) {
    std::string message = db_ ? sqlite3_errmsg(db_) : sqlite3_errstr(rc);
    sqlite3_close(db_);
    db_ = nullptr;
    throw Exception(TesselStoreException,
                    "cannot open the store " + path.string() + ": " + message);
  }
  sqlite3_extended_result_codes(db_, 1);
  sqlite3_busy_timeout(db_, kBusyTimeoutMilliseconds);
  try {
    execute("PRAGMA foreign_keys = ON");
    // Fails here when the file is not a store at all.
    execute("PRAGMA journal_mode = WAL");
    // WAL with NORMAL sync keeps every commit atomic and durable across a crash of the
    // process; only a power loss may lose the latest commits.
    execute("PRAGMA synchronous = NORMAL");
    // Large temporary sort and change tables go to files, keeping memory bounded.
    execute("PRAGMA temp_store = FILE");
  } catch (...) {
    sqlite3_close_v2(db_);
    db_ = nullptr;
    throw;
  }
}

Connection::~Connection() {
  cache_.clear();
  sqlite3_close_v2(db_);
}

void Connection::execute(std::string_view sql) {
  std::string text(sql);
  char* error = nullptr;
  int rc = sqlite3_exec(db_, text.c_str(), nullptr, nullptr, &error);
  if (rc != SQLITE_OK) {
    std::string message = error ? error : sqlite3_errstr(rc);
    sqlite3_free(error);
    throw Exception(TesselStoreException, message + " (" + text + ")");
  }
}

Statement& Connection::cached(std::string_view sql) {
  auto found = cache_.find(sql);
  if (found != cache_.end()) return *found->second;
  auto statement = std::make_unique<Statement>(*this, sql);
  Statement& result = *statement;
  cache_.emplace(std::string(sql), std::move(statement));
  return result;
}

std::int64_t Connection::changes() const {
  return sqlite3_changes64(db_);
}

std::int64_t Connection::lastInsertKey() const {
  return sqlite3_last_insert_rowid(db_);
}

void Connection::forgetLastInsertKey() {
  sqlite3_set_last_insert_rowid(db_, 0);
}

void Connection::fail(int code, std::string_view doing) const {
  std::string message = db_ ? sqlite3_errmsg(db_) : sqlite3_errstr(code);
  if ((code & 0xff) == SQLITE_BUSY) message = "the store stayed busy (" + message + ")";
  throw Exception(TesselStoreException, std::string(doing) + ": " + message);
}

WriteTransaction::WriteTransaction(Connection& connection) : connection_(connection) {
  connection_.execute("BEGIN IMMEDIATE");
}

WriteTransaction::~WriteTransaction() {
  if (!open_) return;
  // A failed COMMIT or an earlier error may already have ended the transaction.
  if (!sqlite3_get_autocommit(connection_.handle())) {
    sqlite3_exec(connection_.handle(), "ROLLBACK", nullptr, nullptr, nullptr);
  }
}

void WriteTransaction::commit() {
  connection_.execute("COMMIT");
  open_ = false;
}

}  // namespace tessel::detail
