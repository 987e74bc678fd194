#include "tessel/read_view.h"

#include <sqlite3.h>

#include <charconv>

#include "tessel/database.h"

namespace tessel::detail {

namespace {

constexpr std::string_view kReferencePrefix = "tessel-record:";

}  // namespace

ReadView::ReadView(const Database& database) : connection_(database.openReader()) {
  connection_->execute(
      "CREATE TEMP TABLE changes("
      "  seq INTEGER PRIMARY KEY,"
      "  record_id TEXT NOT NULL UNIQUE,"
      "  record_key INTEGER,"
      "  entity TEXT NOT NULL,"
      "  type INTEGER NOT NULL,"
      "  generation INTEGER NOT NULL,"
      "  accepted INTEGER NOT NULL DEFAULT 0,"
      "  committed INTEGER NOT NULL DEFAULT 0)");
  connection_->execute("BEGIN");
  // The first read starts the transaction's snapshot; without it the view would float until
  // the first query.
  Statement& query = connection_->cached("SELECT generation FROM main.store_state");
  StatementReset reset(query);
  if (query.step()) generation_ = query.integer(0);
}

ReadView::~ReadView() {
  if (!sqlite3_get_autocommit(connection_->handle())) {
    sqlite3_exec(connection_->handle(), "ROLLBACK", nullptr, nullptr, nullptr);
  }
}

RecordReference ReadView::referenceForKey(std::int64_t key) {
  return RecordReference::fromText(std::string(kReferencePrefix) + std::to_string(key));
}

std::optional<std::int64_t> ReadView::keyForReference(const RecordReference& reference) {
  std::string_view text = reference.text();
  if (!text.starts_with(kReferencePrefix)) return std::nullopt;
  text.remove_prefix(kReferencePrefix.size());
  std::int64_t key = 0;
  auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), key);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return key;
}

}  // namespace tessel::detail
