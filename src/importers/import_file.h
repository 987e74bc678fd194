#pragma once

#include <filesystem>
#include <string>

namespace tessel::importers {

// The bytes of a file to import; ImportError under `name` (the path as the user wrote it,
// or as messages give it) when it is a folder or cannot be read.
std::string readImportFile(const std::filesystem::path& file, const std::string& name);

}  // namespace tessel::importers
