#include "importers/import_file.h"

#include <cerrno>
#include <cstring>
#include <fstream>
#include <optional>
#include <sstream>
#include <system_error>

#include "importers/import_error.h"

namespace tessel::importers {

std::string readImportFile(const std::filesystem::path& file, const std::string& name) {
  std::error_code error;
  if (std::filesystem::is_directory(file, error)) {
    throw ImportError(name, std::nullopt, "cannot read: it is a folder");
  }
  std::ifstream in(file, std::ios::binary);
  if (!in) {
    throw ImportError(name, std::nullopt, std::string("cannot read: ") + std::strerror(errno));
  }
  std::ostringstream text;
  text << in.rdbuf();
  if (in.bad()) throw ImportError(name, std::nullopt, "cannot read");
  return std::move(text).str();
}

}  // namespace tessel::importers
