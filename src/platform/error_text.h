#pragma once

#include <filesystem>
#include <string>
#include <string_view>
#include <system_error>

#include "platform/result.h"

namespace zt::platform {

// "Cannot <action> <path>: <the system's text for the error number>", the description that
// file operations answer and that log lines print as the reason.
inline Error errorText(std::string_view action, const std::filesystem::path& path,
                       int errorNumber) {
  return Error{"Cannot " + std::string(action) + " " + path.string() + ": " +
               std::generic_category().message(errorNumber)};
}

}  // namespace zt::platform
