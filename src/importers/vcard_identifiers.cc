#include "importers/vcard_identifiers.h"

#include <cstdint>

#include "importers/stable_hash.h"

namespace tessel::importers {

namespace {

std::string escapeSlashes(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (char c : text) {
    if (c == '%') {
      out += "%25";
    } else if (c == '/') {
      out += "%2F";
    } else {
      out += c;
    }
  }
  return out;
}

}  // namespace

std::string contactIdentifierForUid(std::string_view uid) {
  return std::string(kContactPrefix) + "uid:" + escapeSlashes(uid);
}

std::string contactIdentifierForHash(std::string_view identity) {
  return std::string(kContactPrefix) + "hash:" + stableHash(identity);
}

std::string groupIdentifier(std::string_view name) {
  return std::string(kGroupPrefix) + escapeSlashes(name);
}

std::string relatedIdentifier(std::string_view contact, std::string_view kind, std::size_t index) {
  return std::string(contact) + "/" + std::string(kind) + "/" + std::to_string(index);
}

bool isImportedIdentifier(std::string_view identifier) {
  return identifier.starts_with(kContactPrefix) || identifier.starts_with(kGroupPrefix);
}

std::string_view owningContactIdentifier(std::string_view identifier) {
  if (!identifier.starts_with(kContactPrefix)) return {};
  return identifier.substr(0, identifier.find('/', kContactPrefix.size()));
}

}  // namespace tessel::importers
