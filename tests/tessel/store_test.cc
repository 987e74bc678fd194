#include <sqlite3.h>

#include <cmath>
#include <fstream>

#include "platform/calendar_date.h"
#include "support/scoped_environment.h"
#include "tessel/exception.h"
#include "tessel/schema.h"
#include "tessel/test_store.h"

namespace tessel::testing {
namespace {

using zt::platform::Array;
using zt::platform::CalendarDate;
using zt::platform::Data;
using zt::platform::Dictionary;
using zt::platform::Number;
using zt::platform::TimeZone;
using zt::platform::Url;
using zt::platform::Value;

CalendarDate dateIn(const TimeZone& zone, CalendarDate::Fields fields,
                    std::uint32_t nanoseconds = 0) {
  CalendarDate date = CalendarDate::fromFields(fields, zone);
  return CalendarDate(date.instant(), zone, nanoseconds);
}

// Keys deliberately out of alphabetical order: the order is part of the record.
Dictionary everyKind() {
  return Dictionary{
      {std::string(TesselRecordEntityNameKey), TesselEntity_Calendars_Event},
      {"zeta", "UTF-8 text: \xc3\xa9t\xc3\xa9"},
      {"integer", Value::integer(-9007199254740993)},
      {"real", Value::real(2.5)},
      {"negative zero", Value::real(-0.0)},
      {"yes", Value::boolean(true)},
      {"one", Value::integer(1)},
      {"named", dateIn(*TimeZone::named("Europe/Paris"), {2007, 3, 15, 12, 30, 0}, 123456789)},
      {"gmt", dateIn(TimeZone::gmt(), {2007, 3, 15, 12, 0, 0})},
      {"floating", dateIn(TimeZone::local(), {2030, 1, 2, 3, 4, 5})},
      {"unnamed",
       dateIn(*TimeZone::unnamed(3600, 7200, "M3.5.0,M10.5.0/3"), {2007, 7, 1, 9, 0, 0})},
      {"fixed", dateIn(*TimeZone::unnamed(-18000), {2007, 7, 1, 9, 0, 0})},
      {"before epoch", dateIn(TimeZone::gmt(), {1601, 1, 1, 0, 0, 0})},
      {"url", Url{"https://example.org/x?y=1"}},
      {"url looking text", "https://example.org/x?y=1"},
      {"data", Data{0x00, 0xff, 0x10, 0x00}},
      {"array", Array{"a", Value::integer(2), Array{}, Dictionary{{"k", "v"}}}},
      {"dictionary", Dictionary{{"b", "2"}, {"a", "1"}}},
  };
}

Record calendar(std::string id) {
  return Record{
      id, Dictionary{{std::string(TesselRecordEntityNameKey), TesselEntity_Calendars_Calendar},
                     {"title", id}}};
}

using StoreRecords = StoreTest;

TEST_F(StoreRecords, EveryValueKindAndKeyOrderSurviveTheStoreAndAReopen) {
  Dictionary original = everyKind();
  ASSERT_EQ(store_->putRecords({{"event-1", original}}), 1u);
  store_.reset();
  store_ = Store::open(storePath_, StoreOpening::MustExist);
  auto back = store_->record("event-1");
  ASSERT_TRUE(back);
  EXPECT_EQ(*back, original);

  // Equality of numbers and zones could hide a change of kind; check the kinds themselves.
  EXPECT_EQ(back->find("one")->asNumber()->kind(), Number::Kind::Integer);
  EXPECT_EQ(back->find("yes")->asNumber()->kind(), Number::Kind::Boolean);
  EXPECT_EQ(back->find("real")->asNumber()->kind(), Number::Kind::Real);
  EXPECT_TRUE(std::signbit(back->find("negative zero")->asNumber()->doubleValue()));
  EXPECT_EQ(back->find("named")->asDate()->nanoseconds(), 123456789u);
  EXPECT_TRUE(back->find("floating")->asDate()->timeZone().isLocal());
  EXPECT_EQ(back->find("unnamed")->asDate()->timeZone().daylightRule(), "M3.5.0,M10.5.0/3");
  EXPECT_EQ(back->find("url")->kind(), Value::Kind::Url);
  EXPECT_EQ(back->find("url looking text")->kind(), Value::Kind::String);
}

TEST_F(StoreRecords, GenerationsGrowWithChangesOnlyAndDeletesLeaveTombstones) {
  store_->putRecords({contact("c1", "Ann"), contact("c2", "Bob")});
  std::int64_t afterPut = store_->generation();
  EXPECT_EQ(afterPut, 2);

  // Writing identical data again changes nothing.
  EXPECT_EQ(store_->putRecords({contact("c1", "Ann"), contact("c2", "Bobby")}), 1u);
  EXPECT_EQ(store_->generation(), afterPut + 1);

  EXPECT_EQ(store_->deleteRecords({"c1", "unknown"}), 1u);
  EXPECT_FALSE(store_->record("c1"));
  EXPECT_EQ(store_->recordCount(), 1u);
  EXPECT_EQ(store_->generation(), afterPut + 2);

  // A failing delete of several records deletes none of them.
  EXPECT_THROW(store_->deleteRecords({"c2", "missing"}, MissingRecords::Fail), Exception);
  EXPECT_TRUE(store_->record("c2"));

  // A record put again after its deletion lives again.
  store_->putRecords({contact("c1", "Ann")});
  EXPECT_TRUE(store_->record("c1"));
}

TEST_F(StoreRecords, ChangesAppliedTogetherLandTogetherOrNotAtAll) {
  store_->putRecords({calendar("old")});
  std::int64_t before = store_->generation();

  // An order that names no calendar fails the whole batch: the puts and deletes before it
  // are rolled back with it.
  EXPECT_THROW(store_->applyChanges({{calendar("new")}, {"old"}, std::vector<std::string>{"x"}}),
               Exception);
  EXPECT_EQ(store_->generation(), before);
  EXPECT_TRUE(store_->record("old"));
  EXPECT_FALSE(store_->record("new"));

  AppliedChanges applied = store_->applyChanges(
      {{calendar("new")}, {"old", "never-there"}, std::vector{std::string("new")}});
  EXPECT_EQ(applied.written, 1u);
  EXPECT_EQ(applied.deleted, 1u);
  EXPECT_FALSE(store_->record("old"));
  EXPECT_EQ(store_->recordCount(TesselEntity_Calendars_CalendarOrder), 1u);
}

using StoreRelationships = StoreTest;

Record entity(std::string id, std::string_view entityName) {
  return Record{std::move(id), Dictionary{{std::string(TesselRecordEntityNameKey), entityName}}};
}

Record event(std::string id, std::string organizer, Array attendees) {
  return Record{
      std::move(id),
      Dictionary{{std::string(TesselRecordEntityNameKey), TesselEntity_Calendars_Event},
                 {std::string(TesselAttribute_Calendars_Event_Summary), "Review"},
                 {std::string(TesselRelationship_Calendars_Event_Organizer), Array{organizer}},
                 {std::string(TesselRelationship_Calendars_Event_Attendees), attendees},
                 {std::string(TesselRelationship_Calendars_Event_Calendar), Array{"k1"}}}};
}

Record members(std::string id, Array identifiers) {
  Record record = group(std::move(id), "Friends");
  record.record.set(TesselRelationship_Contacts_Group_Members, Value(std::move(identifiers)));
  return record;
}

// The generation the store file holds for one record, read beside the store.
std::int64_t generationOf(const std::filesystem::path& store, const std::string& id) {
  sqlite3* db = nullptr;
  EXPECT_EQ(sqlite3_open(store.c_str(), &db), SQLITE_OK);
  sqlite3_stmt* query = nullptr;
  sqlite3_prepare_v2(db, "SELECT generation FROM records WHERE id = ?", -1, &query, nullptr);
  sqlite3_bind_text(query, 1, id.c_str(), -1, SQLITE_TRANSIENT);
  std::int64_t generation = sqlite3_step(query) == SQLITE_ROW ? sqlite3_column_int64(query, 0) : -1;
  sqlite3_finalize(query);
  sqlite3_close(db);
  return generation;
}

// Runs `sql` on the store file beside the store.
void execute(const std::filesystem::path& store, const char* sql) {
  sqlite3* db = nullptr;
  ASSERT_EQ(sqlite3_open(store.c_str(), &db), SQLITE_OK);
  EXPECT_EQ(sqlite3_exec(db, sql, nullptr, nullptr, nullptr), SQLITE_OK);
  sqlite3_close(db);
}

TEST_F(StoreRelationships, ADeletedRecordLeavesEveryRelationshipThatNamedIt) {
  store_->putRecords({calendar("k1"), entity("o1", TesselEntity_Calendars_Organizer),
                      entity("a1", TesselEntity_Calendars_Attendee),
                      entity("a2", TesselEntity_Calendars_Attendee),
                      event("e1", "o1", {"a1", "a2"}), event("e2", "o1", {"a2"}),
                      event("untouched", "o2", {"a1"})});
  const std::int64_t before = generationOf(storePath_, "untouched");

  EXPECT_EQ(store_->deleteRecords({"o1", "a2"}), 2u);

  // Each naming record is written once, after the deletes; an emptied relationship goes, as
  // an importer leaves it out; the others stay in their order.
  const std::int64_t deletedAt = generationOf(storePath_, "a2");
  EXPECT_GT(generationOf(storePath_, "e1"), deletedAt);
  EXPECT_GT(generationOf(storePath_, "e2"), deletedAt);
  EXPECT_EQ(store_->generation(), deletedAt + 2);
  EXPECT_EQ(generationOf(storePath_, "untouched"), before);
  Dictionary expected = event("e1", "o1", {"a1"}).record;
  expected.erase(TesselRelationship_Calendars_Event_Organizer);
  EXPECT_EQ(*store_->record("e1"), expected);
  EXPECT_FALSE(store_->record("e2")->contains(TesselRelationship_Calendars_Event_Attendees));

  // A record put again names what it names: the index follows rewrites too.
  store_->putRecords({entity("o1", TesselEntity_Calendars_Organizer), event("e1", "o1", {})});
  store_->deleteRecords({"k1"});
  EXPECT_FALSE(store_->record("e1")->contains(TesselRelationship_Calendars_Event_Calendar));
  EXPECT_TRUE(store_->record("e1")->contains(TesselRelationship_Calendars_Event_Organizer));
}

TEST_F(StoreRelationships, GroupsLoseDeletedMembersAndImportsDropThemInTheSameTransaction) {
  store_->putRecords({contact("c1", "Ann", {"g1"}), contact("c2", "Bob", {"g1"}),
                      contact("c3", "Cy"), members("g1", {"c1", "c2", "c3"}),
                      members("g2", {"g1", "c3"})});

  // What an import with --sync-deletes writes: the contacts it no longer saw, and a group.
  store_->applyChanges({{members("g3", {"c2", "c3"})}, {"c1", "c2", "g1"}, std::nullopt});
  EXPECT_EQ(*store_->record("g2"), members("g2", {"c3"}).record);
  EXPECT_EQ(*store_->record("g3"), members("g3", {"c3"}).record);
  // Values that merely look like identifiers are not relationships.
  store_->putRecords(
      {{"n1", Dictionary{{std::string(TesselRecordEntityNameKey), TesselEntity_Contacts_Contact},
                         {std::string(TesselAttribute_Contacts_Contact_Notes), "c3"}}}});
  store_->deleteRecords({"c3"});
  EXPECT_EQ(*store_->record("n1")->find(TesselAttribute_Contacts_Contact_Notes), Value("c3"));
  EXPECT_FALSE(store_->record("g2")->contains(TesselRelationship_Contacts_Group_Members));
}

TEST_F(StoreRelationships, AStoreFromBeforeTheIndexIsIndexedWhenOpened) {
  store_->putRecords(
      {entity("o1", TesselEntity_Calendars_Organizer), calendar("k1"), event("e1", "o1", {})});
  store_.reset();
  // The first schema: no link index, and the entity index without identifiers.
  execute(storePath_,
          "DROP TABLE record_links; DROP INDEX records_by_entity_id; "
          "CREATE INDEX records_by_entity ON records(entity, deleted); "
          "UPDATE schema_version SET version = 1");

  store_ = Store::open(storePath_, StoreOpening::MustExist);
  EXPECT_EQ(store_->schemaVersion(), 3);
  store_->deleteRecords({"o1"});
  EXPECT_FALSE(store_->record("e1")->contains(TesselRelationship_Calendars_Event_Organizer));
}

using StoreFile = StoreTest;

TEST_F(StoreFile, PathRulesFollowOptionThenEnvironment) {
  zt::test_support::ScopedEnvironment environment;
  environment.set("TESSEL_STORE", "/s/truth.db");
  environment.set("XDG_DATA_HOME", "/xdg");
  environment.set("HOME", "/home/u");
  EXPECT_EQ(Store::resolvePath(std::filesystem::path("/given.db")), "/given.db");
  EXPECT_EQ(Store::resolvePath(), "/s/truth.db");
  environment.unset("TESSEL_STORE");
  EXPECT_EQ(Store::resolvePath(), "/xdg/tessel/truth.db");
  environment.unset("XDG_DATA_HOME");
  EXPECT_EQ(Store::resolvePath(), "/home/u/.local/share/tessel/truth.db");
}

TEST_F(StoreFile, IsWalAndRefusesWhatIsNotAStoreOfItsSchema) {
  EXPECT_TRUE(std::filesystem::exists(storePath_.string() + "-wal"));
  EXPECT_THROW(Store::open(folder_ / "absent.db", StoreOpening::MustExist), Exception);
  EXPECT_FALSE(std::filesystem::exists(folder_ / "absent.db"));
  std::ofstream(folder_ / "garbage.db") << std::string(8192, 'x');
  EXPECT_THROW(Store::open(folder_ / "garbage.db"), Exception);

  store_.reset();
  execute(storePath_, "UPDATE schema_version SET version = 99");
  EXPECT_THROW(Store::open(storePath_), Exception);
}

}  // namespace
}  // namespace tessel::testing
