#pragma once

// The stable identifiers of records the vCard import writes. The same card gives the same
// identifiers every time, so importing again replaces records instead of adding copies, and
// the prefixes tell the import's records apart from everyone else's.

#include <string>
#include <string_view>

namespace tessel::importers {

// "vcard/uid:<UID>" for a card with a UID; "vcard/hash:<16 hex digits>" of the card's name
// fields, first e-mail and first phone otherwise. "/" and "%" in a UID are %-escaped, so the
// contact identifier never contains a "/" after its prefix.
inline constexpr std::string_view kContactPrefix = "vcard/";
// "vcard-group/<name>", one group per name whichever file or card names it.
inline constexpr std::string_view kGroupPrefix = "vcard-group/";

std::string contactIdentifierForUid(std::string_view uid);
std::string contactIdentifierForHash(std::string_view identity);
std::string groupIdentifier(std::string_view name);
// "<contact>/tel/0": a related record is its contact's identifier, its kind and its index.
std::string relatedIdentifier(std::string_view contact, std::string_view kind, std::size_t index);

bool isImportedIdentifier(std::string_view identifier);
// The contact identifier a related record belongs to; the identifier itself for a contact;
// empty for a group or any other record.
std::string_view owningContactIdentifier(std::string_view identifier);

}  // namespace tessel::importers
