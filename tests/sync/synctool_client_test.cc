// The sync client's "LastSyncToolVersion" and the upgrade of filters left by the previous
// generation of the tool, through the real zetosynctool on a real store.
#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <utility>

#include "filters/zeto_calendar_filter.h"
#include "filters/zeto_contact_filter.h"
#include "platform/value.h"
#include "sync/synctool_fixture.h"
#include "tessel/opaque_filter.h"
#include "tessel/schema.h"
#include "tessel/session.h"

namespace zt::sync::test_support {
namespace {

using platform::Dictionary;
using platform::Value;

constexpr std::string_view kVersion = "LastSyncToolVersion";
const std::string kUpgradeLine = "Upgrading Brask client with filters: ";

// A store with two groups and two calendars, and a client whose filters select one of each
// by identifier string, as the previous generation of the tool stored them, next to a
// filter of a class this tool does not know.
class ClientUpgrade : public SynctoolTest {
 protected:
  void SetUp() override {
    SynctoolTest::SetUp();
    const std::string entity(tessel::TesselRecordEntityNameKey);
    store().putRecords({
        {"g1", Dictionary{{entity, Value(tessel::TesselEntity_Contacts_Group)}, {"name", "A"}}},
        {"g2", Dictionary{{entity, Value(tessel::TesselEntity_Contacts_Group)}, {"name", "B"}}},
        {"c1", Dictionary{{entity, Value(tessel::TesselEntity_Calendars_Calendar)}}},
        {"c2", Dictionary{{entity, Value(tessel::TesselEntity_Calendars_Calendar)}}},
    });
    auto contacts = std::make_shared<filters::ZetoContactFilter>();
    contacts->setUseAllContacts(false);
    contacts->setUsedContactGroups({std::string("g2")});
    auto calendars = std::make_shared<filters::ZetoCalendarFilter>();
    calendars->setUseAllCalendars(false);
    calendars->setUsedCalendarGroups({std::string("c1"), std::string("c2")});
    auto foreign =
        std::make_shared<tessel::OpaqueFilter>("ForeignFilter", platform::Data{1, 2, 3, 250});
    registerClient(kClientID, false, false)->setFilters({contacts, calendars, foreign});
  }

  void setVersion(std::int64_t version) {
    client(kClientID)->setSetting(kVersion, Value::integer(version));
  }

  std::optional<std::int64_t> version() {
    const auto value = client(kClientID)->setting(kVersion);
    return value && value->asNumber() ? std::optional(value->asNumber()->int64Value())
                                      : std::nullopt;
  }

  tessel::RecordReference ref(const std::string& identifier) {
    auto snapshot = store().snapshotOfRecordsInTruth({}, *client(kClientID));
    return *snapshot->recordReferenceForRecordIdentifier(identifier);
  }

  // The groups the stored contact and calendar filters use ("all" is never on here).
  std::pair<tessel::CodedElements, tessel::CodedElements> usedGroups() {
    const tessel::FilterList filters = client(kClientID)->filters();
    auto* contacts = dynamic_cast<filters::ZetoContactFilter*>(filters.at(0).get());
    auto* calendars = dynamic_cast<filters::ZetoCalendarFilter*>(filters.at(1).get());
    if (!contacts || !calendars || contacts->useAllContacts() || calendars->useAllCalendars())
      return {};
    return {contacts->usedContactGroups(), calendars->usedCalendarGroups()};
  }
  const std::pair<tessel::CodedElements, tessel::CodedElements> asSetUp_{
      {std::string("g2")}, {std::string("c1"), std::string("c2")}};
};

TEST_F(ClientUpgrade, AClientOfThePreviousToolGetsItsFiltersRebuiltAgainstTruth) {
  setVersion(37);
  setDebugLog(false);
  const SynctoolRun run = syncClient(kClientID);
  EXPECT_EQ(run.finalStatus(), 0);
  // The identifier strings became references to the same records, in the same order; the
  // filter of another class is kept byte for byte.
  EXPECT_EQ(usedGroups(), std::pair(tessel::CodedElements{ref("g2")},
                                    tessel::CodedElements{ref("c1"), ref("c2")}));
  const tessel::FilterList filters = client(kClientID)->filters();
  auto* foreign = dynamic_cast<tessel::OpaqueFilter*>(filters.at(2).get());
  ASSERT_TRUE(foreign);
  EXPECT_EQ(foreign->className(), "ForeignFilter");
  EXPECT_EQ(foreign->payload(), (platform::Data{1, 2, 3, 250}));
  // The upgrade line is written with debug logging off, and it is the only line.
  ASSERT_EQ(run.logLines.size(), 1u) << run.log;
  EXPECT_TRUE(run.logLines[0].starts_with(kUpgradeLine + "(Contact Filter 0x")) << run.log;
  EXPECT_TRUE(run.logContains("with options (" + ref("c1").text() + ", " + ref("c2").text() + ")"));
  EXPECT_EQ(version(), 38);
}

// No version, this tool's and a newer one: nothing is upgraded, each says why, and the
// finished sync writes this tool's version.
TEST_F(ClientUpgrade, OtherVersionsAreNotUpgradedAndTheFinishedSyncWritesThisOne) {
  const std::pair<std::optional<std::int64_t>, const char*> cases[] = {
      {std::nullopt, "Last tool used to sync this zeto was a old one. No need to upgrade"},
      {38, "Last tool used to sync this zeto was already this one"},
      {39, "Last tool used to sync this zeto was different"},
  };
  for (const auto& [before, line] : cases) {
    SCOPED_TRACE(line);
    if (before)
      setVersion(*before);
    else
      client(kClientID)->unsetSetting(kVersion);
    const SynctoolRun run = syncClient(kClientID);
    EXPECT_EQ(run.finalStatus(), 0);
    EXPECT_TRUE(run.logged(line)) << run.log;
    EXPECT_FALSE(run.logContains("Brask"));
    EXPECT_EQ(usedGroups(), asSetUp_);
    EXPECT_EQ(version(), 38);
  }
}

TEST_F(ClientUpgrade, ARunThatDoesNotFinishItsSessionNeverWritesTheVersion) {
  // No player: the run stops before any session; the upgrade itself happens before the player
  // is looked for, the version still waits for a finished session.
  setPlayers({});
  setVersion(37);
  const SynctoolRun upgraded = syncClient(kClientID);
  EXPECT_EQ(upgraded.finalStatus(), 3);
  EXPECT_TRUE(upgraded.logContains(kUpgradeLine));
  EXPECT_EQ(version(), 37);
  // A session that cannot begin (this process runs one for the client) fails the run.
  setPlayers({Player(std::string(kPlayerID))});
  setVersion(39);
  auto running = tessel::Session::begin(*client(kClientID), {});
  EXPECT_EQ(syncClient(kClientID).finalStatus(), 2);
  EXPECT_EQ(version(), 39);
  running->cancelSyncing();
}

}  // namespace
}  // namespace zt::sync::test_support
