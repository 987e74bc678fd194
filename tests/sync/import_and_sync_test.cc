// The whole product as a person uses it: address books and calendars exported by desktop and
// web programs (the repository's samples) are imported with `tessel import`, synced onto a
// virtual player that takes photos, and land intact; importing them again changes nothing,
// so the next sync leaves the contacts file alone. The files on the player are compared line by
// line with golden/ (made again with ZT_UPDATE_GOLDEN=1, then checked by eye).

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <set>
#include <sstream>
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

#define EXPECT_HAS(text, part) \
  EXPECT_NE((text).find(part), std::string::npos) << "missing: " << (part)

class ImportAndSync : public SynctoolTest {
 protected:
  // Floating times are read and written in the zone of the session, the same for both tools.
  void SetUp() override {
    SynctoolTest::SetUp();
    setEnvironment("TZ", "Europe/Paris");
  }
  void importSamples() {
    TesselRun run = runTessel({"import", "vcard",
                               (kSamples / "contacts" / "friends-and-colleagues.vcf").string(),
                               (kSamples / "contacts" / "old-phone.vcf").string(),
                               (kSamples / "contacts" / "family-vdir").string()});
    ASSERT_EQ(run.exitStatus, 0) << run.output;
    run = runTessel({"import", "ical", (kSamples / "calendars" / "work.ics").string(),
                     (kSamples / "calendars" / "home.ics").string(),
                     (kSamples / "calendars" / "holidays.ics").string()});
    ASSERT_EQ(run.exitStatus, 0) << run.output;
  }
};

TEST_F(ImportAndSync, ExportedAddressBooksAndCalendarsLandIntactAndSyncOnceOnly) {
  importSamples();
  ASSERT_EQ(runTessel({"client", "register", std::string(kClientID), "--contacts", "--calendars"})
                .exitStatus,
            0);
  Player player{std::string(kPlayerID)};
  player.checkpoint = kSamples / "zeto" / "self-description.plist";
  setPlayers({player});

  SynctoolRun first = syncClient(kClientID);
  ASSERT_EQ(first.finalStatus(), 0) << first.log;

  const std::string cards = readUtf16BigEndian(volume() / "Contacts" / "Tessel.vcf");
  // 2.1 quoted-printable in Latin-1, 3.0 with escapes and folding, 4.0 from a vdir folder.
  EXPECT_HAS(cards, "N:González;José;;;\r\n");
  EXPECT_HAS(cards, "NOTE:Vecino del tercero. Tiene las llaves\\ndel trastero.\r\n");
  EXPECT_HAS(cards, "N:Lovelace;Ada;;;\r\n");
  EXPECT_HAS(cards, "ORG:Müller & Söhne GmbH\r\n");
  EXPECT_HAS(cards, "ORG:山本商事\r\n");
  EXPECT_HAS(cards, "N:Tesla;Nikola;;;\r\n");
  EXPECT_HAS(cards, "CATEGORIES:");
  // The player says it takes photos, so the JPEGs (and the PNG, converted) are embedded.
  EXPECT_HAS(cards, "PHOTO;BASE64:\r\n");
  EXPECT_TRUE(first.logged("Sync Contact Images supported: YES"));

  const std::string work = readFile(volume() / "Calendars" / "Tessel-Work.ics");
  EXPECT_HAS(work, "X-WR-CALNAME:Work\r\n");
  EXPECT_HAS(work, "BEGIN:VTIMEZONE\r\nTZID:Europe/Paris\r\n");
  // An Outlook time-zone name becomes the zone of the database.
  EXPECT_HAS(work, "DTSTART;TZID=Asia/Tokyo:20261209T090000\r\n");
  EXPECT_HAS(work, "RRULE:FREQ=WEEKLY;UNTIL=20270630T073000Z;BYDAY=MO,WE,FR\r\n");
  // The moved occurrence is excluded from the series and written as an event of its own.
  EXPECT_HAS(work, "EXDATE;TZID=Europe/Paris:20261120T093000\r\n");
  EXPECT_HAS(work, "DTSTART;TZID=Europe/Paris:20261120T110000\r\n");
  EXPECT_HAS(work, "ORGANIZER;CN=\"Marie Curie\":mailto:marie.curie@work.example.com\r\n");
  EXPECT_HAS(work, "TRIGGER:-P1D\r\n");
  const std::string home = readFile(volume() / "Calendars" / "Tessel-Home.ics");
  EXPECT_HAS(home, "DTSTART:20270314\r\n");
  EXPECT_HAS(home, "RRULE:FREQ=MONTHLY;BYDAY=2TH\r\n");
  // A floating time stays floating.
  EXPECT_HAS(home, "DTSTART:20261107T080000\r\n");
  EXPECT_HAS(readFile(volume() / "Calendars" / "Tessel-Holidays.ics"),
             "SUMMARY:Summer trip to Lisbon / Porto\r\n");

  // The whole files, line by line, against the reference files of golden/.
  const fs::path golden = fs::path(ZT_TEST_DATA_DIR) / "golden";
  EXPECT_TRUE(zt::test_support::matchesGoldenFile(golden / "Tessel.vcf", cards));
  std::set<std::string> calendars, references;
  for (const auto& entry : fs::directory_iterator(volume() / "Calendars"))
    calendars.insert(entry.path().filename().string());
  for (const std::string& name : calendars) {
    SCOPED_TRACE(name);
    EXPECT_TRUE(zt::test_support::matchesGoldenFile(
        golden / name, withoutTimesOfTheRun(readFile(volume() / "Calendars" / name))));
  }
  for (const auto& entry : fs::directory_iterator(golden))
    if (entry.path().extension() == ".ics") references.insert(entry.path().filename().string());
  EXPECT_EQ(calendars, references);

  // The same exports again: nothing is rewritten in the store, so nothing is pushed.
  importSamples();
  SynctoolRun second = syncClient(kClientID);
  ASSERT_EQ(second.finalStatus(), 0) << second.log;
  EXPECT_TRUE(second.logContains("Nothing to push for contacts"));
}

TEST_F(ImportAndSync, DeletingAnOrganizerLeavesItsCalendarWhole) {
  ASSERT_EQ(
      runTessel({"import", "ical", (kSamples / "calendars" / "work.ics").string()}).exitStatus, 0);
  ASSERT_EQ(runTessel({"client", "register", std::string(kClientID), "--calendars"}).exitStatus, 0);
  ASSERT_EQ(syncClient(kClientID).finalStatus(), 0);

  std::vector<std::string> deleteCommand{"records", "delete"};
  store().forEachRecord([&](const tessel::Record& r) { deleteCommand.push_back(r.id); },
                        tessel::TesselEntity_Calendars_Organizer);
  ASSERT_EQ(deleteCommand.size(), 4u);  // both organizers
  ASSERT_EQ(runTessel(deleteCommand).exitStatus, 0);

  SynctoolRun run = syncClient(kClientID);
  ASSERT_EQ(run.finalStatus(), 0) << run.log;
  const std::string work = readFile(volume() / "Calendars" / "Tessel-Work.ics");
  EXPECT_HAS(work, "SUMMARY:Team stand-up\r\n");
  EXPECT_HAS(work, "SUMMARY:Quarterly review with the board");
  EXPECT_EQ(work.find("ORGANIZER"), std::string::npos);
}

}  // namespace
}  // namespace zt::sync::test_support
