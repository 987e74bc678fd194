// `tessel import vcard` through the real binary, in a fresh folder per test.

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

const fs::path kData = fs::path(ZT_TEST_DATA_DIR) / ".." / ".." / "tessel" / "data" / "vcard";

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

class ImportVCardCommand : public ::testing::Test {
 protected:
  void SetUp() override {
    std::string pattern = (fs::temp_directory_path() / "tessel-vcard-XXXXXX").string();
    ASSERT_NE(mkdtemp(pattern.data()), nullptr);
    dir_ = pattern;
    source_ = dir_ / "source";
    fs::create_directories(source_);
    ASSERT_EQ(tessel({"init"}).status, 0);
  }
  void TearDown() override {
    std::error_code ignored;
    fs::remove_all(dir_, ignored);
  }

  Outcome tessel(const std::vector<std::string>& args) {
    std::vector<std::string> all = {TESSEL_BINARY, "--store", (dir_ / "truth.db").string()};
    all.insert(all.end(), args.begin(), args.end());
    const fs::path out = dir_ / "stdout", err = dir_ / "stderr";
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_addopen(&actions, 1, out.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    posix_spawn_file_actions_addopen(&actions, 2, err.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    std::vector<char*> argv;
    for (const std::string& arg : all) argv.push_back(const_cast<char*>(arg.c_str()));
    argv.push_back(nullptr);
    pid_t pid = 0;
    Outcome run;
    if (posix_spawn(&pid, argv[0], &actions, nullptr, argv.data(), environ) == 0) {
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
  fs::path source_;
};

TEST_F(ImportVCardCommand, ImportsFilesAndFoldersAndSaysWhat) {
  const Outcome run = tessel({"import", "vcard", (kData / "outlook_21.vcf").string(),
                              (kData / "address_book_30.vcf").string(),
                              (kData / "server_40.vcf").string(), (kData / "vdir").string()});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_EQ(run.out, "8 contacts, 4 groups from 6 files; 43 written, 0 deleted\n");
  const std::string first = listing();
  EXPECT_NE(first.find(R"("first name":"Zoë","last name":"Ørsted")"), std::string::npos);
  EXPECT_NE(first.find(R"("name":"Bletchley","members":["vcard/uid:vdir-a","vcard/uid:vdir-b"])"),
            std::string::npos);

  // Again: the same records, nothing written.
  const Outcome again = tessel({"import", "vcard", (kData / "vdir").string()});
  ASSERT_EQ(again.status, 0) << again.err;
  EXPECT_EQ(again.out, "2 contacts, 1 group from 3 files; 0 written, 0 deleted\n");
  EXPECT_EQ(listing(), first);
}

TEST_F(ImportVCardCommand, SyncDeletesRemovesContactsThatLeftTheSource) {
  fs::copy_file(kData / "vdir" / "a1.vcf", source_ / "a1.vcf");
  fs::copy_file(kData / "vdir" / "b2.vcf", source_ / "b2.vcf");
  ASSERT_EQ(tessel({"import", "vcard", source_.string()}).status, 0);
  fs::remove(source_ / "a1.vcf");
  const Outcome run = tessel({"import", "vcard", "--sync-deletes", source_.string()});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_EQ(run.out, "1 contact, 0 groups from 1 file; 0 written, 2 deleted\n");
  EXPECT_EQ(listing().find("vdir-a"), std::string::npos);
}

TEST_F(ImportVCardCommand, MalformedFileFailsWithFileAndLineAndImportsNothing) {
  ASSERT_EQ(tessel({"import", "vcard", (kData / "vdir").string()}).status, 0);
  const std::string before = listing();
  const fs::path bad = kData / "malformed" / "bad_qp.vcf";
  const Outcome run = tessel(
      {"import", "vcard", "--sync-deletes", (kData / "server_40.vcf").string(), bad.string()});
  EXPECT_EQ(run.status, 1);
  EXPECT_EQ(run.err, "tessel: " + bad.string() + ": line 4: bad quoted-printable in NOTE\n");
  EXPECT_EQ(run.out, "");
  EXPECT_EQ(listing(), before);

  const Outcome missing = tessel({"import", "vcard", (dir_ / "nowhere.vcf").string()});
  EXPECT_EQ(missing.status, 1);
  EXPECT_NE(missing.err.find("nowhere.vcf: cannot read"), std::string::npos) << missing.err;
}

TEST_F(ImportVCardCommand, UsageErrors) {
  EXPECT_EQ(tessel({"import", "vcard"}).status, 2);
  EXPECT_EQ(tessel({"import"}).status, 2);
  EXPECT_EQ(tessel({"import", "vcard", "--no-such-flag", "x.vcf"}).status, 2);
}

}  // namespace
