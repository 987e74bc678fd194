#include "platform/file_system.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "platform/atomic_file.h"
#include "platform/temporary_folder.h"

namespace zt::platform {
namespace {

using test_support::TemporaryFolder;

std::vector<std::uint8_t> bytesOf(std::string_view text) {
  return std::vector<std::uint8_t>(text.begin(), text.end());
}

std::string contentsOf(const std::filesystem::path& path) {
  std::ifstream file(path, std::ios::binary);
  return std::string(std::istreambuf_iterator<char>(file), {});
}

void writeFile(const std::filesystem::path& path, std::string_view text) {
  std::ofstream(path, std::ios::binary) << text;
}

std::vector<std::string> namesIn(const FileSystem& fs, const std::filesystem::path& folder) {
  auto listing = fs.contentsOfDirectory(folder);
  if (auto* error = std::get_if<std::string>(&listing)) {
    ADD_FAILURE() << *error;
    return {};
  }
  return std::get<std::vector<std::string>>(listing);
}

class AtomicWriteTest : public ::testing::Test {
 protected:
  FileSystem fs;
  TemporaryFolder folder;
};

TEST_F(AtomicWriteTest, CreatesAndReplacesWholeFilesWithoutLeavingTemporaries) {
  const auto target = folder / "Tessel.vcf";
  ASSERT_EQ(fs.atomicWrite(target, bytesOf("first version, rather long")), std::nullopt);
  EXPECT_EQ(contentsOf(target), "first version, rather long");

  ASSERT_EQ(fs.atomicWrite(target, bytesOf("short")), std::nullopt);
  EXPECT_EQ(contentsOf(target), "short");

  // An empty buffer still gives a file, an empty one.
  ASSERT_EQ(fs.atomicWrite(target, {}), std::nullopt);
  EXPECT_TRUE(fs.isRegularFile(target));
  EXPECT_EQ(std::filesystem::file_size(target), 0u);

  EXPECT_EQ(namesIn(fs, folder.path()), std::vector<std::string>{"Tessel.vcf"});
}

TEST_F(AtomicWriteTest, LargeBuffersArriveWhole) {
  std::vector<std::uint8_t> bytes(9 * 1024 * 1024 + 17);
  for (std::size_t i = 0; i < bytes.size(); ++i) bytes[i] = static_cast<std::uint8_t>(i * 31 + 7);
  const auto target = folder / "big.ics";
  ASSERT_EQ(fs.atomicWrite(target, bytes), std::nullopt);
  const std::string written = contentsOf(target);
  ASSERT_EQ(written.size(), bytes.size());
  EXPECT_TRUE(std::equal(bytes.begin(), bytes.end(), written.begin(),
                         [](std::uint8_t b, char c) { return b == static_cast<std::uint8_t>(c); }));
}

TEST_F(AtomicWriteTest, WrittenFilesGetTheUsualPermissions) {
  const mode_t previous = ::umask(022);
  const auto target = folder / "Tessel-Home.ics";
  const auto error = fs.atomicWrite(target, bytesOf("BEGIN:VCALENDAR"));
  ::umask(previous);
  ASSERT_EQ(error, std::nullopt);
  struct stat info {};
  ASSERT_EQ(::stat(target.c_str(), &info), 0);
  EXPECT_EQ(info.st_mode & 0777, 0644u);
}

TEST_F(AtomicWriteTest, NamesAtTheLengthLimitStillWork) {
  const std::string name = "Tessel-" + std::string(240, 'x') + ".ics";  // 251 bytes
  ASSERT_EQ(fs.atomicWrite(folder / name, bytesOf("x")), std::nullopt);
  EXPECT_EQ(namesIn(fs, folder.path()), std::vector<std::string>{name});
  // Shortening the temporary name never cuts a UTF-8 character in half.
  std::string wide = "Tessel-";
  while (wide.size() < 248) wide += "\xC3\xA9";  // é
  ASSERT_EQ(fs.atomicWrite(folder / wide, bytesOf("y")), std::nullopt);
  EXPECT_EQ(contentsOf(folder / wide), "y");
}

TEST_F(AtomicWriteTest, AFailedRenameKeepsTheTargetAndRemovesTheTemporaryFile) {
  // A folder in the target's place: the content is written, then the rename fails.
  const auto target = folder / "Calendars";
  std::filesystem::create_directory(target);
  writeFile(target / "inside.ics", "kept");

  const auto error = fs.atomicWrite(target, bytesOf("new content"));
  ASSERT_TRUE(error.has_value());
  EXPECT_NE(error->find(target.string()), std::string::npos) << *error;
  EXPECT_TRUE(fs.isDirectory(target));
  EXPECT_EQ(contentsOf(target / "inside.ics"), "kept");
  EXPECT_EQ(namesIn(fs, folder.path()), std::vector<std::string>{"Calendars"});
}

TEST_F(AtomicWriteTest, APathUnderARegularFileFailsWithAReason) {
  // Fails for every user, root included, unlike a read-only folder.
  writeFile(folder / "Contacts", "a file, not a folder");
  const auto error = fs.atomicWrite(folder / "Contacts" / "Tessel.vcf", bytesOf("x"));
  ASSERT_TRUE(error.has_value());
  EXPECT_NE(error->find("Contacts/Tessel.vcf"), std::string::npos) << *error;
  EXPECT_NE(error->find("Not a directory"), std::string::npos) << *error;
  EXPECT_EQ(contentsOf(folder / "Contacts"), "a file, not a folder");
}

TEST_F(AtomicWriteTest, AReadOnlyFolderKeepsTheOldFile) {
  if (::geteuid() == 0) GTEST_SKIP() << "root writes into read-only folders";
  const auto target = folder / "Tessel.vcf";
  ASSERT_EQ(fs.atomicWrite(target, bytesOf("old")), std::nullopt);
  std::filesystem::permissions(
      folder.path(), std::filesystem::perms::owner_read | std::filesystem::perms::owner_exec);
  const auto error = fs.atomicWrite(target, bytesOf("new"));
  std::filesystem::permissions(folder.path(), std::filesystem::perms::owner_all);
  ASSERT_TRUE(error.has_value());
  EXPECT_NE(error->find("Permission denied"), std::string::npos) << *error;
  EXPECT_EQ(contentsOf(target), "old");
  EXPECT_EQ(namesIn(fs, folder.path()), std::vector<std::string>{"Tessel.vcf"});
}

TEST_F(AtomicWriteTest, AnAtomicFileThatIsNotCommittedChangesNothing) {
  const auto target = folder / "Tessel.vcf";
  writeFile(target, "old");
  {
    auto created = AtomicFile::create(target);
    ASSERT_TRUE(std::holds_alternative<AtomicFile>(created));
    AtomicFile file = std::move(std::get<AtomicFile>(created));
    ASSERT_EQ(file.write(bytesOf("half of the new")), std::nullopt);
    EXPECT_EQ(file.temporaryPath().parent_path(), folder.path());
    EXPECT_EQ(file.temporaryPath().filename().string().rfind(".Tessel.vcf.tmp", 0), 0u);
    EXPECT_TRUE(fs.exists(file.temporaryPath()));
  }
  EXPECT_EQ(contentsOf(target), "old");
  EXPECT_EQ(namesIn(fs, folder.path()), std::vector<std::string>{"Tessel.vcf"});
}

class FileSystemTest : public ::testing::Test {
 protected:
  FileSystem fs;
  TemporaryFolder folder;
};

TEST_F(FileSystemTest, ModificationDateIsExactAndStable) {
  const auto target = folder / "Tessel.vcf";
  ASSERT_EQ(fs.atomicWrite(target, bytesOf("BEGIN:VCARD")), std::nullopt);
  const auto written = fs.modificationDate(target);
  ASSERT_TRUE(written.has_value());
  EXPECT_EQ(written->timeZone(), TimeZone::gmt());
  EXPECT_EQ(fs.modificationDate(target), written);

  // Nanoseconds are kept: a stored date and a later read compare equal only if they are.
  const timespec times[2] = {{1700000000, 123456789}, {1700000000, 987654321}};
  ASSERT_EQ(::utimensat(AT_FDCWD, target.c_str(), times, 0), 0);
  const auto set = fs.modificationDate(target);
  ASSERT_TRUE(set.has_value());
  EXPECT_EQ(set->instant().time_since_epoch().count(), 1700000000);
  EXPECT_EQ(set->nanoseconds(), 987654321u);
  EXPECT_EQ(set->description(), "2023-11-14 22:13:20 +0000");
  EXPECT_FALSE(set->isSameInstant(*written));

  auto attributes = fs.attributes(target);
  ASSERT_TRUE(std::holds_alternative<FileAttributes>(attributes));
  const auto& read = std::get<FileAttributes>(attributes);
  EXPECT_EQ(read.type, FileType::Regular);
  EXPECT_EQ(read.size, 11u);
  EXPECT_EQ(read.modificationDate, set);
}

TEST_F(FileSystemTest, MissingFilesHaveNoDateAndAReason) {
  EXPECT_EQ(fs.modificationDate(folder / "absent.vcf"), std::nullopt);
  auto attributes = fs.attributes(folder / "absent.vcf");
  ASSERT_TRUE(std::holds_alternative<std::string>(attributes));
  const auto& reason = std::get<std::string>(attributes);
  EXPECT_NE(reason.find("absent.vcf"), std::string::npos) << reason;
  EXPECT_NE(reason.find("No such file or directory"), std::string::npos) << reason;
}

TEST_F(FileSystemTest, CreateDirectoryWithAndWithoutIntermediates) {
  const auto deep = folder / "a" / "b" / "c";
  EXPECT_TRUE(fs.createDirectory(deep, Intermediates::DoNotCreate).has_value());

  EXPECT_EQ(fs.createDirectory(deep, Intermediates::Create), std::nullopt);
  EXPECT_TRUE(fs.isDirectory(deep));
  // Already there: fine when intermediates are asked for, as with mkdir -p.
  EXPECT_EQ(fs.createDirectory(deep, Intermediates::Create), std::nullopt);

  const auto exists = fs.createDirectory(deep, Intermediates::DoNotCreate);
  ASSERT_TRUE(exists.has_value());
  EXPECT_NE(exists->find("File exists"), std::string::npos) << *exists;

  // Onto a regular file, or below one.
  writeFile(folder / "Contacts", "");

  const auto onto = fs.createDirectory(folder / "Contacts", Intermediates::Create);
  ASSERT_TRUE(onto.has_value());
  EXPECT_EQ(*onto, "Cannot create the folder " + (folder / "Contacts").string() + ": File exists");

  const auto below = fs.createDirectory(folder / "Contacts" / "x" / "y", Intermediates::Create);
  ASSERT_TRUE(below.has_value());
  EXPECT_EQ(*below, "Cannot create the folder " + (folder / "Contacts" / "x" / "y").string() +
                        ": Not a directory");
  EXPECT_TRUE(fs.isRegularFile(folder / "Contacts"));
}

TEST_F(FileSystemTest, ListingIsSortedAndRemovalTakesFoldersWithTheirContents) {
  std::filesystem::create_directories(folder / "Calendars" / "stray" / "deeper");
  writeFile(folder / "Calendars" / "stray" / "deeper" / "x.ics", "x");
  writeFile(folder / "Calendars" / "Tessel-Work.ics", "w");
  writeFile(folder / "Calendars" / "Tessel-Home.ics", "h");
  writeFile(folder / "Calendars" / ".hidden", "");
  EXPECT_EQ(namesIn(fs, folder / "Calendars"),
            (std::vector<std::string>{".hidden", "Tessel-Home.ics", "Tessel-Work.ics", "stray"}));

  EXPECT_EQ(fs.remove(folder / "Calendars" / "stray"), std::nullopt);
  EXPECT_EQ(fs.remove(folder / "Calendars" / "Tessel-Home.ics"), std::nullopt);
  EXPECT_EQ(namesIn(fs, folder / "Calendars"),
            (std::vector<std::string>{".hidden", "Tessel-Work.ics"}));

  auto missing = fs.contentsOfDirectory(folder / "absent");
  ASSERT_TRUE(std::holds_alternative<std::string>(missing));
  EXPECT_NE(std::get<std::string>(missing).find("absent"), std::string::npos);
  auto notAFolder = fs.contentsOfDirectory(folder / "Calendars" / "Tessel-Work.ics");
  EXPECT_TRUE(std::holds_alternative<std::string>(notAFolder));
}

TEST_F(FileSystemTest, StatisticsOfAMountedFolder) {
  const auto statistics = fs.statistics(folder.path());
  ASSERT_TRUE(statistics.has_value());
  EXPECT_GT(statistics->blockSize, 0u);
  EXPECT_GE(statistics->totalBlocks, statistics->freeBlocks);
  EXPECT_GE(statistics->freeBlocks, statistics->availableBlocks);
  EXPECT_TRUE(statistics->mountedFrom.has_value());
  EXPECT_EQ(fs.statistics(folder / "absent"), std::nullopt);
}

}  // namespace
}  // namespace zt::platform
