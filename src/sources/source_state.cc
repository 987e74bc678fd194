#include "sources/source_state.h"

#include <algorithm>
#include <system_error>

#include "sources/json_file.h"

namespace tessel::sources {

namespace fs = std::filesystem;

SourceStates::SourceStates(const fs::path& storePath)
    : folder_(fs::path(storePath.string() + "-sources")) {}

fs::path SourceStates::fileOf(const Source& source) const {
  return folder_ / (source.identifier + ".json");
}

SourceState SourceStates::load(const Source& source) const {
  SourceState state;
  auto json = readJsonFile(fileOf(source));
  if (!json || !*json) return state;
  const nlohmann::json& content = **json;
  const auto text = [&content](const char* key) {
    return content.contains(key) && content[key].is_string() ? content[key].get<std::string>()
                                                             : std::string();
  };
  if (text("location") != source.location) return state;
  state.location = source.location;
  state.validators = {text("etag"), text("last-modified")};
  if (content.contains("records") && content["records"].is_array()) {
    for (const nlohmann::json& id : content["records"])
      if (id.is_string()) state.records.push_back(id.get<std::string>());
  }
  std::sort(state.records.begin(), state.records.end());
  return state;
}

zt::platform::Result<void> SourceStates::save(const Source& source,
                                              const SourceState& state) const {
  nlohmann::json content = {{"location", source.location}, {"records", state.records}};
  if (!state.validators.entityTag.empty()) content["etag"] = state.validators.entityTag;
  if (!state.validators.lastModified.empty())
    content["last-modified"] = state.validators.lastModified;
  return writeJsonFile(fileOf(source), content);
}

void SourceStates::forget(const Source& source) const {
  std::error_code ignored;
  fs::remove(fileOf(source), ignored);
}

}  // namespace tessel::sources
