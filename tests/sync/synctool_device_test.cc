// Finding the player, its lock, waiting for its volume and the folders on it, through the real
// zetosynctool on virtual players.
#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <string>
#include <vector>

#include "platform/device_library.h"
#include "support/files.h"
#include "sync/synctool_fixture.h"

namespace zt::sync::test_support {
namespace {

constexpr std::uint64_t kPlayerNumber = 0xA27001A2B3C4DULL;

using zt::test_support::readFile;

using PlayerVolume = SynctoolTest;

TEST_F(PlayerVolume, AVolumeMountingLateIsAwaitedAndEventsOfAnotherPlayerDoNotEndTheWait) {
  registerClient(kClientID, false, false);
  const fs::path other = folder() / "other";
  fs::create_directories(other);
  Player early = Player::mountingAfter("BEEF", 0.2);
  early.volume = other;
  setPlayers({early, Player::mountingAfter(std::string(kPlayerID), 1.5)});
  const SynctoolRun run = syncClient(kClientID);
  EXPECT_EQ(run.finalStatus(), 0) << run.log;
  // Only this player's own arrival and mount are noted, in that order, while the tool waits.
  const auto needing = run.lineIndex("Needing to mount Zeto");
  const auto attached = run.lineIndex("Zeto attached");
  const auto mounted = run.lineIndex("Zeto mounted");
  ASSERT_TRUE(needing && attached && mounted) << run.log;
  EXPECT_LT(*needing, *attached);
  EXPECT_LT(*attached, *mounted);
  EXPECT_EQ(std::count(run.logLines.begin(), run.logLines.end(), "Zeto attached"), 1);
  EXPECT_EQ(std::count(run.logLines.begin(), run.logLines.end(), "Zeto mounted"), 1);
  EXPECT_GE(run.seconds, 1.5);
  EXPECT_TRUE(fs::is_directory(volume() / "Contacts"));
  EXPECT_FALSE(fs::exists(other / "Contacts"));
}

// Giving up on a volume that never mounts: sync_manager_test, in process.

using zt::test_support::namesIn;

// A regular file, or a link to a folder of the user's as a player formatted on another system
// may hold: its data class is off, what it leads to untouched, and the other one syncs.
TEST_F(PlayerVolume, AFileOrLinkInPlaceOfAFolderTurnsItsDataClassOffAndLeadsNowhere) {
  registerClient(kClientID, true, true);
  putRecords({Json::parse(
      R"({"id": "cal-home", "record": {"tessel.record.entity": "tessel.calendars.Calendar", "title": "Home"}})")});
  const fs::path outside = folder() / "outside";
  for (const auto& [name, link] :
       {std::pair{"Contacts", false}, std::pair{"Contacts", true}, std::pair{"Calendars", true}}) {
    const std::string linked = name;
    SCOPED_TRACE(linked + (link ? " link" : " file"));
    fs::remove_all(volume());
    fs::create_directories(volume());
    fs::remove_all(outside);
    fs::create_directories(outside);
    std::ofstream(outside / "mine.txt") << "the user's";
    if (link)
      fs::create_directory_symlink(outside, volume() / linked);
    else
      std::ofstream(volume() / linked) << "not a folder";

    const SynctoolRun run = syncClient(kClientID);

    EXPECT_EQ(run.exitStatus, 0);
    EXPECT_EQ(run.finalStatus(), 0) << run.log;
    EXPECT_TRUE(
        run.logged("Folder " + linked + " on Zeto is a regular file, we can't use it to sync"))
        << run.log;
    EXPECT_EQ(namesIn(outside), std::vector<std::string>{"mine.txt"});
    EXPECT_EQ(readFile(outside / "mine.txt"), "the user's");
    EXPECT_TRUE(link ? fs::is_symlink(volume() / linked)
                     : readFile(volume() / linked) == "not a folder");
    const bool contacts = linked == "Contacts";
    EXPECT_EQ(run.dataClassesSyncing(),
              std::vector<std::string>{contacts ? "tessel.calendars" : "tessel.contacts"});
    EXPECT_TRUE(fs::is_regular_file(contacts ? volume() / "Calendars" / "Tessel-Home.ics"
                                             : volume() / "Contacts" / "Tessel.vcf"))
        << run.log;
    EXPECT_EQ(client(kClientID)->lastSession()->outcome, tessel::SessionOutcome::Finished);
  }
  // Existing folders are used as they are.
  fs::remove(volume() / "Calendars");
  fs::create_directory(volume() / "Calendars");
  const SynctoolRun again = syncClient(kClientID);
  EXPECT_EQ(again.finalStatus(), 0);
  EXPECT_FALSE(again.logContains("Need to create")) << again.log;
}

TEST_F(PlayerVolume, TemporariesLeftByAnInterruptedWriteAreRemovedByTheNextPush) {
  registerClient(kClientID, true, true);
  fs::create_directories(volume() / "Contacts");
  fs::create_directories(volume() / "Calendars");
  // What a run killed between the write and the rename leaves, and names that only look alike.
  for (const char* name :
       {".Tessel.vcf.tmpAbc123", ".Tessel.vcf.tmp", ".Tessel.vcf.tmpAbc1234", "notes.txt"})
    std::ofstream(volume() / "Contacts" / name) << "BEGIN:VCARD";
  std::ofstream(volume() / "Calendars" / ".Tessel-Home.ics.tmpXyz789") << "BEGIN:VCALENDAR";

  const SynctoolRun run = syncClient(kClientID);

  EXPECT_EQ(run.finalStatus(), 0) << run.log;
  EXPECT_EQ(namesIn(volume() / "Contacts"),
            (std::vector<std::string>{".Tessel.vcf.tmp", ".Tessel.vcf.tmpAbc1234", "Tessel.vcf",
                                      "notes.txt"}));
  EXPECT_TRUE(namesIn(volume() / "Calendars").empty());
}

using PlayerLock = SynctoolTest;

// A sync started by cron, a systemd unit or another login has a runtime folder and home of its
// own, and still must not write to the player at the same time as this one.
TEST_F(PlayerLock, APlayerLockedByAnotherProcessOfAnyEnvironmentIsNotSynced) {
  registerClient(kClientID, false, false);
  fs::create_directories(folder() / "other/run");
  auto otherSession = environment();
  otherSession["HOME"] = (folder() / "other").string();
  otherSession["XDG_RUNTIME_DIR"] = (folder() / "other/run").string();
  for (const auto& holderEnvironment : {environment(), otherSession}) {
    LockHolder holder(holderEnvironment, kPlayerNumber);
    ASSERT_EQ(holder.result(), platform::kZetoSuccess);
    const SynctoolRun run = syncClient(kClientID);
    EXPECT_TRUE(run.logged("Can't get a lock on Zeto")) << run.log;
    EXPECT_EQ(run.finalStatus(), 3);
    EXPECT_FALSE(client(kClientID)->lastSession().has_value());
    EXPECT_FALSE(fs::exists(volume() / "Contacts"));
    // A lock it never took is not given back.
    EXPECT_FALSE(run.logged("Unlocking Zeto"));
  }
  // Once the other process lets go, the player syncs, and the sync leaves the lock free.
  EXPECT_EQ(syncClient(kClientID).finalStatus(), 0);
  LockHolder next(environment(), kPlayerNumber);
  EXPECT_EQ(next.result(), platform::kZetoSuccess);
}

using PlayerMatching = SynctoolTest;

TEST_F(PlayerMatching, TheClientIdentifierMustEndWithTheUpperCaseHexIdentifierOfTheFirstMatch) {
  // The file's identifiers are read as numbers: leading zeros and lower case do not matter, the
  // tool compares the "%llX" text. "2B" and "1A2B" both end "XYZ01A2B"; the first listed wins.
  const fs::path other = folder() / "other";
  fs::create_directories(other);
  setPlayers({Player("FF"), Player("0002b", other), Player("00001a2b")});
  for (const char* clientID : {"XYZ01A2B", "XYZ01a2b", "1A2BXYZ"})
    registerClient(clientID, false, false);

  const SynctoolRun match = syncClient("XYZ01A2B");
  EXPECT_EQ(match.finalStatus(), 0) << match.log;
  EXPECT_TRUE(fs::is_directory(other / "Contacts"));
  EXPECT_FALSE(fs::exists(volume() / "Contacts"));
  for (const char* clientID : {"XYZ01a2b", "1A2BXYZ"}) {
    SCOPED_TRACE(clientID);
    const SynctoolRun miss = syncClient(clientID);
    EXPECT_EQ(miss.finalStatus(), 3);
    EXPECT_TRUE(miss.logged("Can't find Zeto")) << miss.log;
  }
}

}  // namespace
}  // namespace zt::sync::test_support
