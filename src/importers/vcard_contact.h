#pragma once

// The meaning layer: one parsed card becomes the attributes of a contact record and its
// related records (phones, e-mails, addresses, URLs, IMs), or a group.

#include <string>
#include <string_view>
#include <vector>

#include "importers/import_warnings.h"
#include "importers/vcard_reader.h"
#include "platform/value.h"
#include "tessel/record.h"

namespace tessel::importers {

enum class CardKind { Contact, Group };

// A related record and the contact relationship that lists it.
struct RelatedRecord {
  std::string_view relationship;  // a TesselRelationship_Contacts_Contact_... name
  Record record;
};

struct ConvertedCard {
  CardKind kind = CardKind::Contact;
  std::size_t line = 0;
  std::string uid;  // trimmed, empty when the card has none
  // Contacts: the stable identifier of the contact record (see vcard_identifiers.h).
  std::string identifier;
  // Contacts: the entity name and the attributes, in schema order, without relationships.
  zt::platform::Dictionary attributes;
  std::vector<RelatedRecord> related;
  // Contacts: the CATEGORIES. Groups: the group's one name.
  std::vector<std::string> groupNames;
  // Groups (RFC 6350 section 6.6.5 MEMBER, and the X-ADDRESSBOOKSERVER-MEMBER of CardDAV
  // address books): the members' UIDs, "urn:uuid:" removed.
  std::vector<std::string> memberUids;
};

// Decodes every property (transfer encoding, charset, escapes) and maps what the contacts
// schema holds. A value that cannot be decoded (bad base64 or quoted-printable) is a fault
// at the property's line that drops the property; one in an unknown or mismatched charset
// is read as text without a charset instead. Each goes through `warnings`, which names the
// card. A group card without a name converts to a group without names, which the import
// skips.
ConvertedCard convertCard(const Card& card, const std::string& source, ImportWarnings& warnings);

}  // namespace tessel::importers
