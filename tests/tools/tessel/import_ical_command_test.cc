// `tessel import ical` through the built binary, as users run it, on the calendar exports of
// tests/tessel/data/ical/ and on files each test writes into a fresh folder.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

extern char** environ;

namespace {

namespace fs = std::filesystem;

const fs::path kData = fs::path(ZT_TEST_DATA_DIR) / ".." / ".." / "tessel" / "data" / "ical";

struct Outcome {
  int status = -1;
  std::string out;
  std::string err;
};

std::string readFile(const fs::path& path) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream text;
  text << in.rdbuf();
  return text.str();
}

void writeFile(const fs::path& path, const std::string& text) {
  std::ofstream out(path, std::ios::binary);
  out << text;
}

std::size_t lineCount(const std::string& text) {
  std::size_t lines = 0;
  for (char c : text) lines += c == '\n' ? 1 : 0;
  return lines;
}

#define EXPECT_CONTAINS(text, part) \
  EXPECT_NE(std::string(text).find(part), std::string::npos) << "in: " << (text)

class ImportICalCommand : public ::testing::Test {
 protected:
  void SetUp() override {
    std::string pattern = (fs::temp_directory_path() / "tessel-ical-XXXXXX").string();
    ASSERT_NE(mkdtemp(pattern.data()), nullptr);
    dir_ = pattern;
    ASSERT_EQ(tessel({"init"}).status, 0);
  }
  void TearDown() override {
    std::error_code ignored;
    fs::remove_all(dir_, ignored);
  }

  Outcome tessel(const std::vector<std::string>& args) {
    std::vector<std::string> argv = {TESSEL_BINARY, "--store", (dir_ / "truth.db").string()};
    argv.insert(argv.end(), args.begin(), args.end());
    const fs::path out = dir_ / "stdout", err = dir_ / "stderr";
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_addopen(&actions, 1, out.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    posix_spawn_file_actions_addopen(&actions, 2, err.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    std::vector<char*> pointers;
    for (const std::string& arg : argv) pointers.push_back(const_cast<char*>(arg.c_str()));
    pointers.push_back(nullptr);
    pid_t pid = 0;
    Outcome run;
    if (posix_spawn(&pid, pointers[0], &actions, nullptr, pointers.data(), environ) == 0) {
      int status = 0;
      waitpid(pid, &status, 0);
      run.status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    }
    posix_spawn_file_actions_destroy(&actions);
    run.out = readFile(out);
    run.err = readFile(err);
    return run;
  }

  std::string listing() {
    const Outcome run = tessel({"records", "list", "--json"});
    EXPECT_EQ(run.status, 0) << run.err;
    return run.out;
  }

  fs::path dir_;
};

TEST_F(ImportICalCommand, ImportsFilesAndFoldersAndImportingAgainChangesNothing) {
  const std::string outlook = (kData / "outlook.ics").string();
  const std::string vdir = (kData / "vdir").string();
  const Outcome first = tessel({"import", "ical", outlook, vdir, "--title", "Spare"});
  ASSERT_EQ(first.status, 0) << first.err;
  EXPECT_CONTAINS(first.out, "\"Büro\": 3 events, 0 tasks\n");
  EXPECT_CONTAINS(first.out, "\"Family\": 3 events, 0 tasks\n");
  EXPECT_CONTAINS(first.out, "\n15 written, 0 deleted\n");
  const std::string stored = listing();
  // The calendars, in the order they were named, lead the calendar order.
  EXPECT_CONTAINS(stored, R"("tessel.calendars.CalendarOrder","calendars":["ical-)");
  EXPECT_EQ(lineCount(stored), 16u);  // the 15 records and the calendar order

  const Outcome again = tessel({"import", "ical", vdir, outlook});
  ASSERT_EQ(again.status, 0) << again.err;
  EXPECT_CONTAINS(again.out, "\n0 written, 0 deleted\n");
  EXPECT_EQ(listing(), stored);
}

TEST_F(ImportICalCommand, AMalformedFileImportsNothingFromAnyFile) {
  writeFile(dir_ / "good.ics",
            "BEGIN:VCALENDAR\r\nBEGIN:VEVENT\r\nUID:a\r\nSUMMARY:Fine\r\nEND:VEVENT\r\n"
            "END:VCALENDAR\r\n");
  writeFile(dir_ / "bad.ics",
            "BEGIN:VCALENDAR\r\nBEGIN:VEVENT\r\nUID:b\r\nSUMMARY:Fine too\r\n"
            "DTSTART;TZID=Nowhere/Special:20260101T100000\r\nEND:VEVENT\r\nEND:VCALENDAR\r\n");
  const std::string before = listing();
  const Outcome run =
      tessel({"import", "ical", (dir_ / "good.ics").string(), (dir_ / "bad.ics").string()});
  EXPECT_EQ(run.status, 1);
  EXPECT_EQ(run.out, "");
  EXPECT_EQ(run.err, "tessel: " + (dir_ / "bad.ics").string() +
                         ": line 5: DTSTART: no VTIMEZONE defines the time zone "
                         "\"Nowhere/Special\", and it is no IANA or Windows zone name\n");
  EXPECT_EQ(listing(), before);
}

TEST_F(ImportICalCommand, SyncDeletesAndTitles) {
  const fs::path file = dir_ / "Team Plans.ics";
  writeFile(file,
            "BEGIN:VCALENDAR\r\nBEGIN:VEVENT\r\nUID:a\r\nEND:VEVENT\r\n"
            "BEGIN:VEVENT\r\nUID:b\r\nEND:VEVENT\r\nEND:VCALENDAR\r\n");
  Outcome run = tessel({"import", "ical", file.string()});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_CONTAINS(run.out, "\"Team Plans\": 2 events, 0 tasks\n");

  writeFile(file, "BEGIN:VCALENDAR\r\nBEGIN:VEVENT\r\nUID:a\r\nEND:VEVENT\r\nEND:VCALENDAR\r\n");
  run = tessel({"import", "ical", file.string(), "--title", "Plans"});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_CONTAINS(run.out, "\"Plans\": 1 event, 0 tasks\n1 written, 0 deleted\n");
  EXPECT_CONTAINS(listing(), "/event/b\"");

  run = tessel({"import", "ical", "--sync-deletes", file.string()});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_CONTAINS(run.out, "\"Team Plans\": 1 event, 0 tasks\n1 written, 1 deleted\n");
  EXPECT_EQ(listing().find("/event/b\""), std::string::npos);
}

TEST_F(ImportICalCommand, UsageErrorsAndMissingPaths) {
  EXPECT_EQ(tessel({"import", "ical"}).status, 2);
  EXPECT_EQ(tessel({"import", "ical", "x.ics", "--title"}).status, 2);
  const Outcome missing = tessel({"import", "ical", (dir_ / "none.ics").string()});
  EXPECT_EQ(missing.status, 1);
  EXPECT_EQ(missing.err, "tessel: " + (dir_ / "none.ics").string() + ": no such file or folder\n");
}

}  // namespace
