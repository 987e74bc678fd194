#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <set>
#include <string>

#include "filters/filter_classes.h"
#include "filters/zeto_calendar_filter.h"
#include "filters/zeto_contact_filter.h"
#include "platform/log.h"
#include "support/captured_log.h"
#include "tessel/client.h"
#include "tessel/exception.h"
#include "tessel/filter_registry.h"
#include "tessel/schema.h"
#include "tessel/store.h"

namespace zt::filters {
namespace {

namespace fs = std::filesystem;
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
    snapshot_.reset();
    client_.reset();
    store_.reset();
  }

  std::string logText() const { return log_.text(); }

  tessel::RecordReference ref(const std::string& id) const {
    return *snapshot_->recordReferenceForRecordIdentifier(id);
  }

  zt::test_support::TemporaryFolder dir_;
  zt::test_support::CapturedLog log_{false};
  std::unique_ptr<tessel::Store> store_;
  std::unique_ptr<tessel::Client> client_;
  std::shared_ptr<tessel::Snapshot> snapshot_;
};

TEST_F(FiltersTest, FreshFiltersSelectEverythingAndDescribeThemselves) {
  ZetoContactFilter contacts;
  ZetoCalendarFilter calendars;
  EXPECT_TRUE(contacts.useAllContacts());
  EXPECT_FALSE(contacts.needsUpdate());
  EXPECT_TRUE(calendars.useAllCalendars());

  char expected[64];
  std::snprintf(expected, sizeof expected, "Contact Filter %p: enableAll YES",
                static_cast<const void*>(&contacts));
  EXPECT_EQ(contacts.description(), expected);

  contacts.setUseAllContacts(false);
  contacts.setUsedContactGroups({ref("g1"), std::string("legacy-id")});
  std::string text = contacts.description();
  EXPECT_NE(text.find("Contact Filter 0x"), std::string::npos);
  EXPECT_NE(text.find(": enableALL NO, with options (" + ref("g1").text() + ", legacy-id)"),
            std::string::npos)
      << text;

  // A helper is registered, but all records pass while everything is selected.
  RecordingHelper helper;
  ZetoContactFilter::setContactFilterHelper(&helper);
  EXPECT_TRUE(ZetoContactFilter().shouldApplyRecord(Dictionary{}, "x"));
  EXPECT_TRUE(helper.asked.empty());
}

TEST_F(FiltersTest, ContactFilterAsksItsHelperGroupByGroup) {
  ZetoContactFilter filter;
  filter.setUseAllContacts(false);
  std::string parents(tessel::TesselRelationship_Contacts_Contact_ParentGroups);
  Dictionary member{{parents, Array{"g1", "g2"}}};
  Dictionary orphan{{"first name", "Ann"}};

  // Without a helper every record passes.
  EXPECT_TRUE(filter.shouldApplyRecord(orphan, "p1"));

  RecordingHelper helper;
  helper.accepted = {"g2"};
  ZetoContactFilter::setContactFilterHelper(&helper);
  EXPECT_TRUE(filter.shouldApplyRecord(member, "p1"));
  EXPECT_EQ(helper.asked, (std::vector<std::string>{"g1", "g2"}));
  EXPECT_FALSE(filter.shouldApplyRecord(orphan, "p2"));
  helper.accepted.clear();
  EXPECT_FALSE(filter.shouldApplyRecord(member, "p1"));
}

TEST_F(FiltersTest, CalendarFilterAsksAboutTheRecordItself) {
  ZetoCalendarFilter filter;
  filter.setUseAllCalendars(false);
  RecordingHelper helper;
  helper.accepted = {"c2"};
  ZetoCalendarFilter::setCalendarFilterHelper(&helper);
  EXPECT_FALSE(filter.shouldApplyRecord(Dictionary{}, "c1"));
  EXPECT_TRUE(filter.shouldApplyRecord(Dictionary{}, "c2"));
  EXPECT_EQ(helper.asked, (std::vector<std::string>{"c1", "c2"}));
}

TEST_F(FiltersTest, NeedsUpdateFollowsRealChangesOfTheSelection) {
  ZetoContactFilter filter;
  // While everything is selected, groups are stored silently.
  filter.setUsedContactGroups({ref("g1")});
  EXPECT_FALSE(filter.needsUpdate());
  filter.setUseAllContacts(true);
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

TEST_F(FiltersTest, IdentifiersGoThroughTheSnapshot) {
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
}

TEST_F(FiltersTest, UnknownIdentifiersTurnTheFilterToAllWithAnAlwaysWrittenWarning) {
  ZetoContactFilter contacts;
  contacts.setUseAllContacts(false);
  contacts.setUsedContactGroups({ref("g1")});
  contacts.setUsedContactGroupIDs({"nope"}, *snapshot_);
  EXPECT_TRUE(contacts.useAllContacts());
  EXPECT_EQ(contacts.usedContactGroups(), tessel::CodedElements{ref("g1")});

  ZetoCalendarFilter calendars;
  calendars.setUseAllCalendars(false);
  calendars.setUsedCalendarGroupIDs({}, *snapshot_);
  EXPECT_TRUE(calendars.useAllCalendars());

  EXPECT_EQ(logText(),
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
  EXPECT_TRUE(a.isEqual(a));

  ZetoCalendarFilter c, d;
  c.setUseAllCalendars(false);
  d.setUseAllCalendars(false);
  c.setUsedCalendarGroups({ref("c1"), ref("c2")});
  d.setUsedCalendarGroups({ref("c2"), ref("c1")});
  EXPECT_TRUE(c.isEqual(d));
  d.setUsedCalendarGroups({ref("c2")});
  EXPECT_FALSE(c.isEqual(d));

  // Another class, or another "use all" flag, is never equal.
  EXPECT_FALSE(ZetoContactFilter().isEqual(ZetoCalendarFilter()));
  EXPECT_FALSE(a.isEqual(ZetoContactFilter()));
}

TEST_F(FiltersTest, StoredFiltersComeBackThroughTheEngine) {
  registerFilterClasses();
  auto contacts = std::make_shared<ZetoContactFilter>();
  contacts->setUseAllContacts(false);
  contacts->setUsedContactGroups({ref("g1"), std::string("legacy")});
  auto calendars = std::make_shared<ZetoCalendarFilter>();
  ASSERT_TRUE(contacts->needsUpdate());
  client_->setFilters({contacts, calendars});

  tessel::FilterList back = store_->clientWithIdentifier("client")->filters();
  ASSERT_EQ(back.size(), 2u);
  auto* decoded = dynamic_cast<ZetoContactFilter*>(back[0].get());
  ASSERT_NE(decoded, nullptr);
  EXPECT_TRUE(decoded->isEqual(*contacts));
  EXPECT_FALSE(decoded->needsUpdate());
  EXPECT_EQ(decoded->usedContactGroups(),
            (tessel::CodedElements{ref("g1"), std::string("legacy")}));
  ASSERT_NE(dynamic_cast<ZetoCalendarFilter*>(back[1].get()), nullptr);
  EXPECT_TRUE(back[1]->isEqual(*calendars));

  // A payload that is not a filter's stored form is refused with the engine's exception.
  EXPECT_THROW(tessel::FilterRegistry::shared().decode("ZetoContactFilter", {0xff}),
               tessel::Exception);
}

}  // namespace
}  // namespace zt::filters
