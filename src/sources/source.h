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
  // The file with "USER:PASSWORD" for HTTP basic authentication.
  std::optional<std::filesystem::path> credentialsFile;
  // What a fault in its text costs. Refuse by default: a refresh runs unattended (when a player
  // is plugged in), and a source it cannot wholly read keeps what the store had of it rather
  // than losing an event or a property; Skip reads it as `tessel import` does, with warnings.
  importers::OnFault onFault = importers::OnFault::Refuse;

  bool isAddress() const { return isAddress(location); }
  static bool isAddress(std::string_view location);
};

std::string_view collectionName(Collection collection);  // "address book", "calendar"

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
