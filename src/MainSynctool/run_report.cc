#include "MainSynctool/run_report.h"

#include <sys/stat.h>

#include <algorithm>
#include <cstdio>
#include <functional>
#include <map>
#include <string_view>
#include <system_error>
#include <utility>

#include "sync/sync_status.h"
#include "sync/zt_sync_manager.h"

namespace zt::synctool {

namespace fs = std::filesystem;

namespace {

// A file as it stands: a replaced file is a new inode or a new modification time.
using FileStamp = std::pair<ino_t, std::int64_t>;

std::map<std::string, FileStamp> stamps(const std::optional<std::string>& folder) {
  std::map<std::string, FileStamp> found;
  if (!folder) return found;
  std::error_code error;
  for (const fs::directory_entry& entry : fs::directory_iterator(*folder, error)) {
    struct stat status {};
    if (::lstat(entry.path().c_str(), &status) != 0 || !S_ISREG(status.st_mode)) continue;
    found.emplace(
        entry.path().filename().string(),
        FileStamp{status.st_ino, status.st_mtim.tv_sec * 1'000'000'000LL + status.st_mtim.tv_nsec});
  }
  return found;
}

std::size_t replacedFiles(const std::map<std::string, FileStamp>& before,
                          const std::map<std::string, FileStamp>& after, std::string_view suffix) {
  std::size_t count = 0;
  for (const auto& [name, stamp] : after) {
    if (!name.ends_with(suffix)) continue;
    const auto old = before.find(name);
    if (old == before.end() || old->second != stamp) ++count;
  }
  return count;
}

// The cards of a UTF-16BE vCard file: its BEGIN:VCARD lines. Read a piece at a time: the
// file of a large address book is as large as the rest of the run's memory.
std::size_t countCards(const fs::path& file) {
  std::string pattern;
  for (char c : std::string_view("BEGIN:VCARD")) pattern += {'\0', c};
  // Half the pattern's characters are NUL, as are half the file's bytes: a search that
  // starts from the first byte would compare at every other position.
  const std::boyer_moore_horspool_searcher searcher(pattern.begin(), pattern.end());
  constexpr std::size_t kPiece = std::size_t{1} << 20;
  std::string bytes;
  std::size_t count = 0;
  FILE* in = std::fopen(file.c_str(), "rb");
  if (!in) return 0;
  for (;;) {
    // The end of the previous piece stays, so that a pattern across two pieces is found.
    const std::size_t kept = bytes.size();
    bytes.resize(kept + kPiece);
    bytes.resize(kept + std::fread(bytes.data() + kept, 1, kPiece, in));
    const bool last = bytes.size() == kept;
    auto from = bytes.begin();
    for (auto at = std::search(from, bytes.end(), searcher); at != bytes.end();
         at = std::search(at + 1, bytes.end(), searcher)) {
      ++count;
      from = at + 1;
    }
    if (last) break;
    // Keep what could still begin a match (the bytes after the last match found).
    const std::size_t tail =
        std::min<std::size_t>(pattern.size() - 1, static_cast<std::size_t>(bytes.end() - from));
    bytes.erase(0, bytes.size() - tail);
  }
  std::fclose(in);
  return count;
}

class ReportingContacts final : public sync::ContactsSyncing {
 public:
  ReportingContacts(std::unique_ptr<sync::ContactsSyncing> inner, sync::ZTSyncManager& manager,
                    std::shared_ptr<RunReport> report)
      : inner_(std::move(inner)), manager_(manager), report_(std::move(report)) {}
  bool shouldApplyContactGroupWithIdentifier(const std::string& identifier) override {
    return inner_->shouldApplyContactGroupWithIdentifier(identifier);
  }
  bool doSync() override {
    const auto& folder = manager_.pathToZetoContactsFolder();
    const auto before = stamps(folder);
    const bool goesOn = inner_->doSync();
    const auto after = stamps(folder);
    const auto file = after.find("Tessel.vcf");
    if (folder && file != after.end()) {
      const auto old = before.find(file->first);
      if (old == before.end() || old->second != file->second) {
        report_->contactsWritten = countCards(fs::path(*folder) / file->first);
      }
    }
    return goesOn;
  }

 private:
  std::unique_ptr<sync::ContactsSyncing> inner_;
  sync::ZTSyncManager& manager_;
  std::shared_ptr<RunReport> report_;
};

class ReportingCalendars final : public sync::CalendarsSyncing {
 public:
  ReportingCalendars(std::unique_ptr<sync::CalendarsSyncing> inner, sync::ZTSyncManager& manager,
                     std::shared_ptr<RunReport> report)
      : inner_(std::move(inner)), manager_(manager), report_(std::move(report)) {}
  bool shouldApplyCalendarWithIdentifier(const std::string& identifier) override {
    return inner_->shouldApplyCalendarWithIdentifier(identifier);
  }
  bool doSync() override {
    const auto& folder = manager_.pathToZetoCalendarsFolder();
    const auto before = stamps(folder);
    const bool goesOn = inner_->doSync();
    const std::size_t written = replacedFiles(before, stamps(folder), ".ics");
    if (written > 0) report_->calendarsWritten = written;
    return goesOn;
  }

 private:
  std::unique_ptr<sync::CalendarsSyncing> inner_;
  sync::ZTSyncManager& manager_;
  std::shared_ptr<RunReport> report_;
};

std::string statusWord(std::int32_t reported) {
  switch (reported) {
    case 0:
      return "synced";
    case 1:
      return "cancelled";
    case 2:
      return "error";
    case 3:
      return "player unavailable";
    default:
      return "status " + std::to_string(reported);
  }
}

std::string counted(std::size_t n, std::string_view one, std::string_view many) {
  return std::to_string(n) + " " + std::string(n == 1 ? one : many);
}

}  // namespace

sync::SyncerMakers reportingMakers(sync::SyncerMakers makers, std::shared_ptr<RunReport> report) {
  sync::SyncerMakers wrapped;
  if (makers.contacts) {
    wrapped.contacts = [maker = makers.contacts, report](
                           sync::ZTSyncManager& manager) -> std::unique_ptr<sync::ContactsSyncing> {
      auto inner = maker(manager);
      if (!inner) return inner;
      return std::make_unique<ReportingContacts>(std::move(inner), manager, report);
    };
  }
  if (makers.calendars) {
    wrapped.calendars =
        [maker = makers.calendars,
         report](sync::ZTSyncManager& manager) -> std::unique_ptr<sync::CalendarsSyncing> {
      auto inner = maker(manager);
      if (!inner) return inner;
      return std::make_unique<ReportingCalendars>(std::move(inner), manager, report);
    };
  }
  return wrapped;
}

std::string outcomeLine(const RunFacts& facts) {
  std::string reason;
  if (!facts.storeExists) {
    reason = "no store at " + facts.storePath.string() +
             " (create it with tessel init, or set TESSEL_STORE)";
  } else if (!facts.clientExists) {
    reason = "no sync client " + facts.clientID + " in the store " + facts.storePath.string();
  }
  if (facts.reportedStatus == 0 && !reason.empty()) {
    // The run itself counts as done; the person still learns why nothing happened.
    return "zetosynctool: success, but nothing was written: " + reason;
  }
  std::string line = "zetosynctool: " + statusWord(facts.reportedStatus) + ": ";
  if (!reason.empty()) return line + reason;
  if (facts.reportedStatus == 0) {
    std::string written;
    if (facts.written.contactsWritten) {
      written = "Contacts/Tessel.vcf (" +
                counted(*facts.written.contactsWritten, "contact", "contacts") + ")";
    }
    if (facts.written.calendarsWritten) {
      if (!written.empty()) written += ", ";
      written += counted(*facts.written.calendarsWritten, "calendar", "calendars");
    }
    return line + (written.empty() ? "nothing to push" : written);
  }
  switch (facts.lastStatus) {
    case sync::kStatusDeviceUnavailable:
      return line + "no connected player matches " + facts.clientID +
             " (tessel devices lists them), or another sync holds it";
    case sync::kStatusVolumeNotMounted:
      return line + "the player's volume was not mounted in time";
    case sync::kStatusCancelled:
      return line + "the session was cancelled";
    case sync::kStatusWriteFailed:
      return line + "writing to the player failed (see the log)";
    default:
      return line + "see the log (journalctl -t zetosynctool, or ZETOSYNCTOOL_LOG=stderr)";
  }
}

}  // namespace zt::synctool
