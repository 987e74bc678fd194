#include "platform/folder_handle.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <tuple>
#include <vector>

#include "platform/atomic_file.h"
#include "platform/calendar_date.h"
#include "support/files.h"
#include "support/temporary_folder.h"

namespace zt::platform {
namespace {

using zt::test_support::TemporaryFolder;
namespace fs = std::filesystem;

std::vector<std::uint8_t> bytesOf(std::string_view text) {
  return std::vector<std::uint8_t>(text.begin(), text.end());
}

using zt::test_support::namesIn;
using zt::test_support::writeFile;
std::string contentsOf(const fs::path& path) {
  return zt::test_support::readFile(path);
}

FolderHandle openFolder(const fs::path& path) {
  auto opened = FolderHandle::open(path);
  if (!opened) ADD_FAILURE() << opened.error();
  return std::move(opened).value();
}

class AtomicWriteTest : public ::testing::Test {
 protected:
  TemporaryFolder folder;
  FolderHandle handle = openFolder(folder.path());
};

TEST_F(AtomicWriteTest, ReplacesWholeFilesOfAnySizeWithTheUsualPermissions) {
  std::vector<std::uint8_t> big(9 * 1024 * 1024 + 17);
  for (std::size_t i = 0; i < big.size(); ++i) big[i] = static_cast<std::uint8_t>(i * 31 + 7);
  const mode_t previous = ::umask(022);
  ASSERT_TRUE((handle.atomicWrite("Tessel.vcf", big)).ok());
  ::umask(previous);
  EXPECT_EQ(contentsOf(folder / "Tessel.vcf"), std::string(big.begin(), big.end()));
  struct stat info {};
  ASSERT_EQ(::stat((folder / "Tessel.vcf").c_str(), &info), 0);
  EXPECT_EQ(info.st_mode & 0777, 0644u);
  // An empty buffer still gives a file, an empty one.
  ASSERT_TRUE((handle.atomicWrite("Tessel.vcf", {})).ok());
  EXPECT_EQ(contentsOf(folder / "Tessel.vcf"), "");
  EXPECT_EQ(namesIn(folder.path()), std::vector<std::string>{"Tessel.vcf"});
}

TEST_F(AtomicWriteTest, NamesAtTheLengthLimitStillWork) {
  // Shortening the temporary name never cuts a UTF-8 character in half.
  std::string wide = "Tessel-";
  while (wide.size() < 248) wide += "\xC3\xA9";  // é
  ASSERT_TRUE((handle.atomicWrite(wide, bytesOf("y"))).ok());
  EXPECT_EQ(namesIn(folder.path()), std::vector<std::string>{wide});
}

TEST_F(AtomicWriteTest, AFailedRenameKeepsTheTargetAndRemovesTheTemporaryFile) {
  // A folder in the target's place: the content is written, then the rename fails.
  fs::create_directory(folder / "Calendars");
  writeFile(folder / "Calendars" / "inside.ics", "kept");
  const auto written = handle.atomicWrite("Calendars", bytesOf("new content"));
  ASSERT_FALSE(written.ok());
  EXPECT_CONTAINS(written.error(), (folder / "Calendars").string());
  EXPECT_EQ(contentsOf(folder / "Calendars" / "inside.ics"), "kept");
  EXPECT_EQ(namesIn(folder.path()), std::vector<std::string>{"Calendars"});
}

TEST_F(AtomicWriteTest, AnAtomicFileThatIsNotCommittedChangesNothing) {
  writeFile(folder / "Tessel.vcf", "old");
  {
    auto created = AtomicFile::create(handle, "Tessel.vcf");
    AtomicFile file = std::move(created).value();
    ASSERT_TRUE((file.write(bytesOf("half of the new"))).ok());
    EXPECT_EQ(file.temporaryPath().parent_path(), folder.path());
  }
  EXPECT_EQ(contentsOf(folder / "Tessel.vcf"), "old");
  EXPECT_EQ(namesIn(folder.path()), std::vector<std::string>{"Tessel.vcf"});
}

TEST_F(AtomicWriteTest, OnlyStaleTemporariesOfTheNamedFileAreRemoved) {
  const fs::path outside = folder / "outside";
  fs::create_directory(outside);
  const FolderHandle contacts = handle.openChild("Contacts", IfMissing::Create).value();
  const fs::path in = folder / "Contacts";
  for (const char* name :
       {".Tessel.vcf.tmpAbc123", ".Tessel.vcf.tmpZZZZZZ", ".Tessel.vcf.tmp", ".Tessel.vcf.tmpAbc12",
        ".Tessel.vcf.tmpAbc1234", ".Tessel.vcf.tmpAb-123", ".Other.vcf.tmpAbc123", "Tessel.vcf"})
    writeFile(in / name, "x");
  fs::create_directory(in / ".Tessel.vcf.tmpDir123");
  writeFile(outside / "kept", "x");
  fs::create_directory_symlink(outside, in / ".Tessel.vcf.tmpLnk123");

  ASSERT_TRUE((contacts.removeStaleTemporaries("Tessel.vcf")).ok());
  EXPECT_EQ(namesIn(in), (std::vector<std::string>{
                             ".Other.vcf.tmpAbc123", ".Tessel.vcf.tmp", ".Tessel.vcf.tmpAb-123",
                             ".Tessel.vcf.tmpAbc12", ".Tessel.vcf.tmpAbc1234",
                             ".Tessel.vcf.tmpDir123", ".Tessel.vcf.tmpLnk123", "Tessel.vcf"}));
  EXPECT_EQ(namesIn(outside), std::vector<std::string>{"kept"});
}

class FolderHandleTest : public ::testing::Test {
 protected:
  TemporaryFolder folder;
  FolderHandle handle = openFolder(folder.path());
};

// Nanoseconds are kept: a stored date and a later read compare equal only if they are.
TEST_F(FolderHandleTest, ModificationDateIsExact) {
  writeFile(folder / "Tessel.vcf", "BEGIN:VCARD");
  const timespec times[2] = {{1700000000, 123456789}, {1700000000, 987654321}};
  ASSERT_EQ(::utimensat(AT_FDCWD, (folder / "Tessel.vcf").c_str(), times, 0), 0);
  auto attributes = handle.attributes("Tessel.vcf");
  ASSERT_TRUE(attributes.ok());
  const FileAttributes& read = *attributes;
  EXPECT_EQ(read.type, FileType::Regular);
  EXPECT_EQ(read.size, 11u);
  EXPECT_EQ(read.modificationDate,
            CalendarDate(std::chrono::sys_seconds(std::chrono::seconds(1700000000)),
                         TimeZone::gmt(), 987654321));
}

TEST_F(FolderHandleTest, ChildFoldersAreOpenedOrCreatedButNeverThroughALink) {
  const fs::path outside = folder / "outside";
  fs::create_directory(outside);
  writeFile(folder / "File", "a file, not a folder");
  fs::create_directory_symlink(outside, folder / "Link");
  fs::create_symlink(folder / "absent", folder / "Dangling");

  auto created = handle.openChild("Contacts", IfMissing::Create);
  ASSERT_TRUE(created.ok()) << created.error();
  EXPECT_EQ(created->path(), folder / "Contacts");
  EXPECT_TRUE(fs::is_directory(folder / "Contacts"));
  EXPECT_TRUE(handle.openChild("Contacts", IfMissing::Fail).ok());

  const std::tuple<std::string, IfMissing, std::string> refused[] = {
      {"Absent", IfMissing::Fail, "No such file or directory"},
      {"File", IfMissing::Create, "Not a directory"},
      // O_NOFOLLOW with O_DIRECTORY: a link is not a folder (open(2)).
      {"Link", IfMissing::Create, "Not a directory"},
      {"Dangling", IfMissing::Create, "Not a directory"},
  };
  for (const auto& [name, ifMissing, reason] : refused) {
    SCOPED_TRACE(name);
    auto opened = handle.openChild(name, ifMissing);
    ASSERT_FALSE(opened.ok());
    EXPECT_EQ(opened.error(), "Cannot open the folder " + (folder / name).string() + ": " + reason);
  }
  EXPECT_TRUE(namesIn(outside).empty());
  EXPECT_FALSE(fs::exists(folder / "absent"));
}

TEST_F(FolderHandleTest, RemovalTakesFoldersWholeAndLinksAsLinks) {
  // Files outside the folder that links inside it lead to.
  const fs::path outside = folder / "outside";
  fs::create_directories(outside / "sub");
  writeFile(outside / "mine.ics", "x");
  writeFile(outside / "sub" / "deeper.ics", "x");
  fs::create_directory(folder / "Calendars");
  const FolderHandle calendars = handle.openChild("Calendars", IfMissing::Fail).value();
  const fs::path in = folder / "Calendars";
  fs::create_directories(in / "stray" / "deeper");
  writeFile(in / "stray" / "deeper" / "x.ics", "x");
  fs::create_directory_symlink(outside, in / "stray" / "deeper" / "away");
  fs::create_symlink(outside / "mine.ics", in / "stray" / "file-link");
  fs::create_directory_symlink(outside, in / "linked");
  writeFile(in / "Tessel-Work.ics", "w");
  writeFile(in / ".hidden", "");

  auto listing = calendars.entries();
  ASSERT_TRUE(listing.ok());
  EXPECT_EQ(*listing, (std::vector<std::string>{".hidden", "Tessel-Work.ics", "linked", "stray"}));

  for (const char* name : {"linked", "stray", "Tessel-Work.ics"})
    EXPECT_TRUE((calendars.remove(name)).ok()) << name;
  EXPECT_EQ(namesIn(in), std::vector<std::string>{".hidden"});
  EXPECT_EQ(namesIn(outside), (std::vector<std::string>{"mine.ics", "sub"}));
  EXPECT_EQ(namesIn(outside / "sub"), std::vector<std::string>{"deeper.ics"});
}

TEST_F(FolderHandleTest, AFolderSwappedForALinkAfterOpeningCannotRedirectTheHandle) {
  const fs::path outside = folder / "outside";
  fs::create_directory(outside);
  const FolderHandle calendars = handle.openChild("Calendars", IfMissing::Create).value();
  writeFile(folder / "Calendars" / "old.ics", "old");
  fs::rename(folder / "Calendars", folder / "moved");
  fs::create_directory_symlink(outside, folder / "Calendars");
  writeFile(outside / "theirs.ics", "theirs");

  ASSERT_TRUE((calendars.atomicWrite("Tessel-Home.ics", bytesOf("home"))).ok());
  auto listing = calendars.entries();
  ASSERT_TRUE(listing.ok());
  EXPECT_EQ(*listing, (std::vector<std::string>{"Tessel-Home.ics", "old.ics"}));
  EXPECT_TRUE((calendars.remove("old.ics")).ok());
  EXPECT_FALSE(calendars.remove("theirs.ics").ok());

  EXPECT_EQ(namesIn(folder / "moved"), std::vector<std::string>{"Tessel-Home.ics"});
  EXPECT_EQ(contentsOf(folder / "moved" / "Tessel-Home.ics"), "home");
  EXPECT_EQ(namesIn(outside), std::vector<std::string>{"theirs.ics"});
}

}  // namespace
}  // namespace zt::platform
