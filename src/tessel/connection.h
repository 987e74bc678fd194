#pragma once

#include <filesystem>
#include <map>
#include <memory>
#include <string>
#include <string_view>

#include "tessel/statement.h"

struct sqlite3;

namespace tessel::detail {

enum class FileCreation { Allowed, Forbidden };

// One SQLite connection configured for the store: WAL, foreign keys, a busy timeout so that a
// writer waits for another process's write instead of failing at once.
class Connection {
 public:
  Connection(const std::filesystem::path& path, FileCreation creation);
  ~Connection();
  Connection(const Connection&) = delete;
  Connection& operator=(const Connection&) = delete;

  void execute(std::string_view sql);
  // A statement prepared once per connection and reused; reset it after use (StatementReset).
  Statement& cached(std::string_view sql);
  std::int64_t changes() const;
  // The key of the row the last INSERT added; 0 after forgetLastInsertKey() until one adds a row
  // (an upsert that updates adds none).
  std::int64_t lastInsertKey() const;
  void forgetLastInsertKey();

  sqlite3* handle() const { return db_; }
  [[noreturn]] void fail(int code, std::string_view doing) const;

 private:
  sqlite3* db_ = nullptr;
  std::map<std::string, std::unique_ptr<Statement>, std::less<>> cache_;
};

// A write transaction: BEGIN IMMEDIATE takes the write lock at once (waiting for another
// writer up to the busy timeout), so that reads inside it can never turn stale. Rolled back
// unless committed.
class WriteTransaction {
 public:
  explicit WriteTransaction(Connection& connection);
  ~WriteTransaction();
  WriteTransaction(const WriteTransaction&) = delete;
  WriteTransaction& operator=(const WriteTransaction&) = delete;

  void commit();

 private:
  Connection& connection_;
  bool open_ = true;
};

}  // namespace tessel::detail
