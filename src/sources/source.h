#pragma once

#include <filesystem>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "importers/import_options.h"
#include "platform/result.h"

namespace tessel::sources {

// What a source holds: contacts or one calendar.
enum class Collection { AddressBook, Calendar };

// Somewhere that contacts or a calendar come from, kept current by someone else: a file, a
// vdir folder (one item per file, as vdirsyncer, khal and khard keep them) or the address of
// a collection on a server (http, https, webcal).
struct Source {
  std::string identifier;  // a number, never reused while the list holds a larger one
  std::string location;    // an absolute path, or the address
  Collection collection = Collection::Calendar;
  // A calendar's title when the source names none; a label for an address book.
  std::optional<std::string> title;
  // Where the password for HTTP basic authentication comes from, if one is needed: the file
  // with "USER:PASSWORD", or the user whose password the desktop's secret service keeps for the
  // address's server (secret_service.h), asked at each refresh. Never both.
  std::optional<std::filesystem::path> credentialsFile;
  std::optional<std::string> secretServiceUser;
  // What a fault in its text costs. Refuse by default: a refresh runs unattended (when a player
  // is plugged in), and a source it cannot wholly read keeps what the store had of it rather
  // than losing an event or a property; Skip reads it as `tessel import` does, with warnings.
  importers::OnFault onFault = importers::OnFault::Refuse;

  bool isAddress() const { return isAddress(location); }
  static bool isAddress(std::string_view location);
};

std::string_view collectionName(Collection collection);  // "address book", "calendar"

// The server of an address as the secret service keeps its passwords: the host in lower case,
// with the port when the address names one ("dav.example.org", "127.0.0.1:5232"), so that the
// collections of one server share the password of one user.
std::string serverOfAddress(std::string_view address);

// The list of sources, $XDG_CONFIG_HOME/tessel/sources.json (else ~/.config/tessel/...). It is
// the user's configuration, like khal's and vdirsyncer's, not data of one store.
class SourceList {
 public:
  static std::filesystem::path defaultPath();

  // An absent file is an empty list.
  static zt::platform::Result<SourceList> load(const std::filesystem::path& path);
  // Replaces the file atomically: a failure leaves the previous list.
  zt::platform::Result<void> save() const;

  const std::vector<Source>& sources() const { return sources_; }
  // Gives the source its identifier and answers it.
  const Source& add(Source source);
  // By identifier or location; none when no source matches.
  std::optional<Source> remove(std::string_view identifierOrLocation);
  const Source* find(std::string_view identifierOrLocation) const;

 private:
  std::filesystem::path path_;
  std::vector<Source> sources_;
};

}  // namespace tessel::sources
