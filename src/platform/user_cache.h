#pragma once

#include <string>

#include "platform/folder_handle.h"
#include "platform/result.h"

namespace zt::platform {

// The tool's folder `name` for kept results, $XDG_CACHE_HOME/zetosynctool/<name> (or
// ~/.cache/...), created when missing; an error when neither variable names an absolute
// folder or the folder cannot be opened or made.
Result<FolderHandle> openUserCacheFolder(const std::string& name);

}  // namespace zt::platform
