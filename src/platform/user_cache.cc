#include "platform/user_cache.h"

#include <cstdlib>
#include <filesystem>
#include <system_error>

namespace zt::platform {

Result<FolderHandle> openUserCacheFolder(const std::string& name) {
  std::filesystem::path base;
  const char* xdg = std::getenv("XDG_CACHE_HOME");
  const char* home = std::getenv("HOME");
  if (xdg && xdg[0] == '/') {
    base = xdg;
  } else if (home && home[0] == '/') {
    base = std::filesystem::path(home) / ".cache";
  } else {
    return Error{"Neither $XDG_CACHE_HOME nor $HOME names an absolute folder"};
  }
  Result<FolderHandle> opened = FolderHandle::open(base);
  if (!opened) {
    std::error_code ignored;
    if (!std::filesystem::create_directories(base, ignored)) return opened;
    opened = FolderHandle::open(base);
  }
  if (!opened) return opened;
  Result<FolderHandle> tool = opened->openChild("zetosynctool", IfMissing::Create);
  if (!tool) return tool;
  return tool->openChild(name, IfMissing::Create);
}

}  // namespace zt::platform
