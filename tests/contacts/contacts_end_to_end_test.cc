// The real programs on a virtual player: `tessel` fills the store and registers the client,
// `zetosynctool` syncs, as the desktop application would run them.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <string>
#include <vector>

#include "contacts/contacts_sync_fixture.h"
#include "sync/synctool_fixture.h"

namespace zt::contacts::testing {
namespace {

namespace fs = std::filesystem;

class ContactsEndToEnd : public sync::test_support::SynctoolTest {
 protected:
  int tessel(const std::vector<std::string>& arguments) { return runTessel(arguments).exitStatus; }
};

TEST_F(ContactsEndToEnd, AVirtualPlayerReceivesTheCardsAndASecondRunLeavesThemUntouched) {
  const fs::path records = fs::path(ZT_TEST_DATA_DIR) / "data" / "every_line.jsonl";
  ASSERT_EQ(tessel({"records", "put", records.string()}), 0);
  ASSERT_EQ(tessel({"client", "register", std::string(kClientID), "--contacts"}), 0);

  const sync::test_support::SynctoolRun first = syncClient(kClientID);
  ASSERT_EQ(first.exitStatus, 0) << first.standardError;
  EXPECT_EQ(first.finalStatus(), 0);
  const fs::path vcf = volume() / "Contacts" / "Tessel.vcf";
  EXPECT_TRUE(zt::test_support::sameLines(
      readFile(fs::path(ZT_TEST_DATA_DIR) / "data" / "every_line.vcf"), cardsOf(readFile(vcf))));

  struct stat before {};
  ASSERT_EQ(::stat(vcf.c_str(), &before), 0);
  const sync::test_support::SynctoolRun second = syncClient(kClientID);
  EXPECT_EQ(second.finalStatus(), 0);
  EXPECT_TRUE(second.logged("Nothing to push for contacts...")) << second.log;
  struct stat after {};
  ASSERT_EQ(::stat(vcf.c_str(), &after), 0);
  EXPECT_EQ(after.st_ino, before.st_ino);
  EXPECT_EQ(after.st_mtim.tv_sec, before.st_mtim.tv_sec);
  EXPECT_EQ(after.st_mtim.tv_nsec, before.st_mtim.tv_nsec);
}

}  // namespace
}  // namespace zt::contacts::testing
