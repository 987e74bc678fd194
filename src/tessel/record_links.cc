#include "tessel/record_links.h"

#include <algorithm>
#include <cstdint>
#include <map>
#include <set>
#include <unordered_set>
#include <utility>

#include "tessel/schema.h"
#include "tessel/value_codec.h"

namespace tessel::detail {

namespace {

using zt::platform::Array;
using zt::platform::Dictionary;
using zt::platform::Value;

struct EntityRelationships {
  std::string_view entity;
  std::vector<std::string_view> keys;
};

// Only relationships hold identifiers; other arrays (exception dates) are values.
const std::vector<EntityRelationships>& relationships() {
  static const std::vector<EntityRelationships> table = {
      {TesselEntity_Contacts_Contact,
       {TesselRelationship_Contacts_Contact_ParentGroups,
        TesselRelationship_Contacts_Contact_PhoneNumbers,
        TesselRelationship_Contacts_Contact_EmailAddresses,
        TesselRelationship_Contacts_Contact_StreetAddresses,
        TesselRelationship_Contacts_Contact_URLs, TesselRelationship_Contacts_Contact_IMs}},
      {TesselEntity_Contacts_Group, {TesselRelationship_Contacts_Group_Members}},
      {TesselEntity_Calendars_CalendarOrder,
       {TesselRelationship_Calendars_CalendarOrder_Calendars}},
      {TesselEntity_Calendars_Calendar,
       {TesselRelationship_Calendars_Calendar_Events, TesselRelationship_Calendars_Calendar_Tasks}},
      {TesselEntity_Calendars_Event,
       {TesselRelationship_Calendars_Event_Recurrences,
        TesselRelationship_Calendars_Event_AudioAlarms,
        TesselRelationship_Calendars_Event_MailAlarms,
        TesselRelationship_Calendars_Event_DisplayAlarms,
        TesselRelationship_Calendars_Event_Organizer, TesselRelationship_Calendars_Event_Attendees,
        TesselRelationship_Calendars_Event_DetachedEvents,
        TesselRelationship_Calendars_Event_Calendar}},
      {TesselEntity_Calendars_Task, {TesselRelationship_Calendars_Task_Calendar}},
  };
  return table;
}

const std::vector<std::string_view>* relationshipKeysOf(std::string_view entity) {
  for (const EntityRelationships& entry : relationships()) {
    if (entry.entity == entity) return &entry.keys;
  }
  return nullptr;
}

// The index keys targets by a 64-bit FNV-1a hash of their identifier rather than its text:
// a fifth of the size for the half million links of a large store, and a target need not exist
// when it is named. A collision only makes a deletion read a record that names something else,
// and leaving that record as it was writes nothing. The hash must never change: stores keep it.
std::int64_t identifierHash(std::string_view identifier) {
  std::uint64_t hash = 14695981039346656037ULL;
  for (unsigned char c : identifier) {
    hash ^= c;
    hash *= 1099511628211ULL;
  }
  return static_cast<std::int64_t>(hash);
}

}  // namespace

LinkIndexer::LinkIndexer(Connection& connection) : connection_(connection) {
  auto& largest = connection_.cached("SELECT max(key) FROM records");
  StatementReset reset(largest);
  if (largest.step() && !largest.isNull(0)) largestOldKey_ = largest.integer(0);
}

bool LinkIndexer::firstTouch(std::int64_t key) {
  if (key > largestOldKey_) {
    if (key <= largestNewKey_) return false;
    largestNewKey_ = key;
    return true;
  }
  return touched_.insert(key).second;
}

void LinkIndexer::forget(std::int64_t key) {
  if (!firstTouch(key)) {
    // Written twice in one transaction: the first version's entries may still wait.
    std::erase_if(pending_, [key](const auto& link) { return link.second == key; });
  }
  if (key <= largestOldKey_) {
    connection_.cached("DELETE FROM record_links WHERE source = ?").bind(1, key).run();
  }
}

void LinkIndexer::written(std::int64_t key, std::string_view entity, const Dictionary& record) {
  forget(key);
  const auto* keys = relationshipKeysOf(entity);
  if (!keys) return;
  for (std::string_view relationship : *keys) {
    const Value* value = record.find(relationship);
    const Array* identifiers = value ? value->asArray() : nullptr;
    if (!identifiers) continue;
    for (const Value& identifier : *identifiers) {
      if (const std::string* text = identifier.asString()) {
        pending_.emplace_back(identifierHash(*text), key);
      }
    }
  }
}

void LinkIndexer::deleted(std::int64_t key) {
  forget(key);
}

void LinkIndexer::flush() {
  constexpr std::size_t kRowsPerStatement = 100;
  std::sort(pending_.begin(), pending_.end());
  pending_.erase(std::unique(pending_.begin(), pending_.end()), pending_.end());
  std::string many = "INSERT OR IGNORE INTO record_links(target, source) VALUES (?, ?)";
  for (std::size_t i = 1; i < kRowsPerStatement; ++i) many += ", (?, ?)";
  std::size_t next = 0;
  while (next < pending_.size()) {
    const std::size_t rows = std::min(kRowsPerStatement, pending_.size() - next);
    Statement& insert = connection_.cached(
        rows == kRowsPerStatement
            ? std::string_view(many)
            : std::string_view("INSERT OR IGNORE INTO record_links(target, source) VALUES (?, ?)"));
    const std::size_t bound = rows == kRowsPerStatement ? rows : 1;
    for (std::size_t row = 0; row < bound; ++row) {
      const auto& [target, source] = pending_[next + row];
      insert.bind(static_cast<int>(2 * row + 1), target)
          .bind(static_cast<int>(2 * row + 2), source);
    }
    insert.run();
    next += bound;
  }
  pending_.clear();
  touched_.clear();
  // The records added so far have their entries in the table now.
  largestOldKey_ = std::max(largestOldKey_, largestNewKey_);
}

std::vector<Record> recordsWithoutLinksTo(Connection& connection,
                                          const std::vector<std::string>& removed,
                                          std::vector<std::string>& entities) {
  std::set<std::int64_t> sources;
  {
    auto& naming = connection.cached("SELECT source FROM record_links WHERE target = ?");
    for (const std::string& identifier : removed) {
      StatementReset reset(naming);
      naming.bind(1, identifierHash(identifier));
      while (naming.step()) sources.insert(naming.integer(0));
    }
  }
  const std::unordered_set<std::string_view> gone(removed.begin(), removed.end());
  std::map<std::string, std::pair<std::string, Dictionary>> changed;  // in identifier order
  auto& load =
      connection.cached("SELECT id, entity, data FROM records WHERE key = ? AND deleted = 0");
  for (std::int64_t source : sources) {
    StatementReset reset(load);
    load.bind(1, source);
    if (!load.step()) continue;
    std::string entity(load.text(1));
    Dictionary record = decodeRecord(load.blob(2));
    bool touched = false;
    for (std::string_view key : *relationshipKeysOf(entity)) {
      Value* value = record.find(key);
      Array* identifiers = value ? value->asArray() : nullptr;
      if (!identifiers) continue;
      auto kept = std::remove_if(identifiers->begin(), identifiers->end(), [&](const Value& v) {
        const std::string* text = v.asString();
        return text && gone.contains(*text);
      });
      if (kept == identifiers->end()) continue;
      identifiers->erase(kept, identifiers->end());
      if (identifiers->empty()) record.erase(key);
      touched = true;
    }
    if (touched) changed.emplace(std::string(load.text(0)), std::pair(entity, std::move(record)));
  }
  std::vector<Record> records;
  entities.clear();
  for (auto& [identifier, entry] : changed) {
    records.push_back(Record{identifier, std::move(entry.second)});
    entities.push_back(std::move(entry.first));
  }
  return records;
}

void indexEveryRecord(Connection& connection) {
  LinkIndexer indexer(connection);
  {
    auto& all = connection.cached("SELECT key, entity, data FROM records WHERE deleted = 0");
    StatementReset reset(all);
    while (all.step()) {
      std::string_view entity = all.text(1);
      if (!relationshipKeysOf(entity)) continue;
      indexer.written(all.integer(0), entity, decodeRecord(all.blob(2)));
    }
  }
  indexer.flush();
}

}  // namespace tessel::detail
