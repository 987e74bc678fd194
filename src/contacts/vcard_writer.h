#pragma once

#include <functional>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "contacts/contact_photo.h"
#include "platform/value.h"
#include "tessel/snapshot.h"

namespace zt::contacts {

// Builds the vCard 3.0 card (RFC 2426) of one contact of the engine's truth, as UTF-8 text
// with CR LF line ends. Properties come in a fixed order: N, the optional name lines, ORG,
// TITLE, NOTE, PHOTO, then one line per related record (TEL, EMAIL, ADR, URL, X-<service>)
// in the order the snapshot yields them, and CATEGORIES from the contact's groups.
class VCardWriter {
 public:
  // Asked once per card: the preparation that embeds the card's photo, or none when photos
  // stay off the player. Asking per card rather than once up front means that a run which
  // writes no card never has to decide, and so never probes the player.
  using PhotoSource = std::function<ContactPhotoPreparation*()>;

  VCardWriter(const tessel::Snapshot& snapshot, PhotoSource photos);

  void appendCard(std::string& card, const platform::Dictionary& contact);

 private:
  void appendEscaped(std::string& card, const platform::Value* value);
  void appendName(std::string& card, const platform::Dictionary& contact);
  void appendOrganisation(std::string& card, const platform::Dictionary& contact);
  void appendRelated(std::string& card, const platform::Dictionary& contact);
  void appendPhone(std::string& card, const platform::Dictionary& record);
  void appendEmail(std::string& card, const platform::Dictionary& record);
  void appendAddress(std::string& card, const platform::Dictionary& record);
  void appendUrl(std::string& card, const platform::Dictionary& record);
  void appendIM(std::string& card, const platform::Dictionary& record);
  void appendCategories(std::string& card);

  const tessel::Snapshot& snapshot_;
  PhotoSource photos_;
  // Reused by every value and every card.
  std::string escaped_;
  std::vector<std::string> categories_;
  // The names of the groups met so far (none for a group without a name); the snapshot does
  // not change during a run.
  std::unordered_map<std::string, std::optional<std::string>> groupNames_;
};

}  // namespace zt::contacts
