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
#include "platform/base64.h"
#include "tessel/schema.h"
#include "tessel/test_store.h"

namespace tessel::importers {
namespace {

using zt::platform::Array;
using zt::platform::Data;
using zt::platform::Dictionary;
using zt::platform::Value;

namespace fs = std::filesystem;

const fs::path kData = fs::path(ZT_TEST_DATA_DIR) / "data" / "vcard";

constexpr const char* kAda = "vcard/uid:6B29FC40-CA47-1067-B31D-00DD010662DA";
constexpr const char* kZoe = "vcard/uid:urn:uuid:4fbe8971-0bc3-424c-9c26-36c3e1eff6b1";

std::map<std::string, Dictionary> byId(const std::vector<Record>& records) {
  std::map<std::string, Dictionary> map;
  for (const Record& record : records) {
    EXPECT_TRUE(map.emplace(record.id, record.record).second) << "twice: " << record.id;
  }
  return map;
}

std::map<std::string, Dictionary> importedRecords(const std::vector<fs::path>& paths) {
  VCardImport import;
  import.addPaths(paths);
  return byId(import.records());
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

// "value (type)" of each related record the contact lists under `relationship`.
std::vector<std::string> related(const std::map<std::string, Dictionary>& records,
                                 const Dictionary& contact, std::string_view relationship,
                                 std::string_view valueKey) {
  std::vector<std::string> lines;
  for (const std::string& id : identifiers(contact, relationship)) {
    const auto found = records.find(id);
    if (found == records.end()) {
      lines.push_back("missing " + id);
      continue;
    }
    std::string line = text(found->second, valueKey);
    if (found->second.contains("type")) line += " (" + text(found->second, "type") + ")";
    if (found->second.contains(TesselAttribute_Contacts_IM_Service)) {
      line += " " + text(found->second, TesselAttribute_Contacts_IM_Service);
    }
    lines.push_back(line);
  }
  return lines;
}

Data imageOf(const Dictionary& contact) {
  const Value* image = contact.find(TesselAttribute_Contacts_Contact_Image);
  return image != nullptr && image->asData() != nullptr ? *image->asData() : Data{};
}

// The JPEG-shaped photo both the 2.1 and the 3.0 file carry.
Data samplePhoto() {
  Data bytes = {0xFF, 0xD8, 0xFF, 0xE0, 0x00, 0x10, 'J',  'F',  'I',  'F',
                0x00, 0x01, 0x01, 0x00, 0x00, 0x01, 0x00, 0x01, 0x00, 0x00};
  for (int round = 0; round < 2; ++round) {
    for (int b = 0; b < 256; ++b) bytes.push_back(static_cast<std::uint8_t>(b));
  }
  bytes.push_back(0xFF);
  bytes.push_back(0xD9);
  return bytes;
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

TEST(VCardImportContent, Version21QuotedPrintableWithSoftBreaksLatin1AndPhoto) {
  const auto records = importedRecords({kData / "outlook_21.vcf"});
  const Dictionary& contact = only(records, TesselEntity_Contacts_Contact);
  EXPECT_EQ(text(contact, "first name"), "J\xC3\xBCrgen");
  EXPECT_EQ(text(contact, "last name"), "M\xC3\xBCller");
  EXPECT_EQ(text(contact, "company name"), "Br\xC3\xA4u AG");
  // The soft break joins the two lines without a trace; =0D=0A is one line end.
  EXPECT_EQ(text(contact, "notes"),
            "Erste Zeile\nZweite Zeile mit einem sehr langen Text, der umgebrochen wurde "
            "\xC3\xA4\xC3\xB6\xC3\xBC");
  EXPECT_EQ(related(records, contact, "phone numbers", "value"),
            (std::vector<std::string>{"+49 89 1234-0 (work)", "+49 89 555 01 (home fax)",
                                      "+49 170 1234567 (mobile)", "+49 89 999 (pager)"}));
  EXPECT_EQ(related(records, contact, "email addresses", "value"),
            (std::vector<std::string>{"juergen.mueller@example.de"}));

  const std::vector<std::string> addresses = identifiers(contact, "street addresses");
  ASSERT_EQ(addresses.size(), 1u);
  const Dictionary& address = records.at(addresses[0]);
  EXPECT_EQ(text(address, "street"),
            "Hauptstra\xC3\x9F"
            "e 1\nHinterhaus");
  EXPECT_EQ(text(address, "city"), "M\xC3\xBCnchen");
  EXPECT_EQ(text(address, "type"), "work");

  // The base64 lines are indented and end with a blank line, as vCard 2.1 writes them.
  EXPECT_EQ(imageOf(contact), samplePhoto());
  const Dictionary& group = only(records, TesselEntity_Contacts_Group);
  EXPECT_EQ(text(group, "name"),
            "Gesch\xC3\xA4"
            "ftlich");
}

TEST(VCardImportContent, Version30SeveralCardsFoldedEscapedWithIMsAndPhoto) {
  const auto records = importedRecords({kData / "address_book_30.vcf"});
  ASSERT_TRUE(records.contains(kAda));
  const Dictionary& ada = records.at(kAda);
  EXPECT_EQ(text(ada, "first name"), "Ada");
  EXPECT_EQ(text(ada, "last name"), "Lovelace");
  EXPECT_EQ(text(ada, "nickname"), "Ada, The Enchantress");
  EXPECT_EQ(text(ada, "phonetic first name"), "Ay-da");
  // An escaped comma stays in the company; further units make the department.
  EXPECT_EQ(text(ada, "company name"), "Analytical Engines, Ltd.");
  EXPECT_EQ(text(ada, "department"), "Research, Notes");
  // The note is folded over several lines, with \n, \; and \, inside.
  const std::string sentence =
      "Wrote the first program\nfor the Analytical Engine; see notes G, and others. ";
  EXPECT_EQ(text(ada, "notes"), sentence + sentence + sentence.substr(0, sentence.size() - 1));
  EXPECT_EQ(imageOf(ada), samplePhoto());

  EXPECT_EQ(related(records, ada, "phone numbers", "value"),
            (std::vector<std::string>{"+44 20 7946 0001 (mobile)", "+44 20 7946 0002 (work fax)",
                                      "+44 20 7946 0000 (main)", "+44 7700 900123 (mobile)"}));
  EXPECT_EQ(
      related(records, ada, "email addresses", "value"),
      (std::vector<std::string>{"ada@example.org (home)", "countess@engines.example (work)"}));
  // IMPP and X-JABBER name the same account once.
  EXPECT_EQ(related(records, ada, "instant messaging", "user"),
            (std::vector<std::string>{"ada@jabber.example (home) Jabber", "AdaAIM (work) AIM",
                                      "ada.lovelace (home) Skype"}));
  const std::vector<std::string> addresses = identifiers(ada, "street addresses");
  ASSERT_EQ(addresses.size(), 1u);
  EXPECT_EQ(text(records.at(addresses[0]), "street"), "12 St James's Square");

  // Four cards: the one without UID and N takes its name from FN; the company card keeps
  // its name in the company only.
  const auto grace = std::find_if(records.begin(), records.end(), [](const auto& entry) {
    return entry.first.starts_with("vcard/hash:") &&
           text(entry.second, TesselRecordEntityNameKey) == TesselEntity_Contacts_Contact;
  });
  ASSERT_NE(grace, records.end());
  EXPECT_EQ(text(grace->second, "first name"), "Grace Brewster");
  EXPECT_EQ(text(grace->second, "last name"), "Hopper");
  const Dictionary& company = records.at("vcard/uid:company-1");
  EXPECT_EQ(text(company, "company name"), "Engines Ltd");
  EXPECT_EQ(text(company, "first name"), "<absent>");

  // CATEGORIES: groups by name, both ways linked.
  const Dictionary& mathematicians = records.at("vcard-group/Mathematicians");
  EXPECT_EQ(identifiers(mathematicians, "members"),
            (std::vector<std::string>{kAda, "vcard/uid:babbage-1791"}));
  EXPECT_EQ(identifiers(ada, "parent groups"),
            (std::vector<std::string>{"vcard-group/Friends", "vcard-group/Mathematicians"}));
}

TEST(VCardImportContent, Version40DataUriPhotoImppTelUrisAndPhoneticName) {
  const auto records = importedRecords({kData / "server_40.vcf"});
  ASSERT_TRUE(records.contains(kZoe));
  const Dictionary& zoe = records.at(kZoe);
  EXPECT_EQ(text(zoe, "first name"), "Zo\xC3\xAB");
  EXPECT_EQ(text(zoe, "last name"), "\xC3\x98rsted");
  EXPECT_EQ(text(zoe, "phonetic first name"), "Tsoe");
  const Data png = imageOf(zoe);
  ASSERT_GT(png.size(), 8u);
  EXPECT_EQ(zt::platform::base64::encode(png),
            "iVBORw0KGgoAAAANSUhEUgAAAAEAAAABCAYAAAAfFcSJAAAADUlEQVR42mNk+M9QDwADhgGAWjR9awAAAABJR"
            "U5ErkJggg==");
  EXPECT_EQ(related(records, zoe, "phone numbers", "value"),
            (std::vector<std::string>{"+45-3311-2233 (home)", "+45-2020-3030 (mobile)"}));
  EXPECT_EQ(related(records, zoe, "instant messaging", "user"),
            (std::vector<std::string>{"zoe@example.dk (work) Jabber", "zoe.orsted (home) Skype",
                                      "ZoeAIM (home) AIM"}));
}

TEST(VCardImportContent, VdirFolderReadsEveryVcfAndGroupCards) {
  VCardImport import;
  import.addPaths({kData / "vdir"});
  EXPECT_EQ(import.fileCount(), 3u);  // readme.txt is not a card
  EXPECT_EQ(import.contactCount(), 2u);
  EXPECT_EQ(import.groupCount(), 1u);
  const auto records = byId(import.records());
  // The KIND:group card lists its members by UID; one of them is not imported.
  EXPECT_EQ(identifiers(records.at("vcard-group/Bletchley"), "members"),
            (std::vector<std::string>{"vcard/uid:vdir-a", "vcard/uid:vdir-b"}));
  EXPECT_EQ(identifiers(records.at("vcard/uid:vdir-b"), "parent groups"),
            (std::vector<std::string>{"vcard-group/Bletchley"}));
  for (const auto& [id, record] : records) {
    EXPECT_NE(text(record, "first name"), "Bletchley") << "a group card became a contact";
  }
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
      // A fault of syntax anywhere in the file comes before one of a card's values.
      {"BEGIN:VCARD\r\nPHOTO:data:image/png;base64\r\nEND:VCARD\r\nFN:outside\r\n",
       "FN outside of a card (BEGIN:VCARD ... END:VCARD)"},
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
