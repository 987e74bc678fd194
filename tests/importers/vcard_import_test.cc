// The vCard import on files shaped like real exports (tests/importers/data/vcard/): what each
// version's encodings become in records, refusal of malformed input, and re-imports.

#include "importers/vcard_import.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <map>
#include <string>
#include <vector>

#include "importers/import_error.h"
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
  for (const Record& record : records) {
    EXPECT_TRUE(map.emplace(record.id, record.record).second) << "twice: " << record.id;
  }
  return map;
}

std::map<std::string, Dictionary> importedText(const std::string& text) {
  VCardImport import;
  import.addText(text, "test.vcf");
  return byId(import.records());
}

std::string text(const Dictionary& record, std::string_view key) {
  const Value* value = record.find(key);
  if (value == nullptr) return "<absent>";
  if (const std::string* s = value->asString()) return *s;
  if (const zt::platform::Url* url = value->asUrl()) return "url:" + url->text;
  return "<" + std::string(value->typeName()) + ">";
}

std::vector<std::string> identifiers(const Dictionary& record, std::string_view key) {
  std::vector<std::string> ids;
  const Value* value = record.find(key);
  if (value == nullptr || value->asArray() == nullptr) return ids;
  for (const Value& element : *value->asArray()) ids.push_back(*element.asString());
  return ids;
}

const Dictionary& only(const std::map<std::string, Dictionary>& records, std::string_view entity) {
  const Dictionary* found = nullptr;
  for (const auto& [id, record] : records) {
    if (text(record, TesselRecordEntityNameKey) != entity) continue;
    EXPECT_EQ(found, nullptr) << "more than one " << entity;
    found = &record;
  }
  static const Dictionary kNone;
  return found != nullptr ? *found : kNone;
}

// --- What each version's cards become ---------------------------------------------------

// Each export read whole: every record as a typed JSON line, compared with golden/vcard/.
// What they pin: 2.1 quoted-printable with soft breaks, Latin-1 and an indented base64 photo;
// 3.0 folding and escapes, IMPP and X-JABBER naming one account once, a card without UID or
// N named from FN, a company card, CATEGORIES as groups linked both ways; 4.0 data: URI
// photos and tel: URIs; a vdir folder whose KIND:group card lists members by UID.
TEST(VCardImportContent, EachExportBecomesTheRecordsOfItsReferenceFile) {
  for (const char* source : {"outlook_21.vcf", "address_book_30.vcf", "server_40.vcf", "vdir"}) {
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

TEST(VCardImportContent, LineEndsAndFoldingVariants) {
  // LF alone, CR alone, and a tab as the fold's blank all read the same.
  const std::string card =
      "BEGIN:VCARD\nVERSION:3.0\nUID:x\nN:Doe;Jo\n\thn;;;\rNOTE:one\\, two\r\n  three\n"
      "END:VCARD";
  const auto records = importedText(card);
  const Dictionary& contact = records.at("vcard/uid:x");
  EXPECT_EQ(text(contact, "first name"), "John");
  EXPECT_EQ(text(contact, "notes"), "one, two three");
}

TEST(VCardImportContent, CharsetsAndByteOrderMarks) {
  // windows-1252 has the euro sign at 0x80; ISO-8859-1 has no such character.
  auto records = importedText(
      "BEGIN:VCARD\r\nVERSION:2.1\r\nN;CHARSET=windows-1252:Price;\x80uro\r\nEND:VCARD\r\n");
  EXPECT_EQ(text(only(records, TesselEntity_Contacts_Contact), "first name"), "\xE2\x82\xACuro");

  // Without CHARSET, bytes that are not UTF-8 are read as windows-1252.
  records = importedText("BEGIN:VCARD\r\nVERSION:2.1\r\nN:M\xFCller;Hans\r\nEND:VCARD\r\n");
  EXPECT_EQ(text(only(records, TesselEntity_Contacts_Contact), "last name"), "M\xC3\xBCller");

  // UTF-16 with a byte-order mark, as some address books save.
  std::string utf16 = "\xFE\xFF";
  for (char16_t c :
       std::u16string(u"BEGIN:VCARD\r\nVERSION:3.0\r\nN:Ng;\u00e9;;;\r\nEND:VCARD\r\n")) {
    utf16 += static_cast<char>(c >> 8);
    utf16 += static_cast<char>(c & 0xFF);
  }
  records = importedText(utf16);
  EXPECT_EQ(text(only(records, TesselEntity_Contacts_Contact), "last name"), "Ng");
  EXPECT_EQ(text(only(records, TesselEntity_Contacts_Contact), "first name"), "\xC3\xA9");
}

TEST(VCardImportContent, IdentifiersAreStableAndEscaped) {
  const std::string card =
      "BEGIN:VCARD\r\nVERSION:3.0\r\nUID:a/b%c\r\nN:Doe;Jane;;;\r\n"
      "TEL:1\r\nTEL:2\r\nEND:VCARD\r\n";
  const auto records = importedText(card);
  EXPECT_TRUE(records.contains("vcard/uid:a%2Fb%25c"));
  EXPECT_TRUE(records.contains("vcard/uid:a%2Fb%25c/tel/1"));

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

TEST(VCardImportMalformed, EachFaultNamesFileAndLine) {
  const struct {
    const char* file;
    std::size_t line;
    const char* reason;
  } cases[] = {
      {"no_end.vcf", 5, "card has no END:VCARD"},
      {"bad_base64.vcf", 4, "bad base64 in PHOTO"},
      {"unknown_charset.vcf", 3, "unknown charset \"KLINGON-8\" in N"},
  };
  for (const auto& c : cases) {
    const fs::path file = kData / "malformed" / c.file;
    VCardImport import;
    try {
      import.addPaths({kData / "vdir", file});
      ADD_FAILURE() << c.file << " was accepted";
    } catch (const ImportError& e) {
      EXPECT_EQ(e.source(), file.string());
      EXPECT_EQ(e.line(), c.line) << c.file;
      EXPECT_EQ(e.reason(), c.reason);
      EXPECT_EQ(std::string(e.what()),
                file.string() + ": line " + std::to_string(c.line) + ": " + c.reason);
    }
  }
}

TEST(VCardImportMalformed, OtherFaults) {
  const struct {
    std::string text;
    const char* reason;
  } cases[] = {
      {"FN:outside\r\n", "FN outside of a card (BEGIN:VCARD ... END:VCARD)"},
      {"BEGIN:VCARD\r\nN;CHARSET=UTF-8:\xFF\xFE;x\r\nEND:VCARD\r\n",
       "text is not valid UTF-8 in N"},
      {"BEGIN:VCARD\r\nPHOTO:data:image/png;base64\r\nEND:VCARD\r\n", "bad data: URI in PHOTO"},
      {"BEGIN:VCARD\r\nTEL;TYPE=\"home:1\r\nEND:VCARD\r\n",
       "parameter value without its closing quote"},
  };
  for (const auto& c : cases) {
    VCardImport import;
    try {
      import.addText(c.text, "x.vcf");
      ADD_FAILURE() << c.text << " was accepted";
    } catch (const ImportError& e) {
      EXPECT_EQ(e.reason(), c.reason) << c.text;
    }
  }
  // A missing file names itself, without a line.
  VCardImport import;
  try {
    import.addPaths({kData / "no-such.vcf"});
    ADD_FAILURE();
  } catch (const ImportError& e) {
    EXPECT_FALSE(e.line());
  }
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
  EXPECT_EQ(first.groups, 2u);
  EXPECT_EQ(first.files, 2u);
  EXPECT_EQ(first.written, store_->recordCount());
  EXPECT_EQ(first.deleted, 0u);
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
  const auto after = all();
  ASSERT_EQ(after.size(), before.size());
  for (const auto& [id, record] : before) {
    if (id == "vcard/uid:babbage-1791/tel/0") {
      EXPECT_EQ(text(after.at(id), "value"), "+44 20 7946 0199");
    } else {
      EXPECT_EQ(after.at(id), record) << id;
    }
  }
}

TEST_F(VCardImportStore, ARemovedPhoneIsDeletedWithoutSyncDeletes) {
  write("a.vcf", card("a", "Doe;Jane", "TEL:1\r\nTEL:2\r\n"));
  import();
  write("a.vcf", card("a", "Doe;Jane", "TEL:1\r\n"));
  const VCardImportSummary summary = import();
  EXPECT_EQ(summary.written, 1u);  // the contact's list of phones
  EXPECT_EQ(summary.deleted, 1u);
  EXPECT_FALSE(store_->record("vcard/uid:a/tel/1"));
  EXPECT_EQ(identifiers(*store_->record("vcard/uid:a"), "phone numbers"),
            (std::vector<std::string>{"vcard/uid:a/tel/0"}));
}

TEST_F(VCardImportStore, SyncDeletesRemovesWhatLeftTheSourceAndNothingElse) {
  store_->putRecords({testing::contact("hand-made", "Kept")});
  write("a.vcf", card("a", "Doe;Jane", "TEL:1\r\nCATEGORIES:Solo,Shared\r\n"));
  write("b.vcf", card("b", "Roe;Rick", "EMAIL:r@example.org\r\nCATEGORIES:Shared\r\n"));
  import();
  ASSERT_EQ(store_->recordCount(), 7u);

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
  EXPECT_EQ(store_->recordCount(), 4u);
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

TEST_F(VCardImportStore, AMalformedFileStopsTheImportBeforeAnyWrite) {
  write("a.vcf", card("a", "Doe;Jane", ""));
  import();
  const auto before = all();
  write("b.vcf", card("b", "Roe;Rick", ""));
  write("c.vcf", "BEGIN:VCARD\r\nN:Broken;\r\n");
  EXPECT_THROW(import(SyncDeletes::On), ImportError);
  EXPECT_EQ(all(), before);
}

}  // namespace
}  // namespace tessel::importers
