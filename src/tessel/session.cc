#include "tessel/session.h"

#include <algorithm>
#include <cstdio>
#include <random>

#include "tessel/client.h"
#include "tessel/exception.h"
#include "tessel/filter_registry.h"
#include "tessel/process_identity.h"
#include "tessel/pull_decision.h"
#include "tessel/schema.h"
#include "tessel/session_outcome_codes.h"
#include "tessel/session_state.h"
#include "tessel/value_codec.h"

namespace tessel {

namespace {

using detail::FilterVerdict;
using detail::PullAction;
using detail::PullMode;
using detail::Statement;
using detail::StatementReset;
using detail::TruthState;

// Change types of the session's change table. A prune is never offered: it removes from the
// mirror a record that a replacing session no longer delivers, and counts as accepted.
enum StoredChange : std::int64_t { kAdd = 1, kModify = 2, kDelete = 3, kPrune = 4 };

std::string randomToken() {
  std::random_device device;
  std::uniform_int_distribution<unsigned long long> bits;
  char text[33];
  std::snprintf(text, sizeof text, "%016llx%016llx", bits(device), bits(device));
  return text;
}

// "?2, ?3, ..." for `count` parameters starting at `first`.
std::string placeholders(std::size_t count, int first) {
  std::string text;
  for (std::size_t i = 0; i < count; ++i) {
    if (i) text += ", ";
    text += "?" + std::to_string(first + static_cast<int>(i));
  }
  return text;
}

bool contains(const std::vector<std::string>& names, std::string_view name) {
  return std::find(names.begin(), names.end(), name) != names.end();
}

std::int64_t storedChange(PullAction action) {
  switch (action) {
    case PullAction::Add:
      return kAdd;
    case PullAction::Modify:
      return kModify;
    case PullAction::Delete:
      return kDelete;
    case PullAction::Prune:
    case PullAction::Nothing:
      break;
  }
  return kPrune;
}

// The client's filters as the session's view holds them.
FilterList storedFilters(detail::Connection& connection, const std::string& client) {
  std::vector<std::pair<std::string, zt::platform::Data>> stored;
  Statement query(connection,
                  "SELECT class_name, payload FROM main.client_filters WHERE client_id = ? "
                  "ORDER BY position");
  query.bind(1, client);
  while (query.step()) {
    auto payload = query.blob(1);
    stored.emplace_back(std::string(query.text(0)),
                        zt::platform::Data(payload.begin(), payload.end()));
  }
  query.reset();
  FilterList filters;
  for (const auto& [className, payload] : stored) {
    filters.push_back(FilterRegistry::shared().decode(className, payload));
  }
  return filters;
}

// What to do per entity, looked up by name for every record: a handful of entities, so a
// linear search beats hashing a fresh string per record.
struct EntityRule {
  std::string name;
  std::vector<const Filtering*> judges;
  PullMode mode;
};

std::vector<EntityRule> entityRules(const std::vector<std::string>& entities,
                                    const std::vector<std::string>& entitiesToReplace,
                                    const FilterList& filters) {
  std::vector<EntityRule> rules;
  for (const std::string& entity : entities) {
    EntityRule rule{
        entity, {}, contains(entitiesToReplace, entity) ? PullMode::Replace : PullMode::Update};
    for (const auto& filter : filters) {
      if (contains(filter->supportedEntityNames(), entity)) rule.judges.push_back(filter.get());
    }
    rules.push_back(std::move(rule));
  }
  return rules;
}

FilterVerdict judge(const std::vector<const Filtering*>& judges,
                    const zt::platform::Dictionary& record, const std::string& identifier) {
  for (const Filtering* filter : judges) {
    if (!filter->shouldApplyRecord(record, identifier)) return FilterVerdict::Fails;
  }
  return FilterVerdict::Passes;
}

// A change already committed in this session stays; the others are worked out anew.
void clearUncommittedChanges(detail::Connection& connection,
                             const std::vector<std::string>& entities) {
  Statement clear(connection, "DELETE FROM temp.changes WHERE committed = 0 AND entity IN (" +
                                  placeholders(entities.size(), 1) + ")");
  for (std::size_t i = 0; i < entities.size(); ++i) {
    clear.bind(static_cast<int>(i) + 1, entities[i]);
  }
  clear.run();
}

}  // namespace

namespace detail {

SessionState::SessionState(std::shared_ptr<Database> database_, std::string clientIdentifier_,
                           std::string token_, std::vector<std::string> entityNames_,
                           std::vector<std::string> entityNamesToReplace_)
    : database(std::move(database_)),
      clientIdentifier(std::move(clientIdentifier_)),
      token(std::move(token_)),
      entityNames(std::move(entityNames_)),
      entityNamesToReplace(std::move(entityNamesToReplace_)) {}

bool SessionState::cancelRequested() {
  auto& query = database->writer().cached(
      "SELECT token, outcome, cancel_requested FROM sessions WHERE client_id = ?");
  StatementReset reset(query);
  query.bind(1, clientIdentifier);
  if (!query.step()) return true;
  return query.text(0) != token || outcomeFromStored(query.integer(1)) != SessionOutcome::Running ||
         query.integer(2) != 0;
}

void SessionState::ensureRunning() {
  if (phase == Phase::Running && cancelRequested()) phase = Phase::CancelSeen;
  switch (phase) {
    case Phase::Running:
      return;
    case Phase::CancelSeen:
    case Phase::Cancelled:
      throw Exception(TesselSessionCancelledException,
                      "the session of client " + clientIdentifier + " was cancelled");
    case Phase::Finished:
      throw Exception(TesselSessionEndedException,
                      "the session of client " + clientIdentifier + " has finished");
  }
}

void SessionState::end(SessionOutcome outcome) {
  database->writer()
      .cached(
          "UPDATE sessions SET outcome = ?, ended_at = ?, cancel_requested = "
          "(cancel_requested OR ?) WHERE client_id = ? AND token = ? AND outcome = ?")
      .bind(1, storedOutcome(outcome))
      .bind(2, unixNow())
      .bind(3, outcome == SessionOutcome::Cancelled ? 1 : 0)
      .bind(4, clientIdentifier)
      .bind(5, token)
      .bind(6, storedOutcome(SessionOutcome::Running))
      .run();
}

}  // namespace detail

std::unique_ptr<Session> Session::begin(const Client& client,
                                        const std::vector<std::string>& entityNames) {
  std::shared_ptr<detail::Database> database = client.sharedDatabase();
  detail::Connection& writer = database->writer();
  const std::string& clientIdentifier = client.identifier();
  std::string token = randomToken();
  detail::ProcessIdentity self = detail::ProcessIdentity::current();
  {
    detail::WriteTransaction transaction(writer);
    {
      auto& known = writer.cached("SELECT 1 FROM clients WHERE id = ?");
      StatementReset reset(known);
      known.bind(1, clientIdentifier);
      if (!known.step()) {
        throw Exception(TesselUnknownClientException, "no client " + clientIdentifier);
      }
    }
    {
      auto& running = writer.cached(
          "SELECT owner_pid, owner_start FROM sessions WHERE client_id = ? AND outcome = ?");
      StatementReset reset(running);
      running.bind(1, clientIdentifier).bind(2, detail::storedOutcome(SessionOutcome::Running));
      if (running.step()) {
        detail::ProcessIdentity owner{static_cast<long>(running.integer(0)), running.integer(1)};
        // A session left behind by a process that is gone no longer blocks: it is replaced.
        if (owner.isAlive()) {
          throw Exception(TesselSessionRunningException, "client " + clientIdentifier +
                                                             " has a session running in process " +
                                                             std::to_string(owner.pid));
        }
      }
    }
    writer
        .cached(
            "INSERT OR REPLACE INTO sessions(client_id, token, owner_pid, owner_start, began_at, "
            "ended_at, outcome, cancel_requested) VALUES (?, ?, ?, ?, ?, NULL, ?, 0)")
        .bind(1, clientIdentifier)
        .bind(2, token)
        .bind(3, static_cast<std::int64_t>(self.pid))
        .bind(4, self.startTime)
        .bind(5, detail::unixNow())
        .bind(6, detail::storedOutcome(SessionOutcome::Running))
        .run();
    transaction.commit();
  }
  auto state = std::make_shared<detail::SessionState>(database, clientIdentifier, std::move(token),
                                                      entityNames, client.entityNamesToReplace());
  try {
    state->view = std::make_shared<detail::ReadView>(*database);
    state->snapshot = std::make_shared<Snapshot>(state->view, entityNames);
  } catch (...) {
    state->end(SessionOutcome::Cancelled);
    throw;
  }
  return std::make_unique<Session>(std::move(state));
}

Session::Session(std::shared_ptr<detail::SessionState> state) : state_(std::move(state)) {}

Session::~Session() {
  if (state_->phase == detail::SessionState::Phase::Running ||
      state_->phase == detail::SessionState::Phase::CancelSeen) {
    try {
      cancelSyncing();
    } catch (...) {
      // Nothing to do: a session nobody ends counts as cancelled once this process is gone.
    }
  }
}

const std::string& Session::clientIdentifier() const {
  return state_->clientIdentifier;
}

const std::vector<std::string>& Session::entityNames() const {
  return state_->entityNames;
}

void Session::prepareToPullChanges(const std::vector<std::string>& entityNames) {
  state_->ensureRunning();
  std::vector<std::string> entities;
  for (const std::string& name : entityNames) {
    if (contains(state_->entityNames, name) && !contains(entities, name)) entities.push_back(name);
  }
  if (entities.empty()) return;
  detail::Connection& connection = state_->view->connection();
  const std::string& client = state_->clientIdentifier;

  const FilterList filters = storedFilters(connection, client);
  const std::vector<EntityRule> rules =
      entityRules(entities, state_->entityNamesToReplace, filters);
  // None for an entity this preparation leaves out.
  auto findRule = [&](std::string_view entity) -> const EntityRule* {
    for (const EntityRule& rule : rules) {
      if (rule.name == entity) return &rule;
    }
    return nullptr;
  };
  clearUncommittedChanges(connection, entities);
  Statement insert(connection,
                   "INSERT OR IGNORE INTO temp.changes(record_id, record_key, entity, type, "
                   "generation, accepted) VALUES (?, ?, ?, ?, ?, ?)");
  auto add = [&](std::string_view id, std::int64_t key, std::string_view entity, PullAction action,
                 std::int64_t generation) {
    if (action == PullAction::Nothing) return;
    const std::int64_t type = storedChange(action);
    insert.bind(1, id);
    // Only what the client receives points at the record in truth.
    if (type == kAdd || type == kModify) insert.bind(2, key);
    insert.bind(3, entity).bind(4, type).bind(5, generation).bind(6, type == kPrune ? 1 : 0);
    insert.run();
  };

  // One pass over truth and the mirror side by side, both in identifier order, so that no
  // record costs a search of the other side. Truth is read from the entity index alone, and
  // only for the entities asked for: the pass never reads a table row, whose data column
  // would bring every record's bytes, pictures included. What may change, and every record a
  // filter must judge, is then taken in the order truth changed; a record is read and decoded
  // only when a filter judges it. Records the client holds that truth never had (or lost
  // without a tombstone) come last, in identifier order.
  struct Candidate {
    std::int64_t generation;
    std::int64_t key;
    std::string id;
    const EntityRule* rule;
    TruthState state;
    std::optional<std::int64_t> held;
  };
  struct Orphan {
    std::string id;
    const EntityRule* rule;
    std::int64_t generation;
  };
  std::vector<Candidate> candidates;
  std::vector<Orphan> orphans;
  {
    // Each entity's records in identifier order from the index, merged into one walk.
    struct Stream {
      std::unique_ptr<Statement> rows;
      const EntityRule* rule;
      std::string_view id;  // the current row's, valid until the next step
    };
    std::vector<Stream> streams;
    for (const EntityRule& rule : rules) {
      auto rows = std::make_unique<Statement>(
          connection,
          "SELECT key, id, generation, deleted FROM main.records WHERE entity = ?1 ORDER BY id");
      rows->bind(1, rule.name);
      if (rows->step()) {
        const std::string_view id = rows->text(1);
        streams.push_back({std::move(rows), &rule, id});
      }
    }
    // The stream with the smallest identifier on top.
    auto later = [](const Stream& a, const Stream& b) { return a.id > b.id; };
    std::make_heap(streams.begin(), streams.end(), later);
    // A record the client holds under an entity it asked for may have become one of another
    // entity in truth: it is not gone, and nothing is offered for it.
    Statement known(connection, "SELECT 1 FROM main.records WHERE id = ?1");
    auto inTruth = [&](std::string_view id) {
      StatementReset reset(known);
      known.bind(1, id);
      return known.step();
    };
    Statement mirror(connection,
                     "SELECT record_id, generation, entity FROM main.mirror WHERE client_id = ?1 "
                     "ORDER BY record_id");
    mirror.bind(1, client);
    bool mirrorRow = mirror.step();
    // Passes the mirror's records before `id` (none when at the end): truth has none of them
    // among the entities asked for.
    auto passMirrorBefore = [&](const std::string_view* id) {
      while (mirrorRow && (!id || mirror.text(0) < *id)) {
        if (const EntityRule* rule = findRule(mirror.text(2))) {
          if (!inTruth(mirror.text(0))) {
            orphans.push_back({std::string(mirror.text(0)), rule, mirror.integer(1)});
          }
        }
        mirrorRow = mirror.step();
      }
    };
    while (!streams.empty()) {
      std::pop_heap(streams.begin(), streams.end(), later);
      Stream& stream = streams.back();
      Statement& row = *stream.rows;
      const std::string_view id = stream.id;
      passMirrorBefore(&id);
      std::optional<std::int64_t> held;
      if (mirrorRow && mirror.text(0) == id) {
        held = mirror.integer(1);
        mirrorRow = mirror.step();
      }
      const EntityRule* rule = stream.rule;
      const std::int64_t generation = row.integer(2);
      const TruthState state = row.integer(3) != 0 ? TruthState::Gone : TruthState::Live;
      const bool judged = state == TruthState::Live && !rule->judges.empty();
      if (judged || decidePull(state, generation, held, FilterVerdict::Passes, rule->mode) !=
                        PullAction::Nothing) {
        candidates.push_back({generation, row.integer(0), std::string(id), rule, state, held});
      }
      if (row.step()) {
        stream.id = row.text(1);
        std::push_heap(streams.begin(), streams.end(), later);
      } else {
        streams.pop_back();
      }
    }
    passMirrorBefore(nullptr);
  }
  std::sort(candidates.begin(), candidates.end(),
            [](const Candidate& a, const Candidate& b) { return a.generation < b.generation; });
  {
    Statement data(connection, "SELECT data FROM main.records WHERE key = ?");
    for (const Candidate& candidate : candidates) {
      const EntityRule& rule = *candidate.rule;
      FilterVerdict verdict = FilterVerdict::Passes;
      if (candidate.state == TruthState::Live && !rule.judges.empty()) {
        StatementReset reset(data);
        data.bind(1, candidate.key);
        if (data.step()) {
          verdict = judge(rule.judges, detail::decodeRecord(data.blob(0)), candidate.id);
        }
      }
      add(candidate.id, candidate.key, rule.name,
          decidePull(candidate.state, candidate.generation, candidate.held, verdict, rule.mode),
          candidate.generation);
    }
  }
  for (const Orphan& orphan : orphans) {
    add(orphan.id, 0, orphan.rule->name,
        decidePull(TruthState::Gone, orphan.generation, orphan.generation, FilterVerdict::Passes,
                   orphan.rule->mode),
        orphan.generation);
  }
}

ChangeEnumerator Session::changeEnumerator(const std::vector<std::string>& entityNames,
                                           ChangeRecords records) {
  state_->ensureRunning();
  const std::string conditions = "WHERE c.committed = 0 AND c.type <> 4 AND c.entity IN (" +
                                 placeholders(entityNames.size(), 1) + ") ORDER BY c.seq";
  auto statement = std::make_unique<Statement>(
      state_->view->connection(),
      records == ChangeRecords::Decoded
          ? "SELECT c.type, c.record_id, c.entity, r.data FROM temp.changes c "
            "LEFT JOIN main.records r ON r.key = c.record_key AND c.type <> 3 " +
                conditions
          : "SELECT c.type, c.record_id, c.entity, NULL FROM temp.changes c " + conditions);
  for (std::size_t i = 0; i < entityNames.size(); ++i) {
    statement->bind(static_cast<int>(i) + 1, entityNames[i]);
  }
  return ChangeEnumerator(state_, std::move(statement));
}

void Session::clientAcceptedChanges(std::string_view recordIdentifier) {
  state_->ensureRunning();
  state_->view->connection()
      .cached("UPDATE temp.changes SET accepted = 1 WHERE record_id = ? AND committed = 0")
      .bind(1, recordIdentifier)
      .run();
}

void Session::clientAcceptedChangesOf(const std::vector<std::string>& recordIdentifiers) {
  state_->ensureRunning();
  constexpr std::size_t kBatch = 256;
  detail::Connection& connection = state_->view->connection();
  for (std::size_t next = 0; next < recordIdentifiers.size(); next += kBatch) {
    const std::size_t taken = std::min(kBatch, recordIdentifiers.size() - next);
    // Short batches are padded by repeating their last identifier: one statement serves all.
    const std::size_t size = taken == kBatch || taken > 16 ? kBatch : (taken > 1 ? 16 : 1);
    Statement& accept = connection.cached(
        "UPDATE temp.changes SET accepted = 1 WHERE committed = 0 AND record_id IN (" +
        placeholders(size, 1) + ")");
    for (std::size_t i = 0; i < size; ++i) {
      accept.bind(static_cast<int>(i) + 1, recordIdentifiers[next + std::min(i, taken - 1)]);
    }
    accept.run();
  }
}

void Session::clientCommittedAcceptedChanges() {
  state_->ensureRunning();
  detail::Connection& writer = state_->database->writer();
  detail::Connection& view = state_->view->connection();
  {
    detail::WriteTransaction transaction(writer);
    // Checked again under the write lock: a cancel that won the race keeps the mirror intact.
    if (state_->cancelRequested()) {
      state_->phase = detail::SessionState::Phase::CancelSeen;
      state_->ensureRunning();
    }
    // The accepted changes go over to the writer's own temporary table in batches, then
    // reach the mirror in two statements.
    writer.execute(
        "CREATE TEMP TABLE IF NOT EXISTS committing("
        "  record_id TEXT NOT NULL, entity TEXT NOT NULL, generation INTEGER NOT NULL,"
        "  held INTEGER NOT NULL)");
    writer.cached("DELETE FROM temp.committing").run();
    {
      struct Row {
        std::string recordId;
        std::string entity;
        std::int64_t generation;
        bool held;
      };
      constexpr std::size_t kRows = 100;
      std::vector<Row> rows;
      rows.reserve(kRows);
      std::string many = "INSERT INTO temp.committing VALUES (?, ?, ?, ?)";
      for (std::size_t i = 1; i < kRows; ++i) many += ", (?, ?, ?, ?)";
      auto flush = [&] {
        Statement& insert = writer.cached(
            rows.size() == kRows
                ? std::string_view(many)
                : std::string_view("INSERT INTO temp.committing VALUES (?, ?, ?, ?)"));
        const std::size_t perStatement = rows.size() == kRows ? kRows : 1;
        for (std::size_t first = 0; first < rows.size(); first += perStatement) {
          for (std::size_t i = 0; i < perStatement; ++i) {
            const Row& row = rows[first + i];
            const int base = static_cast<int>(4 * i);
            insert.bind(base + 1, row.recordId)
                .bind(base + 2, row.entity)
                .bind(base + 3, row.generation)
                .bind(base + 4, row.held ? 1 : 0);
          }
          insert.run();
        }
        rows.clear();
      };
      auto& accepted = view.cached(
          "SELECT record_id, entity, type, generation FROM temp.changes "
          "WHERE accepted = 1 AND committed = 0 ORDER BY seq");
      StatementReset reset(accepted);
      while (accepted.step()) {
        const std::int64_t type = accepted.integer(2);
        rows.push_back(Row{std::string(accepted.text(0)), std::string(accepted.text(1)),
                           accepted.integer(3), type == kAdd || type == kModify});
        if (rows.size() == kRows) flush();
      }
      flush();
    }
    writer
        .cached(
            "INSERT INTO main.mirror(client_id, record_id, entity, generation) "
            "SELECT ?1, record_id, entity, generation FROM temp.committing WHERE held = 1 "
            "ON CONFLICT(client_id, record_id) DO UPDATE SET entity = excluded.entity, "
            "generation = excluded.generation")
        .bind(1, state_->clientIdentifier)
        .run();
    writer
        .cached(
            "DELETE FROM main.mirror WHERE client_id = ?1 AND record_id IN "
            "(SELECT record_id FROM temp.committing WHERE held = 0)")
        .bind(1, state_->clientIdentifier)
        .run();
    writer.cached("DELETE FROM temp.committing").run();
    transaction.commit();
  }
  view.cached("UPDATE temp.changes SET committed = 1 WHERE accepted = 1 AND committed = 0").run();
}

void Session::finishSyncing() {
  state_->ensureRunning();
  // One statement checks and ends, so a cancel arriving at this very moment is not lost.
  detail::Connection& writer = state_->database->writer();
  writer
      .cached(
          "UPDATE sessions SET outcome = ?, ended_at = ? "
          "WHERE client_id = ? AND token = ? AND outcome = ? AND cancel_requested = 0")
      .bind(1, detail::storedOutcome(SessionOutcome::Finished))
      .bind(2, detail::unixNow())
      .bind(3, state_->clientIdentifier)
      .bind(4, state_->token)
      .bind(5, detail::storedOutcome(SessionOutcome::Running))
      .run();
  if (writer.changes() == 0) {
    state_->phase = detail::SessionState::Phase::CancelSeen;
    state_->ensureRunning();
  }
  state_->phase = detail::SessionState::Phase::Finished;
}

void Session::cancelSyncing() {
  using Phase = detail::SessionState::Phase;
  if (state_->phase == Phase::Finished || state_->phase == Phase::Cancelled) return;
  state_->phase = Phase::Cancelled;
  state_->end(SessionOutcome::Cancelled);
}

bool Session::isCancelled() {
  using Phase = detail::SessionState::Phase;
  if (state_->phase == Phase::Running && state_->cancelRequested()) {
    state_->phase = Phase::CancelSeen;
  }
  return state_->phase == Phase::CancelSeen || state_->phase == Phase::Cancelled;
}

std::shared_ptr<Snapshot> Session::snapshotOfRecordsInTruth() {
  state_->ensureRunning();
  return state_->snapshot;
}

}  // namespace tessel
