// The vCard import on files shaped like real exports (tests/importers/data/vcard/): what each
// version's encodings become in records, refusal of malformed input, and re-imports.

#include "importers/vcard_import.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <map>
#include <string>
#include <vector>

#include "importers/import_error.h"
#include "importers/malformed_report.h"
#include "support/files.h"
#include "tessel/record_json.h"
#include "tessel/schema.h"
#include "tessel/test_store.h"

namespace tessel::importers {
namespace {

using zt::platform::Array;
using zt::platform::Dictionary;
using zt::platform::Value;

namespace fs = std::filesystem;

const fs::path kData = fs::path(ZT_TEST_DATA_DIR) / "data" / "vcard";

std::map<std::string, Dictionary> byId(const std::vector<Record>& records) {
  std::map<std::string, Dictionary> map;
  for (const Record& record : records)
    EXPECT_TRUE(map.emplace(record.id, record.record).second) << "twice: " << record.id;
  return map;
}

std::map<std::string, Dictionary> importedText(const std::string& text) {
  VCardImport import;
  import.addText(text, "test.vcf");
  return byId(import.records());
}

std::vector<std::string> identifiers(const Dictionary& record, std::string_view key) {
  return zt::platform::stringsIn(record.find(key));
}

// --- What each version's cards become ---------------------------------------------------

// Each export read whole: every record as a typed JSON line, compared with golden/vcard/.
// What they pin: 2.1 quoted-printable with soft breaks, Latin-1 and an indented base64 photo;
// 3.0 folding and escapes, IMPP and X-JABBER naming one account once, a card without UID or
// N named from FN, a company card, CATEGORIES as groups linked both ways; 4.0 data: URI
// photos and tel: URIs; a vdir folder whose KIND:group card lists members by UID; and edges/:
// LF or CR alone and a tab as the fold's blank, windows-1252, UTF-16 with a byte-order mark,
// identifiers escaped, 2.1 backslashes that only escape ";" ("C:\Users\new" stays), and a
// data: URI photo whose comma is escaped as in text, and one labelled ENCODING=b as well.
TEST(VCardImportContent, EachExportBecomesTheRecordsOfItsReferenceFile) {
  for (const char* source :
       {"outlook_21.vcf", "address_book_30.vcf", "server_40.vcf", "vdir", "edges"}) {
    SCOPED_TRACE(source);
    VCardImport import;
    import.addPaths({kData / source});
    std::string lines;
    for (const auto& [id, record] : byId(import.records()))
      lines += recordToJsonLine(id, record) + "\n";
    EXPECT_TRUE(zt::test_support::matchesGoldenFile(
        fs::path(ZT_TEST_DATA_DIR) / "golden" / "vcard" / (std::string(source) + ".jsonl"), lines));
  }
  VCardImport vdir;
  vdir.addPaths({kData / "vdir"});
  EXPECT_EQ(vdir.fileCount(), 3u);  // readme.txt is not a card
  EXPECT_EQ(vdir.contactCount(), 2u);
  EXPECT_EQ(vdir.groupCount(), 1u);
}

TEST(VCardImportContent, IdentifiersWithoutUidAreStable) {
  // Without UID, the identifier follows the name and first phone: the same card twice is
  // one contact, and a different phone is another one.
  const std::string noUid = "BEGIN:VCARD\r\nVERSION:3.0\r\nN:Doe;Jane;;;\r\nTEL:1\r\nEND:VCARD\r\n";
  VCardImport twice;
  twice.addText(noUid, "a.vcf");
  twice.addText(noUid, "b.vcf");
  EXPECT_EQ(twice.contactCount(), 1u);
  EXPECT_EQ(importedText(noUid), importedText(noUid));
  const auto other = importedText(
      "BEGIN:VCARD\r\nVERSION:3.0\r\nN:Doe;Jane;;;\r\nTEL:2\r\n"
      "END:VCARD\r\n");
  EXPECT_NE(importedText(noUid).begin()->first, other.begin()->first);
}

// --- Malformed input -------------------------------------------------------------------

// Every file of malformed/, after a good folder: with OnFault::Refuse, refused with its file,
// line and reason; with OnFault::Skip, what is kept and each warning. Compared with
// golden/vcard/malformed.txt.
TEST(VCardImportMalformed, EachFaultCostsWhatCannotBeReadOrWithRefuseEverything) {
  const std::string faults = malformedReport(
      kData / "malformed", kData / "vdir",
      [](const ImportPaths& paths) {
        VCardImport import;
        import.addPaths(paths);
      },
      [](const ImportPaths& paths, ImportWarnings& warnings) {
        VCardImport lenient(warnings);
        lenient.addPaths(paths);
        return std::to_string(lenient.contactCount()) + " contacts";
      });
  EXPECT_TRUE(zt::test_support::matchesGoldenFile(
      fs::path(ZT_TEST_DATA_DIR) / "golden" / "vcard" / "malformed.txt", faults));
  VCardImport import;
  EXPECT_THROW(import.addPaths({kData / "no-such.vcf"}), ImportError);
}

// --- Writing into the store --------------------------------------------------------------

class VCardImportStore : public testing::StoreTest {
 protected:
  void SetUp() override {
    StoreTest::SetUp();
    source_ = folder_ / "source";
    fs::create_directories(source_);
  }

  void write(const std::string& name, const std::string& content) {
    std::ofstream(source_ / name, std::ios::binary) << content;
  }

  VCardImportSummary import(SyncDeletes syncDeletes = SyncDeletes::Off) {
    VCardImport import;
    import.addPaths({source_});
    return import.writeTo(*store_, syncDeletes);
  }

  std::map<std::string, Dictionary> all() const {
    std::map<std::string, Dictionary> records;
    store_->forEachRecord([&](const Record& record) { records[record.id] = record.record; });
    return records;
  }

  fs::path source_;
};

std::string card(const std::string& uid, const std::string& name, const std::string& more) {
  return "BEGIN:VCARD\r\nVERSION:3.0\r\nUID:" + uid + "\r\nN:" + name + ";;;;\r\n" + more +
         "END:VCARD\r\n";
}

TEST_F(VCardImportStore, ReimportModifiesOnlyWhatChanged) {
  fs::copy_file(kData / "address_book_30.vcf", source_ / "book.vcf");
  fs::copy_file(kData / "server_40.vcf", source_ / "server.vcf");
  const VCardImportSummary first = import();
  EXPECT_EQ(first.contacts, 5u);
  EXPECT_EQ(first.written, store_->recordCount());
  const auto before = all();
  const std::int64_t generation = store_->generation();

  // The same files again: nothing written, no duplicates.
  const VCardImportSummary again = import();
  EXPECT_EQ(again.written, 0u);
  EXPECT_EQ(store_->generation(), generation);
  EXPECT_EQ(all(), before);

  // Babbage's phone changes: one record is written, the rest stay as they are.
  std::ifstream in(source_ / "book.vcf", std::ios::binary);
  std::string book((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
  book.replace(book.find("+44 20 7946 0100"), 16, "+44 20 7946 0199");
  write("book.vcf", book);
  EXPECT_EQ(import().written, 1u);
  EXPECT_EQ(store_->generation(), generation + 1);
  auto expected = before;
  expected.at("vcard/uid:babbage-1791/tel/0").set("value", Value("+44 20 7946 0199"));
  EXPECT_EQ(all(), expected);
}

TEST_F(VCardImportStore, SyncDeletesRemovesWhatLeftTheSourceAndNothingElse) {
  store_->putRecords({testing::contact("hand-made", "Kept")});
  write("a.vcf", card("a", "Doe;Jane", "TEL:1\r\nCATEGORIES:Solo,Shared\r\n"));
  write("b.vcf", card("b", "Roe;Rick", "EMAIL:r@example.org\r\nCATEGORIES:Shared\r\n"));
  import();
  ASSERT_EQ(store_->recordCount(), 7u);

  // A removed phone is deleted even without --sync-deletes.
  write("b.vcf", card("b", "Roe;Rick", "CATEGORIES:Shared\r\n"));
  EXPECT_EQ(import().deleted, 1u);
  EXPECT_FALSE(store_->record("vcard/uid:b/email/0"));
  EXPECT_FALSE(store_->record("vcard/uid:b")->contains("email addresses"));

  fs::remove(source_ / "a.vcf");
  // Without --sync-deletes the card's records stay, and the groups keep it.
  EXPECT_EQ(import().deleted, 0u);
  EXPECT_EQ(identifiers(*store_->record("vcard-group/Shared"), "members"),
            (std::vector<std::string>{"vcard/uid:a", "vcard/uid:b"}));

  const VCardImportSummary summary = import(SyncDeletes::On);
  EXPECT_EQ(summary.deleted, 3u);  // contact a, its phone, the group only a was in
  EXPECT_FALSE(store_->record("vcard/uid:a"));
  EXPECT_FALSE(store_->record("vcard/uid:a/tel/0"));
  EXPECT_FALSE(store_->record("vcard-group/Solo"));
  EXPECT_EQ(identifiers(*store_->record("vcard-group/Shared"), "members"),
            (std::vector<std::string>{"vcard/uid:b"}));
  EXPECT_TRUE(store_->record("hand-made"));
  EXPECT_EQ(store_->recordCount(), 3u);
}

TEST_F(VCardImportStore, GroupsGatherMembersAcrossImportsAndLoseThoseThatLeftThem) {
  write("a.vcf", card("a", "Doe;Jane", "CATEGORIES:Friends\r\n"));
  import();
  fs::remove(source_ / "a.vcf");
  write("b.vcf", card("b", "Roe;Rick", "CATEGORIES:Friends\r\n"));
  import();
  EXPECT_EQ(identifiers(*store_->record("vcard-group/Friends"), "members"),
            (std::vector<std::string>{"vcard/uid:a", "vcard/uid:b"}));

  // b leaves the group: the group, though no card of this import names it, drops b.
  write("b.vcf", card("b", "Roe;Rick", ""));
  import();
  EXPECT_EQ(identifiers(*store_->record("vcard-group/Friends"), "members"),
            (std::vector<std::string>{"vcard/uid:a"}));
  EXPECT_FALSE(store_->record("vcard/uid:b")->contains("parent groups"));
}

}  // namespace
}  // namespace tessel::importers
