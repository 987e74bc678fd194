#pragma once

#include <filesystem>
#include <string>
#include <string_view>
#include <system_error>

namespace zt::platform {

// "Cannot <action> <path>: <the system's text for the error number>", the description that
// file operations answer and that log lines print as the reason.
inline std::string errorText(std::string_view action, const std::filesystem::path& path,
                             int errorNumber) {
  return "Cannot " + std::string(action) + " " + path.string() + ": " +
         std::generic_category().message(errorNumber);
}

}  // namespace zt::platform
