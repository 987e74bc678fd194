#pragma once

#include <cstddef>
#include <filesystem>
#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "importers/import_options.h"
#include "importers/import_warnings.h"
#include "importers/vcard_contact.h"
#include "tessel/record.h"
#include "tessel/store.h"

namespace tessel::importers {

struct VCardImportSummary {
  std::size_t contacts = 0;
  std::size_t groups = 0;
  std::size_t files = 0;
  std::size_t written = 0;  // records inserted or changed; identical ones are left alone
  std::size_t deleted = 0;
};

// An import of vCard 2.1, 3.0 and 4.0 address books into the contacts schema, in two
// phases: every input is read and converted first, then everything is written at once.
// A fault costs what cannot be read (a line, a property) with a warning in `warnings`, or
// with OnFault::Refuse (and without `warnings`) raises ImportError naming the file and line
// before anything has been written. A file that cannot be read at all, or that is not a
// vCard file, always raises it.
//
//   ImportWarnings warnings(OnFault::Skip);
//   VCardImport import(warnings);
//   import.addPaths({"contacts.vcf", "vdir/"});
//   VCardImportSummary summary = import.writeTo(store, SyncDeletes::Off);
//
// Identifiers are stable (vcard_identifiers.h): the same cards give the same records, and a
// changed card changes only its own records. A card whose UID (or, without one, whose name,
// first e-mail and first phone) comes again replaces the earlier one. CATEGORIES become
// groups by name; vCard 4.0 KIND:group cards (and CardDAV's X-ADDRESSBOOKSERVER-KIND) are
// groups whose members are the cards with the UIDs they list.
class VCardImport {
 public:
  // Faults raise ImportError.
  VCardImport() = default;
  // Faults go through `warnings`, which outlives the import.
  explicit VCardImport(ImportWarnings& warnings) : warnings_(&warnings) {}

  // Files, and folders of which every *.vcf file is read in name order (a vdir).
  void addPaths(const std::vector<std::filesystem::path>& paths);
  void addFile(const std::filesystem::path& file);
  // One file's text; `source` names it in error messages.
  void addText(std::string_view text, const std::string& source);

  std::size_t contactCount() const { return contacts_.size(); }
  std::size_t groupCount() const;
  std::size_t fileCount() const { return files_; }

  // Every record the import writes: each contact followed by its related records, then the
  // groups in name order. Contacts list their groups under "parent groups", groups their
  // contacts under "members".
  std::vector<Record> records() const;

  // Writes records() and, in the same transaction, deletes the related records the
  // imported contacts no longer have and, with SyncDeletes::On, every other record of an
  // earlier vCard import that this one does not produce. Without SyncDeletes::On, a group
  // keeps the members that earlier imports gave it and that this import did not read again.
  VCardImportSummary writeTo(Store& store, SyncDeletes syncDeletes) const&;
  // The same, moving the records into the store's transaction instead of copying them, so
  // that an import of many cards does not hold them twice: std::move(import).writeTo(...).
  VCardImportSummary writeTo(Store& store, SyncDeletes syncDeletes) &&;

 private:
  struct Groups {
    // Group identifier -> name and member contact identifiers, in identifier order.
    std::map<std::string, std::pair<std::string, std::vector<std::string>>> byIdentifier;
  };
  Groups groups() const;
  // records() of `contacts`, whose attributes and related records are moved into them.
  static std::vector<Record> recordsOf(std::vector<ConvertedCard> contacts, const Groups& groups);

  std::vector<ConvertedCard> contacts_;
  std::map<std::string, std::size_t, std::less<>> contactIndex_;
  std::vector<ConvertedCard> groupCards_;
  std::size_t files_ = 0;
  ImportWarnings* warnings_ = nullptr;
};

}  // namespace tessel::importers
