// The whole product as a person uses it: address books and calendars exported by desktop and
// web programs (the repository's samples) are imported with `tessel import`, synced onto a
// virtual player that takes photos, and land intact; importing them again changes nothing,
// so the next sync leaves the contacts file alone. The files on the player are compared line by
// line with golden/ (made again with ZT_UPDATE_GOLDEN=1, then checked by eye).

#include <gtest/gtest.h>

#include <filesystem>
#include <set>
#include <string>

#include "platform/utf16.h"
#include "support/files.h"
#include "sync/synctool_fixture.h"
#include "tessel/schema.h"

namespace zt::sync::test_support {
namespace {

const fs::path kSamples = fs::path(ZT_TEST_DATA_DIR) / ".." / ".." / "samples";

using zt::test_support::readFile;

std::string readUtf16BigEndian(const fs::path& path) {
  return zt::test_support::utf8OfUtf16BigEndian(readFile(path));
}

// Lines stamped with the time of the run are masked.
std::string withoutTimesOfTheRun(const std::string& text) {
  std::string out;
  for (const std::string& line : zt::test_support::splitLines(text))
    out += line.starts_with("DTSTAMP:") ? "DTSTAMP:(time of the run)\r\n" : line + "\n";
  return out;
}

class ImportAndSync : public SynctoolTest {
 protected:
  // Floating times are read and written in the zone of the session, the same for both tools.
  void SetUp() override {
    SynctoolTest::SetUp();
    setEnvironment("TZ", "Europe/Paris");
  }
  void importSamples() {
    tessel({"import", "vcard", (kSamples / "contacts" / "friends-and-colleagues.vcf").string(),
            (kSamples / "contacts" / "old-phone.vcf").string(),
            (kSamples / "contacts" / "family-vdir").string()});
    tessel({"import", "ical", (kSamples / "calendars" / "work.ics").string(),
            (kSamples / "calendars" / "home.ics").string(),
            (kSamples / "calendars" / "holidays.ics").string()});
  }
};

TEST_F(ImportAndSync, ExportedAddressBooksAndCalendarsLandIntactAndSyncOnceOnly) {
  importSamples();
  tessel({"client", "register", std::string(kClientID), "--contacts", "--calendars"});
  Player player{std::string(kPlayerID)};
  player.checkpoint = kSamples / "zeto" / "self-description.plist";
  setPlayers({player});

  SynctoolRun first = syncClient(kClientID);
  ASSERT_EQ(first.finalStatus(), 0) << first.log;

  // The reference files pin, among the rest: 2.1 quoted-printable in Latin-1, 3.0 escapes
  // and folding, 4.0 from a vdir folder, categories, photos embedded since the player takes
  // them (JPEGs, and the PNG converted); Outlook zone names as database zones, weekly rules
  // with UNTIL, a moved occurrence excluded from its series and written as an event of its
  // own, organizers, alarms, all-day and floating times.
  const std::string cards = readUtf16BigEndian(volume() / "Contacts" / "Tessel.vcf");
  EXPECT_TRUE(first.logged("Sync Contact Images supported: YES"));
  // Contacts go first; calendars follow in the same session.
  EXPECT_EQ(first.dataClassesSyncing(),
            (std::vector<std::string>{"tessel.contacts", "tessel.calendars"}));
  const auto contacts = first.lineIndex("Sync'ing Contacts");
  const auto calendars = first.lineIndex("Sync'ing Calendars");
  ASSERT_TRUE(contacts && calendars) << first.log;
  EXPECT_LT(*contacts, *calendars);

  // The whole files, line by line, against the reference files of golden/.
  const fs::path golden = fs::path(ZT_TEST_DATA_DIR) / "golden";
  EXPECT_TRUE(zt::test_support::matchesGoldenFile(golden / "Tessel.vcf", cards));
  std::set<std::string> files, references;
  for (const auto& entry : fs::directory_iterator(volume() / "Calendars"))
    files.insert(entry.path().filename().string());
  for (const std::string& name : files) {
    SCOPED_TRACE(name);
    EXPECT_TRUE(zt::test_support::matchesGoldenFile(
        golden / name, withoutTimesOfTheRun(readFile(volume() / "Calendars" / name))));
  }
  for (const auto& entry : fs::directory_iterator(golden))
    if (entry.path().extension() == ".ics") references.insert(entry.path().filename().string());
  EXPECT_EQ(files, references);

  // The same exports again: nothing is rewritten in the store, so nothing is pushed.
  importSamples();
  SynctoolRun second = syncClient(kClientID);
  ASSERT_EQ(second.finalStatus(), 0) << second.log;
  EXPECT_TRUE(second.logContains("Nothing to push for contacts"));
}

TEST_F(ImportAndSync, DeletingAnOrganizerLeavesItsCalendarWhole) {
  tessel({"import", "ical", (kSamples / "calendars" / "work.ics").string()});
  tessel({"client", "register", std::string(kClientID), "--calendars"});
  ASSERT_EQ(syncClient(kClientID).finalStatus(), 0);

  std::vector<std::string> deleteCommand{"records", "delete"};
  store().forEachRecord([&](const tessel::Record& r) { deleteCommand.push_back(r.id); },
                        tessel::TesselEntity_Calendars_Organizer);
  ASSERT_EQ(deleteCommand.size(), 4u);  // both organizers
  tessel(deleteCommand);

  SynctoolRun run = syncClient(kClientID);
  ASSERT_EQ(run.finalStatus(), 0) << run.log;
  const std::string work = readFile(volume() / "Calendars" / "Tessel-Work.ics");
  EXPECT_CONTAINS(work, "SUMMARY:Team stand-up\r\n");
  EXPECT_CONTAINS(work, "SUMMARY:Quarterly review with the board");
  EXPECT_EQ(work.find("ORGANIZER"), std::string::npos);
}

}  // namespace
}  // namespace zt::sync::test_support
