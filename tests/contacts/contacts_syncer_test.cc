// The contacts half of whole syncs, run again and again on one virtual player: what makes the
// file go out, what keeps it untouched, the group filter, and failed or cancelled runs.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <chrono>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "contacts/contacts_sync_fixture.h"
#include "contacts/zt_contacts_syncer.h"
#include "filters/zeto_contact_filter.h"
#include "tessel/schema.h"

namespace zt::contacts::testing {
namespace {

constexpr std::string_view kAnn =
    R"({"id": "ann", "record": {"tessel.record.entity": "tessel.contacts.Contact", "first name": "Ann", "phone numbers": ["ann-phone"]}}
{"id": "ann-phone", "record": {"tessel.record.entity": "tessel.contacts.PhoneNumber", "value": "555-0101", "type": "mobile"}})";

// The file's identity on disk: an atomic write always makes a new file.
ino_t inode(const std::filesystem::path& path) {
  struct stat info {};
  return ::stat(path.c_str(), &info) == 0 ? info.st_ino : 0;
}

class PushDecision : public ContactsSyncTest {
 protected:
  // A first run that pushes, so that the next one has nothing to do.
  void settle() {
    put(kAnn);
    const SyncOutcome first = sync();
    ASSERT_EQ(first.lastStatus, 0);
    EXPECT_EQ(first.uploadingProgress, (std::vector<double>{0, 34, 68, 100, 100}));
    ASSERT_TRUE(std::filesystem::exists(vcfPath()));
    written_ = inode(vcfPath());
  }
  bool rewritten() const { return inode(vcfPath()) != written_; }

  ino_t written_ = 0;
};

TEST_F(PushDecision, TheSavedDateIsComparedAsAnInstant) {
  settle();
  // The same instant as the stored GMT date, written at another UTC offset (as a date set by
  // hand with an offset would be stored).
  const std::optional<platform::Value> saved = client()->setting("LastModDateForVCF");
  ASSERT_TRUE(saved && saved->asDate());
  platform::CalendarDate shifted = *saved->asDate();
  shifted.setTimeZone(*platform::TimeZone::named("Asia/Kolkata"));
  client()->setSetting("LastModDateForVCF", platform::Value(shifted));
  const SyncOutcome outcome = sync();
  EXPECT_TRUE(outcome.logged("Nothing to push for contacts..."));
  EXPECT_EQ(outcome.uploadingProgress, (std::vector<double>{0, 100, 100}));
  EXPECT_FALSE(rewritten());
}

TEST_F(PushDecision, TheFirstReasonToPushEndsTheChain) {
  settle();
  std::filesystem::last_write_time(
      vcfPath(), std::filesystem::last_write_time(vcfPath()) + std::chrono::seconds(3));
  const SyncOutcome outcome = sync(PlayerPhotos::Accepted, "AlwaysPushVCard = yes\n");
  EXPECT_TRUE(
      outcome.logged("Last mod date of VCF on Zeto is not the one we saved, force pushing VCF"));
  for (const std::string& line : outcome.log) {
    EXPECT_EQ(line.find("previous sync"), std::string::npos) << line;
    EXPECT_EQ(line.find("Previous sync"), std::string::npos) << line;
    EXPECT_NE(line, "Force pushing per AlwaysPushVCard defaults");
  }
}

TEST_F(PushDecision, AFailedWriteCommitsNothingAndTheNextRunPushesAgain) {
  put(kAnn);
  // A folder in the file's place makes the rename of the new file fail, even for root.
  std::filesystem::create_directories(vcfPath() / "in the way");
  const SyncOutcome failed = sync();
  EXPECT_EQ(failed.lastStatus, -8865);
  EXPECT_TRUE(failed.logged("Unabled to write file on Zeto"));
  EXPECT_EQ(failed.uploadingProgress, (std::vector<double>{0, 34, 68, 100}));
  EXPECT_FALSE(client()->setting("LastModDateForVCF"));
  EXPECT_FALSE(client()->setting("DidSyncContactImages"));
  EXPECT_EQ(client()->mirrorSize(), 0u);

  std::filesystem::remove_all(vcfPath());
  const SyncOutcome next = sync();
  EXPECT_EQ(next.lastStatus, 0);
  EXPECT_TRUE(next.logged("List of contacts to push has changed"));
  EXPECT_EQ(client()->mirrorSize(), 2u);
}

TEST_F(PushDecision, AWriteWithoutCardsNeverAsksThePlayerAboutPhotos) {
  // A change (a group) but no contact: no card asks for a photo, and the failed write stores
  // no photo setting, so nothing needs the player's capabilities.
  put(R"({"id": "friends", "record": {"tessel.record.entity": "tessel.contacts.Group", "name": "Friends"}})");
  std::filesystem::create_directories(vcfPath() / "in the way");
  const SyncOutcome failed = sync(PlayerPhotos::Accepted);
  EXPECT_EQ(failed.lastStatus, -8865);
  for (const std::string& line : failed.log)
    EXPECT_EQ(line.rfind("Sync Contact Images", 0), std::string::npos) << line;
}

// Another process cancels the session just before the contacts step starts, or while the
// cards are being built.
class CancelledFromOutside final : public sync::ContactsSyncing {
 public:
  CancelledFromOutside(sync::ZTSyncManager& manager, std::filesystem::path store, bool building)
      : syncer_(manager), store_(std::move(store)), building_(building) {}
  bool doSync() override {
    if (!building_) {
      tessel::Store::open(store_)->cancelSession(kClientID);
      return syncer_.doSync();
    }
    if (!syncer_.getChanges()) return false;
    syncer_.contactTruthSnapshot();
    tessel::Store::open(store_)->cancelSession(kClientID);
    return syncer_.disassembleData() && syncer_.uploadChanges();
  }
  bool shouldApplyContactGroupWithIdentifier(const std::string& identifier) override {
    return syncer_.shouldApplyContactGroupWithIdentifier(identifier);
  }

 private:
  ZTContactsSyncer syncer_;
  std::filesystem::path store_;
  bool building_;
};

TEST_F(PushDecision, ACancelledSessionStopsTheRunWithItsStatusWhenEverItIsSeen) {
  put(kAnn);
  for (const bool building : {false, true}) {
    SCOPED_TRACE(building);
    const SyncOutcome cancelled =
        sync(PlayerPhotos::Refused, "", [this, building](sync::ZTSyncManager& m) {
          return std::make_unique<CancelledFromOutside>(m, storePath_, building);
        });
    EXPECT_EQ(cancelled.lastStatus, -8864);
    EXPECT_TRUE(cancelled.logged(building ? "Sync session is cancelled"
                                          : "Exception while getting changes:"));
    EXPECT_FALSE(std::filesystem::exists(vcfPath()));
    EXPECT_EQ(client()->mirrorSize(), 0u);
  }
  EXPECT_TRUE(sync().logged("List of contacts to push has changed"));
}

class ContactGroupFilter : public ContactsSyncTest {
 protected:
  void SetUp() override {
    ContactsSyncTest::SetUp();
    // gA and gB contain each other; gB also holds gD; gC stands apart.
    put(R"({"id": "gA", "record": {"tessel.record.entity": "tessel.contacts.Group", "name": "A", "members": ["c1", "gB"]}}
{"id": "gB", "record": {"tessel.record.entity": "tessel.contacts.Group", "name": "B", "members": ["c2", "gA", "gD"]}}
{"id": "gC", "record": {"tessel.record.entity": "tessel.contacts.Group", "name": "C", "members": ["c3"]}}
{"id": "gD", "record": {"tessel.record.entity": "tessel.contacts.Group", "name": "D", "members": ["c5"]}}
{"id": "c1", "record": {"tessel.record.entity": "tessel.contacts.Contact", "first name": "One", "parent groups": ["gA"]}}
{"id": "c2", "record": {"tessel.record.entity": "tessel.contacts.Contact", "first name": "Two", "parent groups": ["gB"]}}
{"id": "c3", "record": {"tessel.record.entity": "tessel.contacts.Contact", "first name": "Three", "parent groups": ["gC"]}}
{"id": "c4", "record": {"tessel.record.entity": "tessel.contacts.Contact", "first name": "Four"}}
{"id": "c5", "record": {"tessel.record.entity": "tessel.contacts.Contact", "first name": "Five", "parent groups": ["gC", "gD"]}})");
  }

  void select(const std::vector<std::string>& groups) {
    std::unique_ptr<tessel::Client> c = client();
    auto filter = std::make_shared<filters::ZetoContactFilter>();
    if (!groups.empty()) {
      filter->setUseAllContacts(false);
      filter->setUsedContactGroupIDs(groups,
                                     *store_->snapshotOfRecordsInTruth(
                                         {std::string(tessel::TesselEntity_Contacts_Group)}, *c));
    }
    c->setFilters({filter});
  }

  std::vector<std::string> firstNames() {
    std::vector<std::string> names;
    const std::string text = fileText();
    for (std::size_t at = text.find("N:;"); at != std::string::npos;
         at = text.find("N:;", at + 1)) {
      names.push_back(text.substr(at + 3, text.find(';', at + 3) - at - 3));
    }
    return names;
  }
};

TEST_F(ContactGroupFilter, SubGroupsAreExpandedOnceEvenInACycle) {
  select({"gA"});
  const SyncOutcome outcome = sync();
  ASSERT_EQ(outcome.lastStatus, 0);
  EXPECT_EQ(outcome.count("Adding sub-group with ID gB to filter"), 1u);
  EXPECT_EQ(outcome.count("Adding sub-group with ID gD to filter"), 1u);
  EXPECT_EQ(outcome.count("Adding sub-group with ID gA to filter"), 0u);
  EXPECT_EQ(firstNames(), (std::vector<std::string>{"One", "Two", "Five"}));
  // Only the selected contacts (and every record of the other entities) are held.
  EXPECT_EQ(client()->mirrorSize(), 3u + 4u);
  select({"gC"});
  ASSERT_EQ(sync().lastStatus, 0);
  EXPECT_EQ(firstNames(), (std::vector<std::string>{"Three", "Five"}));
  select({});
  ASSERT_EQ(sync().lastStatus, 0);
  EXPECT_EQ(firstNames(), (std::vector<std::string>{"One", "Two", "Three", "Four", "Five"}));
}

// Each reason to push, after a run that left nothing to do: the file is written again with
// the line that says why, and the run after that has nothing to push.
TEST_F(PushDecision, EachReasonRewritesTheFileOnceAndSaysWhy) {
  const auto touch = [this] {
    std::filesystem::last_write_time(
        vcfPath(), std::filesystem::last_write_time(vcfPath()) + std::chrono::seconds(3));
  };
  const struct {
    const char* line;
    std::function<void()> arrange;
    std::string_view defaults = "";
    PlayerPhotos photos = PlayerPhotos::Refused;
  } reasons[] = {
      {"List of contacts to push has changed",
       [this] {
         put(R"({"id": "ann-phone", "record": {"tessel.record.entity": "tessel.contacts.PhoneNumber", "value": "555-0199", "type": "work"}})");
       }},
      {"Last mod date of VCF on Zeto is not the one we saved, force pushing VCF", touch},
      {"Can't get VCF attributes on Zeto, force pushing VCF",
       [this] { std::filesystem::remove(vcfPath()); }},
      {"Force pushing per AlwaysPushVCard defaults", [] {}, "AlwaysPushVCard = yes\n"},
      {"Force pushing VCF file as we never noted last modification date",
       [this] { client()->unsetSetting("LastModDateForVCF"); }},
      {"Force pushing VCF to be sure we are to date with current sync tool version",
       [this] { client()->unsetSetting("DidSyncContactImages"); }},
      {"Force pushing VCF to be sure we are up to date with current sync tool version",
       [this] { client()->setSetting("LastSyncToolVersion", platform::Value::integer(39)); }},
      {"Force pushing VCF because previous sync did not sync contact images and we have to sync "
       "contact images now",
       [] {}, "", PlayerPhotos::Accepted},
      {"Force pushing VCF because previous sync did sync contact images and we don't have to "
       "sync contact images now",
       [] {}},
  };
  settle();
  for (const auto& reason : reasons) {
    SCOPED_TRACE(reason.line);
    written_ = inode(vcfPath());
    reason.arrange();
    const bool removed = !std::filesystem::exists(vcfPath());
    const SyncOutcome outcome = sync(reason.photos, reason.defaults);
    EXPECT_TRUE(outcome.logged(reason.line));
    EXPECT_FALSE(outcome.logged("Nothing to push for contacts..."));
    EXPECT_TRUE(removed ? std::filesystem::exists(vcfPath()) : rewritten());
    EXPECT_TRUE(sync(reason.photos).logged("Nothing to push for contacts..."));
  }
  EXPECT_NE(fileText().find("TEL;type=WORK:555-0199\r\n"), std::string::npos);
}

}  // namespace
}  // namespace zt::contacts::testing
