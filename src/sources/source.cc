#include "sources/source.h"

#include <algorithm>
#include <cstdlib>
#include <string>

#include "platform/ascii.h"
#include "sources/json_file.h"

namespace tessel::sources {

namespace fs = std::filesystem;
using zt::platform::Error;
using zt::platform::Result;

namespace {

const char* nonEmptyEnvironment(const char* name) {
  const char* value = std::getenv(name);
  return value != nullptr && *value != '\0' ? value : nullptr;
}

Result<Collection> collectionNamed(const std::string& name) {
  if (name == "address book") return Collection::AddressBook;
  if (name == "calendar") return Collection::Calendar;
  return Error{"unknown collection \"" + name + "\""};
}

nlohmann::json toJson(const Source& source) {
  nlohmann::json json = {{"id", source.identifier},
                         {"location", source.location},
                         {"collection", collectionName(source.collection)}};
  if (source.title) json["title"] = *source.title;
  if (source.credentialsFile) json["credentials"] = source.credentialsFile->string();
  if (source.secretServiceUser) json["secret-service-user"] = *source.secretServiceUser;
  if (source.onFault == importers::OnFault::Skip) json["lenient"] = true;
  return json;
}

Result<Source> fromJson(const nlohmann::json& json) {
  if (!json.is_object() || !json.contains("id") || !json["id"].is_string() ||
      !json.contains("location") || !json["location"].is_string() || !json.contains("collection") ||
      !json["collection"].is_string())
    return Error{"a source without id, location or collection"};
  Source source;
  source.identifier = json["id"].get<std::string>();
  source.location = json["location"].get<std::string>();
  // The identifier names the source's state file; `add` only ever makes digits.
  if (source.identifier.empty() ||
      source.identifier.find_first_not_of("0123456789") != std::string::npos)
    return Error{"a source whose id \"" + source.identifier + "\" is not a number"};
  // A password in the address would be shown in every message about the source.
  if (Source::isAddress(source.location) &&
      serverOfAddress(source.location).find('@') != std::string::npos)
    return Error{"a source whose address carries a user name: use a credentials file"};
  auto collection = collectionNamed(json["collection"].get<std::string>());
  if (!collection) return Error{collection.error()};
  source.collection = *collection;
  if (json.contains("title") && json["title"].is_string())
    source.title = json["title"].get<std::string>();
  if (json.contains("credentials") && json["credentials"].is_string())
    source.credentialsFile = fs::path(json["credentials"].get<std::string>());
  if (json.contains("secret-service-user") && json["secret-service-user"].is_string())
    source.secretServiceUser = json["secret-service-user"].get<std::string>();
  if (json.contains("lenient") && json["lenient"] == true)
    source.onFault = importers::OnFault::Skip;
  return source;
}

}  // namespace

bool Source::isAddress(std::string_view location) {
  const std::string lower = zt::platform::lowerAscii(location.substr(0, 9));
  return lower.starts_with("http://") || lower.starts_with("https://") ||
         lower.starts_with("webcal://");
}

std::string_view collectionName(Collection collection) {
  return collection == Collection::AddressBook ? "address book" : "calendar";
}

std::string serverOfAddress(std::string_view address) {
  const std::size_t scheme = address.find("://");
  const std::size_t start = scheme == std::string_view::npos ? 0 : scheme + 3;
  return zt::platform::lowerAscii(
      address.substr(start, address.find_first_of("/?#", start) - start));
}

fs::path SourceList::defaultPath() {
  fs::path configHome;
  // XDG asks to ignore a relative XDG_CONFIG_HOME.
  if (const char* xdg = nonEmptyEnvironment("XDG_CONFIG_HOME"); xdg && xdg[0] == '/')
    configHome = xdg;
  else if (const char* home = nonEmptyEnvironment("HOME"))
    configHome = fs::path(home) / ".config";
  else
    configHome = ".config";
  return configHome / "tessel" / "sources.json";
}

Result<SourceList> SourceList::load(const fs::path& path) {
  SourceList list;
  list.path_ = path;
  auto json = readJsonFile(path);
  if (!json) return Error{json.error()};
  if (!*json) return list;
  const nlohmann::json& entries = (**json)["sources"];
  if (!entries.is_array()) return Error{path.string() + ": no \"sources\" list; fix or remove it"};
  for (const nlohmann::json& entry : entries) {
    auto source = fromJson(entry);
    if (!source) return Error{path.string() + ": " + source.error()};
    list.sources_.push_back(std::move(source).value());
  }
  return list;
}

Result<void> SourceList::save() const {
  nlohmann::json entries = nlohmann::json::array();
  for (const Source& source : sources_) entries.push_back(toJson(source));
  return writeJsonFile(path_, nlohmann::json{{"sources", entries}});
}

const Source& SourceList::add(Source source) {
  long largest = 0;
  for (const Source& existing : sources_)
    largest = std::max(largest, std::strtol(existing.identifier.c_str(), nullptr, 10));
  source.identifier = std::to_string(largest + 1);
  sources_.push_back(std::move(source));
  return sources_.back();
}

const Source* SourceList::find(std::string_view identifierOrLocation) const {
  for (const Source& source : sources_) {
    if (source.identifier == identifierOrLocation || source.location == identifierOrLocation)
      return &source;
  }
  return nullptr;
}

std::optional<Source> SourceList::remove(std::string_view identifierOrLocation) {
  const Source* found = find(identifierOrLocation);
  if (found == nullptr) return std::nullopt;
  Source removed = *found;
  sources_.erase(sources_.begin() + (found - sources_.data()));
  return removed;
}

}  // namespace tessel::sources
