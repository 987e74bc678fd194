// A sync of a few thousand records killed with SIGKILL at moments spread over the whole run:
// right after chosen log lines, inside the longest stretches that log nothing, and at the steps
// of the file writes seen on the player. Between kills the store switches between two versions,
// so every file has a previous and a new version. A kill may leave either version of each file
// (a calendar file may be gone once the folder is being emptied) but never part of one; the
// store stays sound; the next normal run leaves none of the tool's temporaries and the player as
// a sync from scratch would; and no change is lost.

#include <gtest/gtest.h>
#include <signal.h>
#include <sqlite3.h>
#include <sys/inotify.h>

#include <algorithm>
#include <map>
#include <set>
#include <string>
#include <tuple>
#include <vector>

#include "support/files.h"
#include "sync/synctool_fixture.h"
#include "sync/zt_sync_manager.h"
#include "tessel/change_enumerator.h"
#include "tessel/schema.h"
#include "tessel/session.h"

namespace zt::sync::test_support {
namespace {

constexpr int kContacts = 2000, kEvents = 1000, kCalendars = 4;
const char* const kTitles[kCalendars] = {"Work", "Home", "Sport", "Family"};
// Every this many contacts and events one differs between the two versions of the store.
constexpr int kChangeEvery = 20;
// Scratch players whose clients only ever sync one version each from scratch.
const std::vector<std::string> kReferencePlayers = {"000A27001A2B3C50", "000A27001A2B3C51"};

// A player's Contacts/ and Calendars/ files, by "folder/name".
using Files = std::map<std::string, std::string>;

Files filesOf(const fs::path& volume) {
  Files files;
  for (const char* folder : {"Contacts", "Calendars"}) {
    std::error_code ignored;
    for (const auto& entry : fs::directory_iterator(volume / folder, ignored))
      files[std::string(folder) + "/" + entry.path().filename().string()] =
          zt::test_support::readFile(entry.path());
  }
  return files;
}

// The tool writes each file as ".<name>.tmpXXXXXX" in the same folder, then renames it.
bool isTemporary(const std::string& path) {
  const std::string name = fs::path(path).filename().string();
  return name.starts_with('.') && name.find(".tmp") != std::string::npos;
}

Files withoutTemporaries(Files files) {
  std::erase_if(files, [](const auto& file) { return isTemporary(file.first); });
  return files;
}

Json record(const std::string& id, const char* entity, Json fields) {
  fields["tessel.record.entity"] = entity;
  return Json{{"id", id}, {"record", fields}};
}

// The records at `version` (0 or 1): all of them, or only those that differ between versions.
std::vector<Json> records(int version, bool onlyChanged) {
  std::vector<Json> lines;
  for (int i = 0; i < kContacts; ++i) {
    const bool changed = version == 1 && i % kChangeEvery == 0,
               shown = !onlyChanged || i % kChangeEvery == 0;
    const std::string n = std::to_string(i), id = "contact-" + n;
    if (!shown) continue;
    lines.push_back(record(id + "-phone", "tessel.contacts.PhoneNumber",
                           {{"value", "+33 1 40 " + std::to_string(10000 + i + changed)},
                            {"type", i % 2 ? "work" : "mobile"}}));
    lines.push_back(record(id, "tessel.contacts.Contact",
                           {{"first name", "First" + n},
                            {"last name", (changed ? "Renamed" : "Last") + n},
                            {"notes", changed ? "Moved to the new office." : "Met at the fair."},
                            {"phone numbers", {id + "-phone"}}}));
  }
  for (int i = 0; i < kEvents; ++i) {
    const bool changed = version == 1 && i % kChangeEvery == 0;
    if (onlyChanged && i % kChangeEvery != 0) continue;
    const std::string day =
        "2027-" + std::to_string(10 + i % 3) + "-" + std::to_string(10 + i % 18);
    lines.push_back(
        record("event-" + std::to_string(i), "tessel.calendars.Event",
               {{"summary", (changed ? "Moved: Meeting " : "Meeting ") + std::to_string(i)},
                {"location", changed ? "Room B" : "Room A"},
                {"start date", {{"$date", day + "T09:00:00"}, {"tz", "Europe/Paris"}}},
                {"calendar", {"calendar-" + std::to_string(i % kCalendars)}}}));
  }
  if (onlyChanged) return lines;
  Json order = Json::array();
  for (int c = 0; c < kCalendars; ++c) {
    Json events = Json::array();
    for (int i = c; i < kEvents; i += kCalendars) events.push_back("event-" + std::to_string(i));
    order.push_back("calendar-" + std::to_string(c));
    lines.push_back(record(order.back(), "tessel.calendars.Calendar",
                           {{"title", kTitles[c]}, {"events", events}}));
  }
  lines.push_back(
      record("calendar-order", "tessel.calendars.CalendarOrder", {{"calendars", order}}));
  return lines;
}

class KilledSync : public SynctoolTest {
 protected:
  // `PRAGMA integrity_check` of the store, through SQLite itself; "ok" when sound.
  std::string integrity() {
    sqlite3* db = nullptr;
    sqlite3_stmt* statement = nullptr;
    std::string answer;
    sqlite3_open_v2((folder() / "truth.db").c_str(), &db, SQLITE_OPEN_READONLY, nullptr);
    sqlite3_prepare_v2(db, "PRAGMA integrity_check", -1, &statement, nullptr);
    while (statement && sqlite3_step(statement) == SQLITE_ROW)
      answer += reinterpret_cast<const char*>(sqlite3_column_text(statement, 0));
    sqlite3_finalize(statement);
    sqlite3_close(db);
    return answer;
  }

  // The changes of truth the client's mirror does not hold yet, asked of the engine in a
  // session of its own that takes nothing. Calendars are pushed whole, so of them only the
  // calendar order is kept in the mirror.
  std::size_t uncommittedChanges() {
    std::vector<std::string> entities = ZTSyncManager::entitiesForContacts();
    entities.emplace_back(tessel::TesselEntity_Calendars_CalendarOrder);
    auto session = tessel::Session::begin(*client(kClientID), entities);
    session->prepareToPullChanges(entities);
    auto changes = session->changeEnumerator(entities);
    std::size_t count = 0;
    while (changes.next()) ++count;
    session->finishSyncing();
    return count;
  }
};

TEST_F(KilledSync, EachKillLeavesWholeFilesASoundStoreAndNoChangeLost) {
  // A reference of each version synced from scratch, then the player at version 0.
  putRecords(records(0, false));
  std::vector<Player> players = {Player(std::string(kPlayerID))};
  for (const std::string& id : kReferencePlayers) {
    players.emplace_back(id, folder() / id);
    fs::create_directories(folder() / id);
    tessel({"client", "register", id, "--contacts", "--calendars"});
  }
  setPlayers(players);
  Files reference[2];
  for (int version = 0; version < 2; ++version) {
    putRecords(records(version, true));
    ASSERT_EQ(syncClient(kReferencePlayers[version]).finalStatus(), 0);
    reference[version] = filesOf(folder() / kReferencePlayers[version]);
    ASSERT_EQ(reference[version].size(), 1u + kCalendars);
  }
  ASSERT_NE(reference[0], reference[1]);
  tessel({"client", "register", std::string(kClientID), "--contacts", "--calendars"});
  putRecords(records(0, true));
  ASSERT_EQ(syncClient(kClientID).finalStatus(), 0);
  ASSERT_EQ(filesOf(volume()), reference[0]);

  // Two whole runs, watched line by line to aim the kills; each stretch between two lines is
  // taken at its shortest, the least disturbed by other load.
  int version = 0;
  SynctoolRun measured;
  std::vector<double> stretch;
  for (int run = 0; run < 2; ++run) {
    putRecords(records(version = 1 - version, true));
    measured = syncClient(kClientID, KillAt{});
    ASSERT_EQ(measured.finalStatus(), 0) << measured.log;
    ASSERT_EQ(measured.logLineSeconds.size(), measured.logLines.size());
    stretch.resize(measured.logLines.size() - 1, 1e9);
    for (std::size_t k = 1; k < measured.logLines.size(); ++k)
      stretch[k - 1] =
          std::min(stretch[k - 1], measured.logLineSeconds[k] - measured.logLineSeconds[k - 1]);
  }
  const std::size_t lines = measured.logLines.size();
  std::vector<std::pair<KillAt, std::string>> moments;  // with what each is, for a fault report
  const auto afterLine = [&](std::size_t k, double seconds) {
    moments.push_back({KillAt::afterLogLine(k, seconds),
                       std::to_string(seconds * 1000) + " ms after log line " + std::to_string(k) +
                           " (" + measured.logLines[k - 1] + ")"});
  };
  // Right after the lines that open the file writes, the calendars clean-up and the bookkeeping
  // after each write, and at each quarter of the run.
  std::vector<std::pair<double, std::size_t>> longest;
  for (std::size_t k = 1; k <= lines; ++k) {
    const std::string& line = measured.logLines[k - 1];
    bool opens = k % (lines / 4) == 0;
    for (const char* start : {"Truth contains", "Effectively stored", "Uploading", "Storing",
                              "Sync'ing Calendars", "Removing", "Commiting accepted changes"})
      opens = opens || line.starts_with(start);
    if (opens) afterLine(k, 0);
    if (k < lines) longest.emplace_back(stretch[k - 1], k);
  }
  // Inside the five longest stretches without a line (the contacts write, building the cards,
  // flattening a calendar...), at a third and two thirds.
  std::sort(longest.rbegin(), longest.rend());
  longest.resize(std::min<std::size_t>(longest.size(), 5));
  for (const auto& [length, k] : longest)
    for (const double part : {0.3, 0.7}) afterLine(k, length * part);
  // The steps of the file writes and of the clean-up as the player sees them: whatever the
  // load, these land inside the writes.
  const std::tuple<std::string, std::uint32_t, std::size_t> steps[] = {
      {"Contacts", IN_CREATE, 1},  {"Contacts", IN_CLOSE_WRITE, 1}, {"Contacts", IN_MOVED_TO, 1},
      {"Calendars", IN_DELETE, 2}, {"Calendars", IN_MODIFY, 3},     {"Calendars", IN_MOVED_TO, 4}};
  for (const auto& [stepFolder, event, n] : steps)
    moments.push_back(
        {KillAt::afterFileEvent(volume() / stepFolder, event, n),
         stepFolder + " file event " + std::to_string(event) + " #" + std::to_string(n)});

  int kills = 0, halfFiles = 0, lostChanges = 0;
  std::set<std::string> leftovers;
  std::vector<std::string> faults;
  for (const auto& [moment, where] : moments) {
    const Files& before = reference[version];
    const Files& after = reference[version = 1 - version];
    putRecords(records(version, true));

    const SynctoolRun killed = syncClient(kClientID, moment);
    kills += killed.exitStatus == 128 + SIGKILL;
    const Files left = filesOf(volume());
    for (const auto& [path, content] : withoutTemporaries(left)) {
      if ((!before.contains(path) || before.at(path) != content) &&
          (!after.contains(path) || after.at(path) != content)) {
        ++halfFiles;
        faults.push_back(where + ": " + path + " is neither version");
      }
    }
    // The contacts file is only ever replaced; a calendar file goes once the clean-up began,
    // which logs each removal first.
    for (const auto& [path, content] : after) {
      if (!left.contains(path) &&
          (path.starts_with("Contacts/") || !killed.logContains("Removing "))) {
        ++halfFiles;
        faults.push_back(where + ": " + path + " is gone");
      }
    }
    EXPECT_EQ(integrity(), "ok") << where;

    const SynctoolRun recovery = syncClient(kClientID);
    EXPECT_EQ(recovery.finalStatus(), 0) << "after the kill " << where << "\n" << recovery.log;
    const Files recovered = filesOf(volume());
    for (const auto& file : recovered)
      if (isTemporary(file.first) && leftovers.insert(file.first).second)
        faults.push_back(where + ": " + file.first + " survives the next run");
    const std::size_t uncommitted = uncommittedChanges();
    const bool settled = syncClient(kClientID).logContains("Nothing to push for contacts...");
    if (withoutTemporaries(recovered) != after || uncommitted != 0 || !settled) {
      ++lostChanges;
      faults.push_back(where + ": after the next run the player is " +
                       (withoutTemporaries(recovered) == after ? "current, " : "stale, ") +
                       std::to_string(uncommitted) + " changes are not committed, contacts " +
                       (settled ? "settled" : "pushed again"));
    }
  }

  std::cout << "[ FIGURES  ] moments=" << moments.size() << " kills=" << kills
            << " half_files=" << halfFiles << " leftovers=" << leftovers.size()
            << " lost_changes=" << lostChanges << " (measured run " << measured.seconds << " s, "
            << lines << " log lines)\n";
  for (const std::string& fault : faults) std::cout << "[ FAULT    ] kill " << fault << '\n';
  RecordProperty("kills", kills);
  RecordProperty("half_files", halfFiles);
  RecordProperty("leftovers", static_cast<int>(leftovers.size()));
  RecordProperty("lost_changes", lostChanges);
  EXPECT_GE(kills, 25);
  EXPECT_EQ(halfFiles, 0);
  EXPECT_EQ(leftovers.size(), 0u);
  EXPECT_EQ(lostChanges, 0);
}

}  // namespace
}  // namespace zt::sync::test_support
