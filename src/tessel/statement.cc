#include "tessel/statement.h"

#include <sqlite3.h>

#include "tessel/connection.h"

namespace tessel::detail {

Statement::Statement(Connection& connection, std::string_view sql) : connection_(connection) {
  int rc = sqlite3_prepare_v3(connection_.handle(), sql.data(), static_cast<int>(sql.size()),
                              SQLITE_PREPARE_PERSISTENT, &statement_, nullptr);
  if (rc != SQLITE_OK) connection_.fail(rc, "preparing " + std::string(sql));
}

Statement::~Statement() {
  sqlite3_finalize(statement_);
}

Statement& Statement::bind(int index, std::int64_t value) {
  int rc = sqlite3_bind_int64(statement_, index, value);
  if (rc != SQLITE_OK) connection_.fail(rc, "binding");
  return *this;
}

namespace {

sqlite3_destructor_type destructorFor(Lifetime lifetime) {
  return lifetime == Lifetime::UntilReset ? SQLITE_STATIC : SQLITE_TRANSIENT;
}

}  // namespace

Statement& Statement::bind(int index, std::string_view text, Lifetime lifetime) {
  int rc = sqlite3_bind_text64(statement_, index, text.data(), text.size(), destructorFor(lifetime),
                               SQLITE_UTF8);
  if (rc != SQLITE_OK) connection_.fail(rc, "binding");
  return *this;
}

Statement& Statement::bindBlob(int index, std::span<const std::uint8_t> bytes, Lifetime lifetime) {
  // A zero-length blob must stay a blob, not become NULL.
  int rc = bytes.empty() ? sqlite3_bind_zeroblob(statement_, index, 0)
                         : sqlite3_bind_blob64(statement_, index, bytes.data(), bytes.size(),
                                               destructorFor(lifetime));
  if (rc != SQLITE_OK) connection_.fail(rc, "binding");
  return *this;
}

Statement& Statement::bindNull(int index) {
  int rc = sqlite3_bind_null(statement_, index);
  if (rc != SQLITE_OK) connection_.fail(rc, "binding");
  return *this;
}

bool Statement::step() {
  int rc = sqlite3_step(statement_);
  if (rc == SQLITE_ROW) return true;
  if (rc == SQLITE_DONE) return false;
  connection_.fail(rc, "running " + std::string(sqlite3_sql(statement_)));
}

void Statement::run() {
  StatementReset reset(*this);
  while (step()) {
  }
}

void Statement::reset() {
  sqlite3_reset(statement_);
  sqlite3_clear_bindings(statement_);
}

bool Statement::isNull(int column) const {
  return sqlite3_column_type(statement_, column) == SQLITE_NULL;
}

std::int64_t Statement::integer(int column) const {
  return sqlite3_column_int64(statement_, column);
}

std::string_view Statement::text(int column) const {
  const auto* data = sqlite3_column_text(statement_, column);
  int size = sqlite3_column_bytes(statement_, column);
  if (!data) return {};
  return {reinterpret_cast<const char*>(data), static_cast<std::size_t>(size)};
}

std::span<const std::uint8_t> Statement::blob(int column) const {
  const void* data = sqlite3_column_blob(statement_, column);
  int size = sqlite3_column_bytes(statement_, column);
  if (!data) return {};
  return {static_cast<const std::uint8_t*>(data), static_cast<std::size_t>(size)};
}

}  // namespace tessel::detail
