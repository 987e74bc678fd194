// A sync of a few thousand records killed with SIGKILL at moments spread over the whole run:
// right after chosen log lines, and at times spread over the stretches that log nothing
// (building the cards, writing the files). Between kills the store changes, so every file has
// a previous and a new version. A kill may leave either version of each file (a calendar file
// may be gone, as the folder is emptied first) but never part of one; the store stays sound;
// the next normal run leaves none of the tool's temporaries and the player as a sync from
// scratch would; and no change is lost.

#include <gtest/gtest.h>
#include <signal.h>
#include <sqlite3.h>
#include <sys/inotify.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <set>
#include <sstream>
#include <string>
#include <tuple>
#include <vector>

#include "sync/synctool_fixture.h"
#include "sync/zt_sync_manager.h"
#include "tessel/change_enumerator.h"
#include "tessel/schema.h"
#include "tessel/session.h"

namespace zt::sync::test_support {
namespace {

constexpr int kContacts = 2000;
constexpr int kEvents = 1000;
constexpr int kGroups = 3;
const std::vector<std::string> kCalendarTitles = {"Work", "Home", "Sport", "Family"};
// Every this many contacts and events one differs between the two versions of the store.
constexpr int kContactChangeEvery = 20;
constexpr int kEventChangeEvery = 15;
// How many of the longest stretches between two log lines, besides the file writes, get kills
// inside them.
constexpr std::size_t kTimedStretches = 4;
constexpr int kMeasuredRuns = 3;
// Scratch players whose clients only ever sync each version from scratch.
const std::vector<std::string> kReferencePlayers = {"000A27001A2B3C50", "000A27001A2B3C51"};

// A player's Contacts/ and Calendars/ folders: relative path to content.
using Files = std::map<std::string, std::string>;

Files filesOf(const fs::path& volume) {
  Files files;
  for (const char* folder : {"Contacts", "Calendars"}) {
    std::error_code ignored;
    for (const auto& entry : fs::directory_iterator(volume / folder, ignored)) {
      if (!entry.is_regular_file()) continue;
      std::ifstream in(entry.path(), std::ios::binary);
      std::ostringstream content;
      content << in.rdbuf();
      files[std::string(folder) + "/" + entry.path().filename().string()] = content.str();
    }
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

Json date(int day, int hour) {
  char text[32];
  std::snprintf(text, sizeof text, "2027-%02d-%02dT%02d:00:00", 1 + day / 28 % 12, 1 + day % 28,
                hour);
  return Json{{"$date", text}, {"tz", "Europe/Paris"}};
}

Json line(const std::string& id, const std::string& entity, Json fields) {
  Json record = Json{{"tessel.record.entity", entity}};
  record.update(fields);
  return Json{{"id", id}, {"record", record}};
}

std::string contactID(int i) {
  return "contact-" + std::to_string(i);
}
std::string eventID(int i) {
  return "event-" + std::to_string(i);
}
std::string calendarID(std::size_t i) {
  return "calendar-" + std::to_string(i);
}

// The records of one contact at that version of the store, as typed JSON lines.
void addContact(std::vector<Json>& lines, int i, int version) {
  const std::string id = contactID(i);
  const bool changed = version == 1 && i % kContactChangeEvery == 0;
  lines.push_back(line(id + "-phone", "tessel.contacts.PhoneNumber",
                       {{"value", "+33 1 40 00 " + std::to_string(10000 + i + (changed ? 1 : 0))},
                        {"type", i % 2 ? "work" : "mobile"}}));
  lines.push_back(
      line(id + "-email", "tessel.contacts.EmailAddress",
           {{"value", "person" + std::to_string(i) + "@example.org"}, {"type", "home"}}));
  lines.push_back(
      line(id, "tessel.contacts.Contact",
           {{"first name", "First" + std::to_string(i)},
            {"last name", std::string(changed ? "Renamed" : "Last") + std::to_string(i)},
            {"company name", "Company " + std::to_string(i % 37)},
            {"notes", changed ? "Moved to the new office." : "Met at the fair."},
            {"phone numbers", {id + "-phone"}},
            {"email addresses", {id + "-email"}},
            {"parent groups", {"group-" + std::to_string(i % kGroups)}}}));
}

void addEvent(std::vector<Json>& lines, int i, int version) {
  const bool changed = version == 1 && i % kEventChangeEvery == 0;
  lines.push_back(
      line(eventID(i), "tessel.calendars.Event",
           {{"summary", std::string(changed ? "Moved: " : "") + "Meeting " + std::to_string(i)},
            {"location", changed ? "Room B" : "Room A"},
            {"description", "Agenda of meeting " + std::to_string(i)},
            {"start date", date(i, 9 + i % 8)},
            {"end date", date(i, 10 + i % 8)},
            {"calendar", {calendarID(i % kCalendarTitles.size())}}}));
}

// The whole store at version 0.
std::vector<Json> everyRecord() {
  std::vector<Json> lines;
  for (int i = 0; i < kContacts; ++i) addContact(lines, i, 0);
  for (int g = 0; g < kGroups; ++g) {
    Json members = Json::array();
    for (int i = g; i < kContacts; i += kGroups) members.push_back(contactID(i));
    lines.push_back(line("group-" + std::to_string(g), "tessel.contacts.Group",
                         {{"name", "Group " + std::to_string(g)}, {"members", members}}));
  }
  for (int i = 0; i < kEvents; ++i) addEvent(lines, i, 0);
  Json order = Json::array();
  for (std::size_t c = 0; c < kCalendarTitles.size(); ++c) {
    Json events = Json::array();
    for (std::size_t i = c; i < kEvents; i += kCalendarTitles.size()) {
      events.push_back(eventID(static_cast<int>(i)));
    }
    lines.push_back(line(calendarID(c), "tessel.calendars.Calendar",
                         {{"title", kCalendarTitles[c]}, {"events", events}}));
    order.push_back(calendarID(c));
  }
  lines.push_back(line("calendar-order", "tessel.calendars.CalendarOrder", {{"calendars", order}}));
  return lines;
}

// Only the records that differ between the versions, as they are at `version`.
std::vector<Json> changedRecords(int version) {
  std::vector<Json> lines;
  for (int i = 0; i < kContacts; i += kContactChangeEvery) addContact(lines, i, version);
  for (int i = 0; i < kEvents; i += kEventChangeEvery) addEvent(lines, i, version);
  return lines;
}

class KilledSync : public SynctoolTest {
 protected:
  void put(const std::vector<Json>& lines) {
    const fs::path file = folder() / "records.jsonl";
    std::ofstream out(file, std::ios::binary | std::ios::trunc);
    for (const Json& record : lines) out << record.dump() << '\n';
    out.close();
    const TesselRun run = runTessel({"records", "put", file.string()});
    ASSERT_EQ(run.exitStatus, 0) << run.output;
  }

  void registerFor(const std::string& clientID) {
    const TesselRun run = runTessel({"client", "register", clientID, "--contacts", "--calendars"});
    ASSERT_EQ(run.exitStatus, 0) << run.output;
  }

  // `PRAGMA integrity_check` of the store, through SQLite itself; "ok" when sound.
  std::string integrity() {
    sqlite3* db = nullptr;
    std::string answer = "cannot open";
    if (sqlite3_open_v2((folder() / "truth.db").c_str(), &db, SQLITE_OPEN_READONLY, nullptr) ==
        SQLITE_OK) {
      sqlite3_stmt* statement = nullptr;
      sqlite3_prepare_v2(db, "PRAGMA integrity_check", -1, &statement, nullptr);
      answer.clear();
      while (statement && sqlite3_step(statement) == SQLITE_ROW) {
        answer += reinterpret_cast<const char*>(sqlite3_column_text(statement, 0));
      }
      sqlite3_finalize(statement);
    }
    sqlite3_close(db);
    return answer;
  }

  // The changes of truth the client's mirror does not hold yet, asked of the engine in a
  // session of its own that takes nothing. Calendars are pushed whole, so of them only the
  // calendar order is kept in the mirror.
  std::size_t uncommittedChanges() {
    const auto synced = client(kClientID);
    std::vector<std::string> entities = ZTSyncManager::entitiesForContacts();
    entities.emplace_back(tessel::TesselEntity_Calendars_CalendarOrder);
    auto session = tessel::Session::begin(*synced, entities);
    session->prepareToPullChanges(entities);
    auto changes = session->changeEnumerator(entities);
    std::size_t count = 0;
    while (changes.next()) ++count;
    session->finishSyncing();
    return count;
  }

  // The log lines that start a stretch where a kill matters most: the file writes, the
  // calendars clean-up and the bookkeeping after each write.
  static bool startsAStretch(const std::string& logLine) {
    for (const char* start :
         {"Truth contains", "Effectively stored", "Uploading changes", "Uploading done", "Storing",
          "Sync'ing Calendars", "Removing", "Commiting accepted changes"}) {
      if (logLine.starts_with(start)) return true;
    }
    return false;
  }
};

TEST_F(KilledSync, EachKillLeavesWholeFilesASoundStoreAndNoChangeLost) {
  // The store at version 0, and a reference of each version from scratch.
  put(everyRecord());
  std::vector<Player> players = {Player(std::string(kPlayerID))};
  for (const std::string& id : kReferencePlayers) {
    players.emplace_back(id, folder() / id);
    fs::create_directories(folder() / id);
    registerFor(id);
  }
  setPlayers(players);
  std::vector<Files> reference;
  for (int version = 0; version < 2; ++version) {
    if (version == 1) put(changedRecords(1));
    const SynctoolRun run = syncClient(kReferencePlayers[version]);
    ASSERT_EQ(run.finalStatus(), 0) << run.log;
    reference.push_back(filesOf(folder() / kReferencePlayers[version]));
    ASSERT_EQ(reference.back().size(), 1 + kCalendarTitles.size());
  }
  ASSERT_NE(reference[0], reference[1]);

  registerFor(std::string(kClientID));
  put(changedRecords(0));
  ASSERT_EQ(syncClient(kClientID).finalStatus(), 0);
  ASSERT_EQ(filesOf(volume()), reference[0]);

  // Whole runs from one version to the other, watched line by line, to aim the kills. Each
  // stretch between two lines is taken at its shortest, the least disturbed by other load.
  int version = 0;
  SynctoolRun measured;
  std::vector<double> stretch;
  for (int run = 0; run < kMeasuredRuns; ++run) {
    version = 1 - version;
    put(changedRecords(version));
    measured = runSynctool({"--oneshot", "--sync", std::string(kClientID)}, KillAt{});
    ASSERT_EQ(measured.finalStatus(), 0) << measured.log;
    ASSERT_EQ(measured.logLineSeconds.size(), measured.logLines.size());
    ASSERT_TRUE(stretch.empty() || stretch.size() + 1 == measured.logLines.size());
    for (std::size_t k = 1; k < measured.logLines.size(); ++k) {
      const double length = measured.logLineSeconds[k] - measured.logLineSeconds[k - 1];
      if (stretch.size() < k) stretch.push_back(length);
      stretch[k - 1] = std::min(stretch[k - 1], length);
    }
  }
  const std::size_t lines = measured.logLines.size();
  // Each moment with what it is, for the report of a fault.
  std::vector<std::pair<KillAt, std::string>> moments;
  const auto afterLine = [&](std::size_t k, double seconds) {
    moments.emplace_back(KillAt::afterLogLine(k, seconds),
                         std::to_string(seconds * 1000) + " ms after log line " +
                             std::to_string(k) + " (" + measured.logLines[k - 1] + ")");
  };
  for (std::size_t k = 1; k <= lines; ++k) {
    if (k % (lines / 4) == 0 || startsAStretch(measured.logLines[k - 1])) afterLine(k, 0);
  }
  // Inside the stretches without a line, kills timed from the line that opens them: in the
  // contacts write and in the longest other stretches (building the cards, flattening a
  // calendar, the device probe).
  std::vector<std::pair<double, std::size_t>> stretches;
  for (std::size_t k = 1; k < lines; ++k) {
    if (measured.logLines[k - 1].starts_with("Uploading changes to ")) {
      for (const double part : {0.3, 0.7}) afterLine(k, stretch[k - 1] * part);
    } else if (!measured.logLines[k - 1].starts_with("Uploading changes")) {
      stretches.emplace_back(stretch[k - 1], k);
    }
  }
  std::sort(stretches.rbegin(), stretches.rend());
  stretches.resize(std::min(stretches.size(), kTimedStretches));
  for (const auto& [length, k] : stretches) {
    for (const double part : {0.3, 0.7}) afterLine(k, length * part);
  }
  // The steps of each file write and of the clean-up, seen as they happen on the player:
  // whatever the load, these land inside the writes.
  const std::vector<std::tuple<const char*, std::uint32_t, const char*, std::size_t>> steps = {
      {"Contacts", IN_CREATE, "temporary created", 1},
      {"Contacts", IN_MODIFY, "temporary written", 1},
      {"Contacts", IN_CLOSE_WRITE, "temporary closed", 1},
      {"Contacts", IN_MOVED_TO, "temporary renamed", 1},
      {"Calendars", IN_DELETE, "removal", 2},
      {"Calendars", IN_CREATE, "temporary created", 1},
      {"Calendars", IN_CLOSE_WRITE, "temporary closed", 2},
      {"Calendars", IN_MODIFY, "temporary written", 3},
      {"Calendars", IN_MOVED_TO, "temporary renamed", 4},
  };
  for (const auto& [folder, event, what, n] : steps) {
    moments.emplace_back(KillAt::afterFileEvent(volume() / folder, event, n),
                         std::string(folder) + ": " + what + " #" + std::to_string(n));
  }

  int kills = 0, halfFiles = 0, lostChanges = 0;
  std::set<std::string> leftovers;
  std::vector<std::string> faults;
  for (const auto& [moment, where] : moments) {
    const Files& before = reference[version];
    version = 1 - version;
    const Files& after = reference[version];
    put(changedRecords(version));

    const SynctoolRun killed = runSynctool({"--oneshot", "--sync", std::string(kClientID)}, moment);
    if (killed.exitStatus == 128 + SIGKILL) ++kills;
    const Files left = filesOf(volume());
    for (const auto& [path, content] : withoutTemporaries(left)) {
      const auto previous = before.find(path), next = after.find(path);
      if ((previous == before.end() || previous->second != content) &&
          (next == after.end() || next->second != content)) {
        ++halfFiles;
        faults.push_back("kill " + where + ": " + path + " is neither version (" +
                         std::to_string(content.size()) + " bytes)");
      }
    }
    // The contacts file is only ever replaced; a calendar file goes once the clean-up began,
    // which logs each removal first.
    for (const auto& [path, content] : after) {
      if (!left.contains(path) &&
          (path.starts_with("Contacts/") || !killed.logContains("Removing "))) {
        ++halfFiles;
        faults.push_back("kill " + where + ": " + path + " is gone");
      }
    }
    const std::string soundness = integrity();
    EXPECT_EQ(soundness, "ok") << "kill " << where;

    const SynctoolRun recovery = syncClient(kClientID);
    EXPECT_EQ(recovery.finalStatus(), 0) << "after the kill " << where << "\n" << recovery.log;
    const Files recovered = filesOf(volume());
    for (const auto& file : recovered) {
      if (isTemporary(file.first) && leftovers.insert(file.first).second) {
        faults.push_back("kill " + where + ": " + file.first + " survives the next run");
      }
    }
    const std::size_t uncommitted = uncommittedChanges();
    const SynctoolRun again = syncClient(kClientID);
    if (withoutTemporaries(recovered) != after || uncommitted != 0 ||
        !again.logContains("Nothing to push for contacts...")) {
      ++lostChanges;
      faults.push_back(
          "kill " + where + ": after the next run the player is " +
          (withoutTemporaries(recovered) == after ? "current" : "stale") + ", " +
          std::to_string(uncommitted) + " changes are not committed, contacts " +
          (again.logContains("Nothing to push for contacts...") ? "settled" : "pushed again"));
    }
  }

  std::ostringstream figures;
  figures << "moments=" << moments.size() << " kills=" << kills << " half_files=" << halfFiles
          << " leftovers=" << leftovers.size() << " lost_changes=" << lostChanges;
  std::cout << "[ FIGURES  ] " << figures.str() << " (measured run " << measured.seconds << " s, "
            << lines << " log lines)\n";
  for (const std::string& fault : faults) std::cout << "[ FAULT    ] " << fault << '\n';
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
