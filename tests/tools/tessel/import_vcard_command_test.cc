// `tessel import vcard` through the real binary, in a fresh folder per test.

#include <string>
#include <vector>

#include "tools/tessel/tessel_command_fixture.h"

namespace {

using namespace tessel::testing;

const fs::path kData = fs::path(ZT_TEST_DATA_DIR) / ".." / ".." / "importers" / "data" / "vcard";

class ImportVCardCommand : public TesselCommandTest {
 protected:
  void SetUp() override {
    TesselCommandTest::SetUp();
    source_ = dir_ / "source";
    fs::create_directories(source_);
    ASSERT_EQ(tessel({"init"}).status, 0);
  }
  fs::path source_;
};

TEST_F(ImportVCardCommand, ImportsFilesAndFoldersAndSaysWhat) {
  const Outcome run = tessel({"import", "vcard", (kData / "outlook_21.vcf").string(),
                              (kData / "address_book_30.vcf").string(),
                              (kData / "server_40.vcf").string(), (kData / "vdir").string()});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_EQ(run.out, "8 contacts, 4 groups from 6 files; 43 written, 0 deleted\n");
  const std::string first = listJson();
  EXPECT_NE(first.find(R"("first name":"Zoë","last name":"Ørsted")"), std::string::npos);
  EXPECT_NE(first.find(R"("name":"Bletchley","members":["vcard/uid:vdir-a","vcard/uid:vdir-b"])"),
            std::string::npos);

  // Again: the same records, nothing written.
  const Outcome again = tessel({"import", "vcard", (kData / "vdir").string()});
  ASSERT_EQ(again.status, 0) << again.err;
  EXPECT_EQ(again.out, "2 contacts, 1 group from 3 files; 0 written, 0 deleted\n");
  EXPECT_EQ(listJson(), first);
}

TEST_F(ImportVCardCommand, SyncDeletesRemovesContactsThatLeftTheSource) {
  fs::copy_file(kData / "vdir" / "a1.vcf", source_ / "a1.vcf");
  fs::copy_file(kData / "vdir" / "b2.vcf", source_ / "b2.vcf");
  ASSERT_EQ(tessel({"import", "vcard", source_.string()}).status, 0);
  fs::remove(source_ / "a1.vcf");
  const Outcome run = tessel({"import", "vcard", "--sync-deletes", source_.string()});
  ASSERT_EQ(run.status, 0) << run.err;
  EXPECT_EQ(run.out, "1 contact, 0 groups from 1 file; 0 written, 2 deleted\n");
  EXPECT_EQ(listJson().find("vdir-a"), std::string::npos);
}

TEST_F(ImportVCardCommand, MalformedFileFailsWithFileAndLineAndImportsNothing) {
  ASSERT_EQ(tessel({"import", "vcard", (kData / "vdir").string()}).status, 0);
  const std::string before = listJson();
  const fs::path bad = kData / "malformed" / "bad_qp.vcf";
  const Outcome run = tessel(
      {"import", "vcard", "--sync-deletes", (kData / "server_40.vcf").string(), bad.string()});
  EXPECT_EQ(run.status, 1);
  EXPECT_EQ(run.err, "tessel: " + bad.string() + ": line 4: bad quoted-printable in NOTE\n");
  EXPECT_EQ(run.out, "");
  EXPECT_EQ(listJson(), before);

  const Outcome missing = tessel({"import", "vcard", (dir_ / "nowhere.vcf").string()});
  EXPECT_EQ(missing.status, 1);
  EXPECT_NE(missing.err.find("nowhere.vcf: cannot read"), std::string::npos) << missing.err;
}

TEST_F(ImportVCardCommand, UsageErrors) {
  EXPECT_EQ(tessel({"import", "vcard"}).status, 2);
  EXPECT_EQ(tessel({"import", "vcard", "--no-such-flag", "x.vcf"}).status, 2);
}

}  // namespace
