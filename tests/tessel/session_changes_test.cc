#include "tessel/exception.h"
#include "tessel/opaque_filter.h"
#include "tessel/schema.h"
#include "tessel/test_store.h"

namespace tessel::testing {
namespace {

using zt::platform::Dictionary;
using zt::platform::Value;

const std::vector<std::string> kContacts{std::string(TesselEntity_Contacts_Contact),
                                         std::string(TesselEntity_Contacts_Group)};

class SessionChanges : public StoreTest {
 protected:
  void SetUp() override {
    StoreTest::SetUp();
    client_ = store_->registerClient("Z1", "Player", kContacts);
  }

  // One whole session as the tool runs it: prepare, accept each change as it is enumerated,
  // commit, finish.
  std::unique_ptr<Session> begin(const Client& client) {
    auto session = Session::begin(client, kContacts);
    session->prepareToPullChanges(kContacts);
    return session;
  }

  std::vector<std::string> syncAll() {
    auto session = begin(*client_);
    std::vector<Change> changes;
    ChangeEnumerator enumerator = session->changeEnumerator(kContacts);
    while (auto change = enumerator.next()) {
      session->clientAcceptedChanges(change->recordIdentifier);
      changes.push_back(std::move(*change));
    }
    session->clientCommittedAcceptedChanges();
    session->finishSyncing();
    return summary(changes);
  }

  std::unique_ptr<Client> client_;
};

TEST_F(SessionChanges, AddsModifiesAndDeletesFollowTruthInTheOrderItChanged) {
  store_->putRecords({contact("c2", "Bob"), contact("c1", "Ann"), group("g1", "Friends")});
  EXPECT_EQ(syncAll(), (std::vector<std::string>{"A:c2", "A:c1", "A:g1"}));
  EXPECT_EQ(client_->mirrorSize(), 3u);
  EXPECT_TRUE(syncAll().empty());
  // A held record that became one of an entity the client does not take is not gone.
  store_->putRecords({{"g1", Dictionary{{std::string(TesselRecordEntityNameKey),
                                         TesselEntity_Calendars_Organizer}}}});
  EXPECT_TRUE(syncAll().empty());

  store_->putRecords({contact("c1", "Anne")});
  store_->deleteRecords({"c2"});
  store_->putRecords({contact("c3", "Cy")});
  auto session = begin(*client_);
  auto changes = drain(*session, kContacts);
  EXPECT_EQ(summary(changes), (std::vector<std::string>{"M:c1", "D:c2", "A:c3"}));
  ASSERT_TRUE(changes[0].record);
  EXPECT_EQ(*changes[0].record->find(TesselAttribute_Contacts_Contact_FirstName), Value("Anne"));
  EXPECT_FALSE(changes[1].record);
  // Enumerators and preparation keep to their entities.
  store_->putRecords({group("g2", "Work")});
  session.reset();
  session = Session::begin(*client_, kContacts);
  session->prepareToPullChanges({std::string(TesselEntity_Contacts_Group)});
  EXPECT_EQ(summary(drain(*session, kContacts)), (std::vector<std::string>{"A:g2"}));
  session->prepareToPullChanges(kContacts);
  EXPECT_EQ(summary(drain(*session, {std::string(TesselEntity_Contacts_Contact)})),
            (std::vector<std::string>{"M:c1", "D:c2", "A:c3"}));
}

TEST_F(SessionChanges, ARecordAFilterNowRefusesBecomesADeleteAndComesBackWhenAllowed) {
  store_->putRecords({contact("c1", "Ann"), contact("c2", "Bob"), group("g1", "Friends")});
  client_->setFilters({std::make_shared<NameFilter>(std::vector<std::string>{"Bob"})});
  EXPECT_EQ(syncAll(), (std::vector<std::string>{"A:c1", "A:g1"}));

  client_->setFilters({std::make_shared<NameFilter>(std::vector<std::string>{"Ann"})});
  EXPECT_EQ(syncAll(), (std::vector<std::string>{"D:c1", "A:c2"}));

  // The filter judges only contacts: a group is never refused. Every filter must accept.
  client_->setFilters({std::make_shared<NameFilter>(std::vector<std::string>{"Friends"}),
                       std::make_shared<OpaqueFilter>("Foreign", zt::platform::Data{1, 2}),
                       std::make_shared<NameFilter>(std::vector<std::string>{"Bob"})});
  EXPECT_EQ(syncAll(), (std::vector<std::string>{"A:c1", "D:c2"}));
}

TEST_F(SessionChanges, ReplaceModeDeliversEveryPassingRecordAsAnAdd) {
  store_->putRecords({contact("c1", "Ann"), contact("c2", "Bob")});
  EXPECT_EQ(syncAll(), (std::vector<std::string>{"A:c1", "A:c2"}));
  store_->deleteRecords({"c2"});
  client_->setFilters({std::make_shared<NameFilter>(std::vector<std::string>{"Cy"})});
  store_->putRecords({contact("c3", "Cy"), contact("c4", "Dee")});

  client_->shouldReplaceClientRecords({std::string(TesselEntity_Contacts_Contact)});
  auto changes = syncAll();
  EXPECT_EQ(changes, (std::vector<std::string>{"A:c1", "A:c4"}));
  // The client now holds exactly what was delivered: c2 (deleted) is forgotten, and a normal
  // session afterwards has nothing to say.
  EXPECT_EQ(client_->mirrorSize(), 2u);
  auto plain = store_->clientWithIdentifier("Z1");
  auto session = begin(*plain);
  EXPECT_TRUE(drain(*session, kContacts).empty());
}

TEST_F(SessionChanges, OnlyAcceptedChangesAreCommittedAndTheOthersComeBack) {
  store_->putRecords({contact("c1", "Ann"), contact("c2", "Bob"), contact("c3", "Cy")});
  {
    auto session = begin(*client_);
    EXPECT_EQ(drain(*session, kContacts).size(), 3u);
    session->clientAcceptedChanges("c2");
    session->clientAcceptedChanges("not a change");
    session->clientCommittedAcceptedChanges();
    // A committed change is not offered again in the same session.
    EXPECT_EQ(summary(drain(*session, kContacts)), (std::vector<std::string>{"A:c1", "A:c3"}));
    session->finishSyncing();
  }
  EXPECT_EQ(client_->mirrorSize(), 1u);
  EXPECT_EQ(syncAll(), (std::vector<std::string>{"A:c1", "A:c3"}));
}

TEST_F(SessionChanges, ChangesWithoutRecordsAndAcceptedInOneCallCommitTheSame) {
  std::vector<Record> records;
  std::vector<std::string> accepted{"not a change"};
  for (int i = 0; i < 300; ++i) {
    records.push_back(contact("c" + std::to_string(i), "Ann"));
    if (i != 7) accepted.push_back("c" + std::to_string(i));
  }
  store_->putRecords(records);
  store_->putRecords({contact("c0", "Anne")});  // c0 changed last
  {
    auto session = begin(*client_);
    const std::vector<Change> full = drain(*session, kContacts);
    std::vector<Change> lean;
    ChangeEnumerator enumerator = session->changeEnumerator(kContacts, ChangeRecords::Omitted);
    while (auto change = enumerator.next()) {
      EXPECT_FALSE(change->record);
      lean.push_back(std::move(*change));
    }
    EXPECT_EQ(summary(lean), summary(full));
    EXPECT_EQ(summary(full).back(), "A:c0");
    session->clientAcceptedChangesOf(accepted);
    session->clientCommittedAcceptedChanges();
    session->finishSyncing();
  }
  EXPECT_EQ(client_->mirrorSize(), 299u);
  EXPECT_EQ(syncAll(), (std::vector<std::string>{"A:c7"}));
  store_->deleteRecords({"c1", "c2"});
  EXPECT_EQ(syncAll(), (std::vector<std::string>{"D:c1", "D:c2"}));
  EXPECT_EQ(client_->mirrorSize(), 298u);
}

TEST_F(SessionChanges, CancelDropsAcceptancesThatWereNotCommitted) {
  store_->putRecords({contact("c1", "Ann"), contact("c2", "Bob")});
  {
    auto session = begin(*client_);
    session->clientAcceptedChanges("c1");
    session->clientCommittedAcceptedChanges();
    session->clientAcceptedChanges("c2");
    session->cancelSyncing();
    EXPECT_TRUE(session->isCancelled());
    EXPECT_THROW(session->clientCommittedAcceptedChanges(), Exception);
    session->cancelSyncing();  // ending twice is harmless
  }
  EXPECT_EQ(client_->mirrorSize(), 1u);
  EXPECT_EQ(client_->lastSession()->outcome, SessionOutcome::Cancelled);
  EXPECT_EQ(syncAll(), (std::vector<std::string>{"A:c2"}));
  EXPECT_EQ(client_->lastSession()->outcome, SessionOutcome::Finished);
}

TEST_F(SessionChanges, TheSessionSnapshotAnswersRecordsAndReferences) {
  store_->putRecords({contact("c1", "Ann", {"g1"}), contact("c2", "Bob"), group("g1", "Friends")});
  auto session = Session::begin(*client_, {std::string(TesselEntity_Contacts_Contact)});
  auto snapshot = session->snapshotOfRecordsInTruth();

  auto bob = snapshot->recordsMatchingAttributes(
      Dictionary{{std::string(TesselAttribute_Contacts_Contact_FirstName), "Bob"}});
  ASSERT_EQ(bob.size(), 1u);
  EXPECT_EQ(bob.begin()->first, "c2");
  // Groups are outside this session's entities.
  EXPECT_EQ(snapshot->recordsWithIdentifiers({"c2", "nope", "g1", "c1"}).size(), 2u);

  auto reference = snapshot->recordReferenceForRecordIdentifier("c1");
  ASSERT_TRUE(reference);
  EXPECT_EQ(snapshot->recordIdentifierForReference(*reference), "c1");
  EXPECT_FALSE(snapshot->recordReferenceForRecordIdentifier("nope"));
  session->finishSyncing();

  // A reference outlives the snapshot, and the record's modification, while the record lives.
  store_->putRecords({contact("c1", "Anne")});
  auto later = store_->snapshotOfRecordsInTruth({}, *client_);
  EXPECT_EQ(later->recordIdentifierForReference(*reference), "c1");
  store_->deleteRecords({"c1"});
  EXPECT_FALSE(
      store_->snapshotOfRecordsInTruth({}, *client_)->recordIdentifierForReference(*reference));
}

TEST_F(SessionChanges, StreamedAndBatchedReadsAnswerWhatTheMapsAnswer) {
  std::vector<Record> records;
  std::vector<std::string> identifiers{"nope", "g1"};
  for (int i = 0; i < 300; ++i) {
    Record record = contact("c" + std::to_string(i), i % 2 ? "Ann" : "Bob", {"g1"});
    if (i % 3 == 0)
      record.record.set(std::string(TesselAttribute_Contacts_Contact_Image),
                        Value(zt::platform::Data(1000, static_cast<std::uint8_t>(i))));
    records.push_back(std::move(record));
    identifiers.push_back("c" + std::to_string(299 - i));
    if (i % 7 == 0) identifiers.push_back("c" + std::to_string(i));  // asked twice
  }
  records.push_back(group("g1", "Friends"));
  store_->putRecords(records);
  auto session = Session::begin(*client_, {std::string(TesselEntity_Contacts_Contact)});
  auto snapshot = session->snapshotOfRecordsInTruth();
  const std::string image(TesselAttribute_Contacts_Contact_Image);
  auto visited = [](auto&& read) {
    RecordMap seen;
    std::string last;
    read([&](Record& record) {
      EXPECT_LT(last, record.id);  // identifier order, each once
      last = record.id;
      seen.emplace(std::move(record.id), std::move(record.record));
    });
    return seen;
  };
  auto withoutImages = [&](RecordMap read) {
    for (auto& [identifier, record] : read) record.erase(image);
    return read;
  };

  for (const Dictionary& criteria :
       {Dictionary{{std::string(TesselRecordEntityNameKey), TesselEntity_Contacts_Contact}},
        Dictionary{{std::string(TesselAttribute_Contacts_Contact_FirstName), "Ann"}}, Dictionary{},
        Dictionary{{std::string(TesselRecordEntityNameKey), TesselEntity_Contacts_Group}}}) {
    const RecordMap expected = snapshot->recordsMatchingAttributes(criteria);
    EXPECT_EQ(visited([&](auto visit) { snapshot->forEachRecordMatching(criteria, visit); }),
              expected);
    EXPECT_EQ(
        visited([&](auto visit) { snapshot->forEachRecordMatching(criteria, visit, {image}); }),
        withoutImages(expected));
  }
  EXPECT_EQ(snapshot->recordsMatchingAttributes({}).size(), 300u);

  const RecordMap asked = snapshot->recordsWithIdentifiers(identifiers);
  EXPECT_EQ(asked.size(), 300u);  // the group is outside the view, "nope" unknown
  EXPECT_EQ(
      visited([&](auto visit) { snapshot->forEachRecordWithIdentifiers(identifiers, visit); }),
      asked);
  EXPECT_EQ(visited([&](auto visit) {
              snapshot->forEachRecordWithIdentifiers(identifiers, visit, {image});
            }),
            withoutImages(asked));
  EXPECT_EQ(snapshot->recordsWithIdentifiers({"c3"}).size(), 1u);

  // An omitted attribute is still there to be asked for, one record at a time.
  EXPECT_EQ(snapshot->attributeOfRecord("c3", image),
            Value(zt::platform::Data(1000, static_cast<std::uint8_t>(3))));
  EXPECT_FALSE(snapshot->attributeOfRecord("c1", image));
  EXPECT_FALSE(snapshot->attributeOfRecord("g1", "name"));
  EXPECT_FALSE(snapshot->attributeOfRecord("nope", image));
  // And criteria may name it.
  Dictionary byImage{{image, Value(zt::platform::Data(1000, static_cast<std::uint8_t>(3)))}};
  EXPECT_EQ(visited([&](auto visit) { snapshot->forEachRecordMatching(byImage, visit, {image}); }),
            withoutImages(snapshot->recordsMatchingAttributes(byImage)));
  session->finishSyncing();
}

}  // namespace
}  // namespace tessel::testing
