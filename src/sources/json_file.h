#pragma once

#include <filesystem>
#include <nlohmann/json.hpp>
#include <optional>

#include "platform/result.h"

namespace tessel::sources {

// The small JSON files of this folder: the source list and each source's state.

// The parsed file; none when it does not exist.
zt::platform::Result<std::optional<nlohmann::json>> readJsonFile(const std::filesystem::path& file);
// Creates the folder when needed and replaces the file atomically and durably: a failure or a
// crash leaves the previous file whole.
zt::platform::Result<void> writeJsonFile(const std::filesystem::path& file,
                                         const nlohmann::json& content);

}  // namespace tessel::sources
