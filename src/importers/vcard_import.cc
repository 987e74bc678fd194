#include "importers/vcard_import.h"

#include <algorithm>
#include <exception>
#include <set>
#include <system_error>
#include <unordered_set>
#include <utility>

#include "importers/import_error.h"
#include "importers/import_file.h"
#include "importers/import_kind.h"
#include "importers/vcard_decoding.h"
#include "importers/vcard_identifiers.h"
#include "importers/vcard_reader.h"
#include "platform/ascii.h"
#include "tessel/schema.h"

namespace tessel::importers {

namespace {

using zt::platform::Array;
using zt::platform::Dictionary;
using zt::platform::lowerAscii;
using zt::platform::Value;

namespace fs = std::filesystem;

Array identifierArray(const std::vector<std::string>& identifiers) {
  return Array(identifiers.begin(), identifiers.end());
}

// What earlier imports left in the store that this one does not write again.
struct EarlierImports {
  // Their records to delete.
  std::vector<std::string> deletions;
  // The members of their groups that stay, by group identifier.
  std::map<std::string, std::vector<std::string>> groupMembers;
};

EarlierImports earlierImports(const Store& store, const std::vector<Record>& records,
                              const std::set<std::string, std::less<>>& importedContacts,
                              SyncDeletes syncDeletes) {
  std::unordered_set<std::string> produced;
  for (const Record& record : records) produced.insert(record.id);
  EarlierImports earlier;
  store.forEachRecord([&](const Record& record) {
    if (!isImportedIdentifier(record.id) || produced.contains(record.id)) {
      if (record.id.starts_with(kGroupPrefix)) {
        earlier.groupMembers[record.id] =
            zt::platform::stringsIn(record.record.find(TesselRelationship_Contacts_Group_Members));
      }
      return;
    }
    const std::string_view owner = owningContactIdentifier(record.id);
    // The related records a re-imported contact no longer has are its own garbage.
    if (syncDeletes == SyncDeletes::On || (!owner.empty() && importedContacts.contains(owner))) {
      earlier.deletions.push_back(record.id);
    } else if (record.id.starts_with(kGroupPrefix)) {
      earlier.groupMembers[record.id] =
          zt::platform::stringsIn(record.record.find(TesselRelationship_Contacts_Group_Members));
    }
  });
  return earlier;
}

// A group keeps the contacts of earlier imports that this one did not read again: in the
// group record this import writes, or in the stored one, written again when it lost members.
void keepEarlierMembers(const Store& store,
                        const std::map<std::string, std::vector<std::string>>& earlierMembers,
                        const std::set<std::string, std::less<>>& importedContacts,
                        std::vector<Record>& records) {
  std::map<std::string, std::size_t> groupRecords;
  for (std::size_t i = 0; i < records.size(); ++i) {
    if (records[i].id.starts_with(kGroupPrefix)) groupRecords[records[i].id] = i;
  }
  for (const auto& [identifier, members] : earlierMembers) {
    std::vector<std::string> kept;
    for (const std::string& member : members) {
      if (!importedContacts.contains(member)) kept.push_back(member);
    }
    auto producedGroup = groupRecords.find(identifier);
    if (producedGroup == groupRecords.end()) {
      if (kept == members) continue;
      std::optional<Dictionary> earlier = store.record(identifier);
      if (!earlier) continue;
      earlier->set(TesselRelationship_Contacts_Group_Members, identifierArray(kept));
      records.push_back(Record{identifier, std::move(*earlier)});
      continue;
    }
    Dictionary& group = records[producedGroup->second].record;
    std::vector<std::string> now =
        zt::platform::stringsIn(group.find(TesselRelationship_Contacts_Group_Members));
    for (std::string& member : now) {
      if (std::find(kept.begin(), kept.end(), member) == kept.end()) kept.push_back(member);
    }
    std::sort(kept.begin(), kept.end());
    group.set(TesselRelationship_Contacts_Group_Members, identifierArray(kept));
  }
}

}  // namespace

void VCardImport::addPaths(const std::vector<fs::path>& paths) {
  for (const fs::path& path : paths) {
    std::error_code error;
    if (!fs::is_directory(path, error)) {
      addFile(path);
      continue;
    }
    // A vdir (vdirsyncer's storage format): one card per *.vcf file of the folder.
    std::vector<fs::path> files;
    fs::directory_iterator entries(path, error);
    for (; !error && entries != fs::directory_iterator(); entries.increment(error)) {
      const fs::path& file = entries->path();
      if (lowerAscii(file.extension().string()) == ".vcf" && entries->is_regular_file(error)) {
        files.push_back(file);
      }
    }
    if (error) throw ImportError(path.string(), std::nullopt, "cannot read: " + error.message());
    // Nothing to read is a mistyped folder more often than an empty address book.
    if (files.empty())
      throw ImportError(path.string(), std::nullopt, "no .vcf file in this folder");
    std::sort(files.begin(), files.end());
    for (const fs::path& file : files) addFile(file);
  }
}

void VCardImport::addFile(const fs::path& file) {
  addText(readImportFile(file, file.string()), file.string());
}

void VCardImport::addText(std::string_view text, const std::string& source) {
  // The whole file is converted before anything is kept, so a fault leaves no part of it.
  // Each card is converted as soon as it is read, so that the cards are not all held at
  // once. A fault of syntax still comes before a fault of conversion in an earlier card, as
  // when the whole file was read first: on a fault of conversion, the rest is read through.
  checkImportKind(text, ImportKind::VCard, source);
  ImportWarnings strict(OnFault::Refuse);
  ImportWarnings& warnings = warnings_ != nullptr ? *warnings_ : strict;
  std::vector<ConvertedCard> converted;
  std::exception_ptr conversionFault;
  struct Stop {};
  try {
    forEachCard(
        text, source,
        [&](Card& card) {
          try {
            converted.push_back(convertCard(card, source, warnings));
          } catch (...) {
            conversionFault = std::current_exception();
            throw Stop{};
          }
        },
        warnings);
  } catch (const Stop&) {
    forEachCard(
        text, source, [](Card&) {}, warnings);
    std::rethrow_exception(conversionFault);
  }
  for (ConvertedCard& card : converted) {
    if (card.kind == CardKind::Group) {
      if (!card.groupNames.empty()) groupCards_.push_back(std::move(card));
      continue;
    }
    if (auto known = contactIndex_.find(card.identifier); known != contactIndex_.end()) {
      contacts_[known->second] = std::move(card);
    } else {
      contactIndex_.emplace(card.identifier, contacts_.size());
      contacts_.push_back(std::move(card));
    }
  }
  ++files_;
}

VCardImport::Groups VCardImport::groups() const {
  Groups groups;
  auto addMember = [&](const std::string& name, const std::string& contact) {
    auto& [groupName, members] = groups.byIdentifier[groupIdentifier(name)];
    groupName = name;
    if (!contact.empty() && std::find(members.begin(), members.end(), contact) == members.end()) {
      members.push_back(contact);
    }
  };
  std::map<std::string, std::string, std::less<>> contactOfUid;
  for (const ConvertedCard& contact : contacts_) {
    for (const std::string& name : contact.groupNames) addMember(name, contact.identifier);
    if (!contact.uid.empty()) {
      std::string uid = contact.uid;
      if (zt::platform::startsWithIgnoringAsciiCase(uid, "urn:uuid:")) uid.erase(0, 9);
      contactOfUid.emplace(uid, contact.identifier);
    }
  }
  for (const ConvertedCard& group : groupCards_) {
    addMember(group.groupNames.front(), "");
    for (const std::string& uid : group.memberUids) {
      if (auto contact = contactOfUid.find(uid); contact != contactOfUid.end()) {
        addMember(group.groupNames.front(), contact->second);
      }
    }
  }
  for (auto& [identifier, group] : groups.byIdentifier) {
    std::sort(group.second.begin(), group.second.end());
  }
  return groups;
}

std::size_t VCardImport::groupCount() const {
  return groups().byIdentifier.size();
}

std::vector<Record> VCardImport::records() const {
  return recordsOf(contacts_, groups());
}

std::vector<Record> VCardImport::recordsOf(std::vector<ConvertedCard> contacts,
                                           const Groups& allGroups) {
  std::map<std::string, std::vector<std::string>, std::less<>> parents;
  for (const auto& [identifier, group] : allGroups.byIdentifier) {
    for (const std::string& member : group.second) parents[member].push_back(identifier);
  }

  std::vector<Record> records;
  for (ConvertedCard& contact : contacts) {
    Dictionary record = std::move(contact.attributes);
    if (auto groupsOfContact = parents.find(contact.identifier); groupsOfContact != parents.end()) {
      record.set(TesselRelationship_Contacts_Contact_ParentGroups,
                 identifierArray(groupsOfContact->second));
    }
    static constexpr std::string_view kRelationships[] = {
        TesselRelationship_Contacts_Contact_PhoneNumbers,
        TesselRelationship_Contacts_Contact_EmailAddresses,
        TesselRelationship_Contacts_Contact_StreetAddresses,
        TesselRelationship_Contacts_Contact_URLs,
        TesselRelationship_Contacts_Contact_IMs,
    };
    for (std::string_view relationship : kRelationships) {
      std::vector<std::string> identifiers;
      for (const RelatedRecord& related : contact.related) {
        if (related.relationship == relationship) identifiers.push_back(related.record.id);
      }
      if (!identifiers.empty()) record.set(relationship, identifierArray(identifiers));
    }
    records.push_back(Record{contact.identifier, std::move(record)});
    for (RelatedRecord& related : contact.related) records.push_back(std::move(related.record));
    contact = ConvertedCard{};
  }
  for (const auto& [identifier, group] : allGroups.byIdentifier) {
    records.push_back(Record{
        identifier,
        Dictionary{{TesselRecordEntityNameKey, TesselEntity_Contacts_Group},
                   {TesselAttribute_Contacts_Group_Name, group.first},
                   {TesselRelationship_Contacts_Group_Members, identifierArray(group.second)}}});
  }
  return records;
}

VCardImportSummary VCardImport::writeTo(Store& store, SyncDeletes syncDeletes) const& {
  VCardImport copy = *this;
  return std::move(copy).writeTo(store, syncDeletes);
}

VCardImportSummary VCardImport::writeTo(Store& store, SyncDeletes syncDeletes) && {
  std::set<std::string, std::less<>> importedContacts;
  for (const ConvertedCard& contact : contacts_) importedContacts.insert(contact.identifier);
  VCardImportSummary summary;
  summary.contacts = contactCount();
  summary.groups = groupCount();
  summary.files = files_;
  // The groups are read from the contacts before these are moved out: the order in which the
  // arguments of one call are evaluated is not fixed.
  const Groups allGroups = groups();
  std::vector<Record> records = recordsOf(std::move(contacts_), allGroups);
  contacts_.clear();
  contactIndex_.clear();

  EarlierImports earlier = earlierImports(store, records, importedContacts, syncDeletes);
  if (syncDeletes == SyncDeletes::Off) {
    keepEarlierMembers(store, earlier.groupMembers, importedContacts, records);
  }

  // One transaction: an interrupted import leaves the store as it was.
  AppliedChanges applied = store.applyChanges(
      StoreChanges{std::move(records), std::move(earlier.deletions), std::nullopt});
  summary.written = applied.written;
  summary.deleted = applied.deleted;
  return summary;
}

}  // namespace tessel::importers
