#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

struct sqlite3_stmt;

namespace tessel::detail {

class Connection;

// How long the text or bytes given to a bind stay as they are. Copied: SQLite copies them.
// UntilReset: they outlive the statement's next reset (run() resets), and SQLite reads them in
// place, which spares a copy of every record a bulk write binds.
enum class Lifetime { Copied, UntilReset };

// One prepared SQLite statement. Bind indexes start at 1, column indexes at 0. Failures raise
// TesselStoreException with SQLite's message.
class Statement {
 public:
  Statement(Connection& connection, std::string_view sql);
  ~Statement();
  Statement(const Statement&) = delete;
  Statement& operator=(const Statement&) = delete;

  Statement& bind(int index, std::int64_t value);
  Statement& bind(int index, std::string_view text, Lifetime lifetime = Lifetime::Copied);
  Statement& bindBlob(int index, std::span<const std::uint8_t> bytes,
                      Lifetime lifetime = Lifetime::Copied);
  Statement& bindNull(int index);

  // Advances; true while a row is available.
  bool step();
  // Runs a statement that returns no rows, then resets it.
  void run();
  // Ends the current run and clears bindings, so the statement holds no read lock.
  void reset();

  bool isNull(int column) const;
  std::int64_t integer(int column) const;
  std::string_view text(int column) const;
  std::span<const std::uint8_t> blob(int column) const;

 private:
  Connection& connection_;
  sqlite3_stmt* statement_ = nullptr;
};

// Resets a reused statement when the scope ends, whatever happens.
class StatementReset {
 public:
  explicit StatementReset(Statement& statement) : statement_(statement) {}
  ~StatementReset() { statement_.reset(); }
  StatementReset(const StatementReset&) = delete;
  StatementReset& operator=(const StatementReset&) = delete;

 private:
  Statement& statement_;
};

}  // namespace tessel::detail
