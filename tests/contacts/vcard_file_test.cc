// The contacts file as the player receives it: no photo for a player that refuses them, the
// byte-order mark and UTF-16BE form, and an empty file without contacts.
#include <gtest/gtest.h>

#include <string>

#include "contacts/contacts_sync_fixture.h"

namespace zt::contacts::testing {
namespace {

using VCardFile = ContactsSyncTest;

// The golden sample sync pins the cards of a player that takes photos.
TEST_F(VCardFile, NoPhotoWhenThePlayerRefusesThem) {
  put(dataFile("photo.jsonl"));
  ASSERT_EQ(sync(PlayerPhotos::Refused).lastStatus, 0);
  EXPECT_EQ(fileText().find("PHOTO"), std::string::npos);
  EXPECT_NE(fileText().find("NOTE:has a photo\r\nTEL;type=WORK:555-0200\r\n"), std::string::npos);
}

TEST_F(VCardFile, OneByteOrderMarkThenBigEndianUnitsWithSurrogatePairs) {
  put(R"({"id": "c1", "record": {"tessel.record.entity": "tessel.contacts.Contact", "first name": "😀"}}
{"id": "c2", "record": {"tessel.record.entity": "tessel.contacts.Contact", "first name": "B"}})");
  ASSERT_EQ(sync().lastStatus, 0);
  const std::string bytes = fileBytes();
  ASSERT_GE(bytes.size(), 4u);
  EXPECT_EQ(bytes.substr(0, 4), std::string("\xFE\xFF\0B", 4));  // FE FF, then "B" of BEGIN
  // U+1F600 is the pair D83D DE00.
  EXPECT_NE(bytes.find(std::string("\0N\0:\0;\xD8\x3D\xDE\x00\0;", 12)), std::string::npos);
  // The second card follows the first at once, without a mark of its own.
  EXPECT_EQ(bytes.find("\xFE\xFF", 2), std::string::npos);
  EXPECT_EQ(fileText(),
            "BEGIN:VCARD\r\nVERSION:3.0\r\nN:;😀;;;\r\nEND:VCARD\r\n"
            "BEGIN:VCARD\r\nVERSION:3.0\r\nN:;B;;;\r\nEND:VCARD\r\n");
}

TEST_F(VCardFile, NoContactGivesAnEmptyFileAndStillRemembersIt) {
  put(R"({"id": "g1", "record": {"tessel.record.entity": "tessel.contacts.Group", "name": "Nobody"}})");
  const SyncOutcome outcome = sync();
  ASSERT_EQ(outcome.lastStatus, 0);
  EXPECT_TRUE(outcome.logged("Truth contains 0l contacts"));
  EXPECT_EQ(fileBytes(), "");
  EXPECT_TRUE(std::filesystem::exists(vcfPath()));
  EXPECT_TRUE(client()->setting("LastModDateForVCF"));
  EXPECT_TRUE(client()->setting("DidSyncContactImages"));
}

}  // namespace
}  // namespace zt::contacts::testing
