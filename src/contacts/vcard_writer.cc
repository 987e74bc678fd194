#include "contacts/vcard_writer.h"

#include <algorithm>
#include <string_view>
#include <unordered_set>

#include "contacts/vcard_text.h"
#include "platform/ascii.h"
#include "tessel/schema.h"

namespace zt::contacts {

using namespace tessel;  // the schema's names, in this source file only

namespace {

// A value's text: a string as it is, a URL in its absolute form; none for other kinds.
const std::string* textOf(const platform::Value* value) {
  if (!value) return nullptr;
  if (const std::string* text = value->asString()) return text;
  if (const platform::Url* url = value->asUrl()) return &url->text;
  return nullptr;
}

const std::string* textOf(const platform::Dictionary& record, std::string_view key) {
  return textOf(record.find(key));
}

// An enumeration value, or `absent` when the record has none.
std::string_view enumOf(const platform::Dictionary& record, std::string_view key,
                        std::string_view absent) {
  const std::string* text = textOf(record, key);
  return text ? std::string_view(*text) : absent;
}

// RFC 2426 section 3.3.1: TEL type parameters; a mobile phone is "CELL", a fax names both
// its place and "FAX".
std::string_view phoneType(std::string_view type) {
  if (type == TesselEnumValue_Contacts_PhoneNumber_Type_Home) return "type=HOME:";
  if (type == TesselEnumValue_Contacts_PhoneNumber_Type_Work) return "type=WORK:";
  if (type == TesselEnumValue_Contacts_PhoneNumber_Type_Mobile) return "type=CELL:";
  if (type == TesselEnumValue_Contacts_PhoneNumber_Type_Main) return "type=MAIN:";
  if (type == TesselEnumValue_Contacts_PhoneNumber_Type_HomeFax) return "type=HOME;type=FAX:";
  if (type == TesselEnumValue_Contacts_PhoneNumber_Type_WorkFax) return "type=WORK;type=FAX:";
  if (type == TesselEnumValue_Contacts_PhoneNumber_Type_Pager) return "type=PAGER:";
  return "type=OTHER:";
}

std::string_view emailType(std::string_view type) {
  if (type == TesselEnumValue_Contacts_EmailAddress_Type_Home) return ";type=HOME:";
  if (type == TesselEnumValue_Contacts_EmailAddress_Type_Work) return ";type=WORK:";
  if (type == TesselEnumValue_Contacts_EmailAddress_Type_Other) return ";type=OTHER:";
  return ":";
}

std::string_view addressPrefix(std::string_view type) {
  if (type == TesselEnumValue_Contacts_StreetAddress_Type_Home) return "ADR;type=HOME:;";
  if (type == TesselEnumValue_Contacts_StreetAddress_Type_Work) return "ADR;type=WORK:;";
  return "ADR;type=OTHER:;";
}

// Extension properties of RFC 2426 section 3.8, one per instant-messaging service.
std::string_view imService(std::string_view service) {
  const std::string lower = zt::platform::lowerAscii(service);
  if (lower == "jabber") return "X-JABBER;";
  if (lower == "msn") return "X-MSN;";
  if (lower == "yahoo") return "X-YAHOO;";
  if (lower == "icq") return "X-ICQ;";
  return "X-AIM;";
}

std::string_view imType(std::string_view type) {
  if (type == TesselEnumValue_Contacts_URL_IM_Type_Work) return "type=WORK:";
  if (type == TesselEnumValue_Contacts_URL_IM_Type_Other) return "type=OTHER:";
  return "type=HOME:";
}

}  // namespace

VCardWriter::VCardWriter(const tessel::Snapshot& snapshot, PhotoSource photos)
    : snapshot_(snapshot), photos_(std::move(photos)) {}

void VCardWriter::appendEscaped(std::string& card, const platform::Value* value) {
  const std::string* text = textOf(value);
  if (!text) return;
  escapeVCardText(*text, escaped_);
  card += escaped_;
}

void VCardWriter::appendCard(std::string& card, const platform::Dictionary& contact) {
  card += "BEGIN:VCARD\r\nVERSION:3.0\r\n";
  appendName(card, contact);
  appendOrganisation(card, contact);
  if (const platform::Value* title = contact.find(TesselAttribute_Contacts_Contact_JobTitle);
      textOf(title)) {
    card += "TITLE:";
    appendEscaped(card, title);
    card += "\r\n";
  }
  if (const platform::Value* note = contact.find(TesselAttribute_Contacts_Contact_Notes);
      textOf(note)) {
    card += "NOTE:";
    appendEscaped(card, note);
    card += "\r\n";
  }
  if (ContactPhotoPreparation* photos = photos_ ? photos_() : nullptr)
    photos->appendPhoto(card, contact);
  categories_.clear();
  appendRelated(card, contact);
  appendCategories(card);
  card += "END:VCARD\r\n";
}

void VCardWriter::appendName(std::string& card, const platform::Dictionary& contact) {
  // RFC 2426 section 3.1.2: family name, given name, additional names, prefixes, suffixes.
  // The cards carry no FN line; the player builds the display name from N.
  card += "N:";
  appendEscaped(card, contact.find(TesselAttribute_Contacts_Contact_LastName));
  card += ';';
  appendEscaped(card, contact.find(TesselAttribute_Contacts_Contact_FirstName));
  card += ';';
  appendEscaped(card, contact.find(TesselAttribute_Contacts_Contact_MiddleName));
  card += ';';
  appendEscaped(card, contact.find(TesselAttribute_Contacts_Contact_Title));
  card += ';';
  appendEscaped(card, contact.find(TesselAttribute_Contacts_Contact_Suffix));
  card += "\r\n";

  static constexpr std::pair<std::string_view, std::string_view> kSingleLines[] = {
      {TesselAttribute_Contacts_Contact_Nickname, "NICKNAME:"},
      {TesselAttribute_Contacts_Contact_MaidenName, "X-MAIDENNAME:"},
      {TesselAttribute_Contacts_Contact_LastNameYomi, "X-PHONETIC-LAST-NAME:"},
      {TesselAttribute_Contacts_Contact_FirstNameYomi, "X-PHONETIC-FIRST-NAME:"},
  };
  for (const auto& [key, property] : kSingleLines) {
    const platform::Value* value = contact.find(key);
    if (!textOf(value)) continue;
    card += property;
    appendEscaped(card, value);
    card += "\r\n";
  }
}

void VCardWriter::appendOrganisation(std::string& card, const platform::Dictionary& contact) {
  // RFC 2426 section 3.5.5: the organisation name, then its units.
  const platform::Value* company = contact.find(TesselAttribute_Contacts_Contact_CompanyName);
  const platform::Value* department = contact.find(TesselAttribute_Contacts_Contact_Department);
  const bool hasCompany = textOf(company) != nullptr;
  const bool hasDepartment = textOf(department) != nullptr;
  if (hasCompany) {
    card += "ORG:";
    appendEscaped(card, company);
  }
  if (hasDepartment) {
    if (!hasCompany) card += "ORG:";
    card += ';';
    appendEscaped(card, department);
  }
  if (hasCompany || hasDepartment) card += "\r\n";
}

void VCardWriter::appendRelated(std::string& card, const platform::Dictionary& contact) {
  // Every list the contact holds names related records, its groups included; a record
  // linked twice is written once. The records of one list are visited in the order the
  // snapshot's map yields them: by identifier.
  std::unordered_set<std::string> visited;
  for (const auto& [key, value] : contact) {
    std::vector<std::string> identifiers = platform::stringsIn(&value);
    if (identifiers.empty()) continue;
    std::sort(identifiers.begin(), identifiers.end());
    identifiers.erase(std::unique(identifiers.begin(), identifiers.end()), identifiers.end());
    // A group is named by many contacts and carries all its members: its name is read from
    // the snapshot once per run, not once per member.
    std::vector<std::string> unknown;
    for (const std::string& identifier : identifiers) {
      if (!groupNames_.contains(identifier)) unknown.push_back(identifier);
    }
    const tessel::RecordMap fetched =
        unknown.empty() ? tessel::RecordMap() : snapshot_.recordsWithIdentifiers(unknown);
    for (const std::string& identifier : identifiers) {
      if (auto group = groupNames_.find(identifier); group != groupNames_.end()) {
        if (!visited.insert(identifier).second) continue;
        if (group->second) categories_.push_back(*group->second);
        continue;
      }
      auto found = fetched.find(identifier);
      if (found == fetched.end() || !visited.insert(identifier).second) continue;
      const platform::Dictionary& record = found->second;
      const std::string* entity = textOf(record, TesselRecordEntityNameKey);
      if (!entity) continue;
      if (*entity == TesselEntity_Contacts_IM) {
        appendIM(card, record);
      } else if (*entity == TesselEntity_Contacts_PhoneNumber) {
        appendPhone(card, record);
      } else if (*entity == TesselEntity_Contacts_EmailAddress) {
        appendEmail(card, record);
      } else if (*entity == TesselEntity_Contacts_StreetAddress) {
        appendAddress(card, record);
      } else if (*entity == TesselEntity_Contacts_URL) {
        appendUrl(card, record);
      } else if (*entity == TesselEntity_Contacts_Group) {
        std::optional<std::string>& name = groupNames_[identifier];
        if (const std::string* text = textOf(record, TesselAttribute_Contacts_Group_Name))
          name = *text;
        if (name) categories_.push_back(*name);
      }
    }
  }
}

void VCardWriter::appendPhone(std::string& card, const platform::Dictionary& record) {
  const platform::Value* value = record.find(TesselAttribute_Contacts_PhoneNumber_Value);
  if (!textOf(value)) return;
  card += "TEL;";
  card += phoneType(enumOf(record, TesselAttribute_Contacts_PhoneNumber_Type,
                           TesselEnumValue_Contacts_PhoneNumber_Type_Other));
  appendEscaped(card, value);
  card += "\r\n";
}

void VCardWriter::appendEmail(std::string& card, const platform::Dictionary& record) {
  card += "EMAIL;type=INTERNET";
  const platform::Value* value = record.find(TesselAttribute_Contacts_EmailAddress_Value);
  // Without an address the fragment stays, with no line end, and runs into the next line:
  // the player has always been sent cards this way.
  if (!textOf(value)) return;
  card += emailType(enumOf(record, TesselAttribute_Contacts_EmailAddress_Type,
                           TesselEnumValue_Contacts_PhoneNumber_Type_Other));
  appendEscaped(card, value);
  card += "\r\n";
}

void VCardWriter::appendAddress(std::string& card, const platform::Dictionary& record) {
  // RFC 2426 section 3.2.1 orders post office box, extended address, street, locality,
  // region, postal code, country. The box is always empty, and an absent part takes no slot
  // at all, so the parts after it move forward: the player reads addresses this way.
  card += addressPrefix(enumOf(record, TesselAttribute_Contacts_StreetAddress_Type,
                               TesselEnumValue_Contacts_StreetAddress_Type_Other));
  static constexpr std::string_view kParts[] = {
      TesselAttribute_Contacts_StreetAddress_Street,
      TesselAttribute_Contacts_StreetAddress_City,
      TesselAttribute_Contacts_StreetAddress_State,
      TesselAttribute_Contacts_StreetAddress_PostalCode,
      TesselAttribute_Contacts_StreetAddress_Country,
  };
  for (std::string_view part : kParts) {
    const platform::Value* value = record.find(part);
    if (!textOf(value)) continue;
    card += ';';
    appendEscaped(card, value);
  }
  card += "\r\n";
}

void VCardWriter::appendUrl(std::string& card, const platform::Dictionary& record) {
  const platform::Value* value = record.find(TesselAttribute_Contacts_URL_Value);
  if (!textOf(value)) return;
  card += "URL:";
  appendEscaped(card, value);
  card += "\r\n";
}

void VCardWriter::appendIM(std::string& card, const platform::Dictionary& record) {
  const platform::Value* user = record.find(TesselAttribute_Contacts_IM_User);
  if (!textOf(user)) return;
  card += imService(enumOf(record, TesselAttribute_Contacts_IM_Service, "aim"));
  card += imType(
      enumOf(record, TesselAttribute_Contacts_IM_Type, TesselEnumValue_Contacts_URL_IM_Type_Home));
  appendEscaped(card, user);
  card += "\r\n";
}

void VCardWriter::appendCategories(std::string& card) {
  // RFC 2426 section 3.6.1: the categories are one comma-separated list; a comma inside a
  // name is escaped so that it stays part of the name.
  if (categories_.empty()) return;
  card += "CATEGORIES:";
  for (std::size_t i = 0; i < categories_.size(); ++i) {
    if (i > 0) card += ',';
    escapeVCardText(categories_[i], escaped_);
    card += escaped_;
  }
  card += "\r\n";
}

}  // namespace zt::contacts
