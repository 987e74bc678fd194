#include <gtest/gtest.h>

#include <memory>
#include <set>
#include <string>

#include "filters/zeto_calendar_filter.h"
#include "filters/zeto_contact_filter.h"
#include "support/captured_log.h"
#include "tessel/client.h"
#include "tessel/schema.h"
#include "tessel/store.h"

namespace zt::filters {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;

class RecordingHelper : public ContactFilterHelper, public CalendarFilterHelper {
 public:
  std::set<std::string> accepted;
  std::vector<std::string> asked;
  bool shouldApplyContactGroupWithIdentifier(const std::string& identifier) override {
    asked.push_back(identifier);
    return accepted.count(identifier) > 0;
  }
  bool shouldApplyCalendarWithIdentifier(const std::string& identifier) override {
    asked.push_back(identifier);
    return accepted.count(identifier) > 0;
  }
};

// A store with two groups and two calendars, and a log file that captures what is written.
class FiltersTest : public ::testing::Test {
 protected:
  void SetUp() override {
    store_ = tessel::Store::open(dir_ / "truth.db");
    std::string entity(tessel::TesselRecordEntityNameKey);
    store_->putRecords({
        {"g1", Dictionary{{entity, Value(tessel::TesselEntity_Contacts_Group)}, {"name", "A"}}},
        {"g2", Dictionary{{entity, Value(tessel::TesselEntity_Contacts_Group)}, {"name", "B"}}},
        {"c1", Dictionary{{entity, Value(tessel::TesselEntity_Calendars_Calendar)}}},
        {"c2", Dictionary{{entity, Value(tessel::TesselEntity_Calendars_Calendar)}}},
    });
    client_ = store_->registerClient("client", "Player", {});
    snapshot_ = store_->snapshotOfRecordsInTruth({}, *client_);
  }

  void TearDown() override {
    ZetoContactFilter::setContactFilterHelper(nullptr);
    ZetoCalendarFilter::setCalendarFilterHelper(nullptr);
  }

  tessel::RecordReference ref(const std::string& id) const {
    return *snapshot_->recordReferenceForRecordIdentifier(id);
  }

  zt::test_support::TemporaryFolder dir_;
  zt::test_support::CapturedLog log_{false};
  std::unique_ptr<tessel::Store> store_;
  std::unique_ptr<tessel::Client> client_;
  std::shared_ptr<tessel::Snapshot> snapshot_;
};

TEST_F(FiltersTest, ContactsAskTheHelperGroupByGroupAndCalendarsAboutThemselves) {
  ZetoContactFilter contacts;
  const Dictionary member{
      {std::string(tessel::TesselRelationship_Contacts_Contact_ParentGroups), Array{"g1", "g2"}}};
  const Dictionary orphan{{"first name", "Ann"}};
  RecordingHelper helper;
  helper.accepted = {"g2", "c2"};
  // Without a helper every record passes; with one, all pass while everything is selected.
  contacts.setUseAllContacts(false);
  EXPECT_TRUE(contacts.shouldApplyRecord(orphan, "p1"));
  ZetoContactFilter::setContactFilterHelper(&helper);
  EXPECT_TRUE(ZetoContactFilter().shouldApplyRecord(orphan, "x"));
  EXPECT_TRUE(helper.asked.empty());

  EXPECT_TRUE(contacts.shouldApplyRecord(member, "p1"));
  EXPECT_EQ(helper.asked, (std::vector<std::string>{"g1", "g2"}));
  EXPECT_FALSE(contacts.shouldApplyRecord(orphan, "p2"));

  ZetoCalendarFilter calendars;
  calendars.setUseAllCalendars(false);
  ZetoCalendarFilter::setCalendarFilterHelper(&helper);
  helper.asked.clear();
  EXPECT_FALSE(calendars.shouldApplyRecord(Dictionary{}, "c1"));
  EXPECT_TRUE(calendars.shouldApplyRecord(Dictionary{}, "c2"));
  EXPECT_EQ(helper.asked, (std::vector<std::string>{"c1", "c2"}));
}

TEST_F(FiltersTest, NeedsUpdateFollowsRealChangesOfTheSelection) {
  ZetoContactFilter filter;
  // While everything is selected, groups are stored silently.
  filter.setUsedContactGroups({ref("g1")});
  EXPECT_FALSE(filter.needsUpdate());
  filter.setUseAllContacts(false);
  EXPECT_TRUE(filter.needsUpdate());

  filter.setNeedsUpdate(false);
  filter.setUsedContactGroups({ref("g1"), ref("g2")});
  EXPECT_TRUE(filter.needsUpdate());

  // The same groups in another order change nothing, not even the order.
  filter.setNeedsUpdate(false);
  filter.setUsedContactGroups({ref("g2"), ref("g1")});
  EXPECT_FALSE(filter.needsUpdate());
  EXPECT_EQ(filter.usedContactGroups(), (tessel::CodedElements{ref("g1"), ref("g2")}));

  // Replacing one group does.
  filter.setUsedContactGroups({ref("g2"), std::string("g3")});
  EXPECT_TRUE(filter.needsUpdate());
  EXPECT_EQ(filter.usedContactGroups(), (tessel::CodedElements{ref("g2"), std::string("g3")}));
}

TEST_F(FiltersTest, IdentifiersGoThroughTheSnapshotAndUnknownOnesSelectAll) {
  ZetoCalendarFilter filter;
  filter.setUseAllCalendars(false);
  filter.setUsedCalendarGroupIDs({"c2", "unknown", "c1"}, *snapshot_);
  EXPECT_EQ(filter.usedCalendarGroups(), (tessel::CodedElements{ref("c2"), ref("c1")}));
  EXPECT_EQ(filter.usedCalendarGroupIDsForSnapshot(*snapshot_),
            (std::vector<std::string>{"c2", "c1"}));

  // Identifier strings are answered as they are; references the snapshot no longer knows
  // are dropped.
  ZetoContactFilter contacts;
  contacts.setUseAllContacts(false);
  contacts.setUsedContactGroups(
      {std::string("old-id"), ref("g1"), tessel::RecordReference::fromText("gone")});
  EXPECT_EQ(contacts.usedContactGroupIDsForSnapshot(*snapshot_),
            (std::vector<std::string>{"old-id", "g1"}));

  // Only unknown identifiers turn the filter to all, with a warning written always.
  contacts.setUsedContactGroupIDs({"nope"}, *snapshot_);
  EXPECT_TRUE(contacts.useAllContacts());
  filter.setUsedCalendarGroupIDs({}, *snapshot_);
  EXPECT_TRUE(filter.useAllCalendars());
  EXPECT_EQ(log_.text(),
            "*** WARNING: can't set list of selected contact groups. Will sync all contacts\n"
            "*** WARNING: can't set list of selected calendars. Will sync all calendars\n");
}

TEST_F(FiltersTest, EqualityDiffersBetweenTheTwins) {
  ZetoContactFilter a, b;
  a.setUseAllContacts(false);
  b.setUseAllContacts(false);
  a.setUsedContactGroups({ref("g1"), ref("g2")});
  b.setUsedContactGroups({ref("g2"), ref("g1")});
  EXPECT_FALSE(a.isEqual(b));

  ZetoCalendarFilter c, d;
  c.setUseAllCalendars(false);
  d.setUseAllCalendars(false);
  c.setUsedCalendarGroups({ref("c1"), ref("c2")});
  d.setUsedCalendarGroups({ref("c2"), ref("c1")});
  EXPECT_TRUE(c.isEqual(d));

  // Another class, or another "use all" flag, is never equal.
  EXPECT_FALSE(ZetoContactFilter().isEqual(ZetoCalendarFilter()));
  EXPECT_FALSE(a.isEqual(ZetoContactFilter()));
}

}  // namespace
}  // namespace zt::filters
