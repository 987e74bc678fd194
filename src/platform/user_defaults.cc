#include "platform/user_defaults.h"

#include <pwd.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <fstream>
#include <sstream>

#include "platform/ascii.h"
#include "platform/log.h"

namespace zt::platform {
namespace {

bool isBlank(char c) {
  return c == ' ' || c == '\t' || c == '\r' || c == '\f' || c == '\v';
}

std::string_view trim(std::string_view text) {
  while (!text.empty() && isBlank(text.front())) text.remove_prefix(1);
  while (!text.empty() && isBlank(text.back())) text.remove_suffix(1);
  return text;
}

// A "#" inside a value is kept unless a blank comes before it, so `Key = a#b` is "a#b".
std::string_view withoutComment(std::string_view line) {
  for (std::size_t i = 0; i < line.size(); ++i)
    if (line[i] == '#' && (i == 0 || isBlank(line[i - 1]))) return line.substr(0, i);
  return line;
}

const char* nonEmptyEnvironment(const char* name) {
  const char* value = std::getenv(name);
  return value != nullptr && *value != '\0' ? value : nullptr;
}

std::filesystem::path homeFolder() {
  if (const char* home = nonEmptyEnvironment("HOME")) return home;
  if (const passwd* account = ::getpwuid(::getuid()); account && account->pw_dir)
    return account->pw_dir;
  return "/";
}

}  // namespace

const UserDefaults& UserDefaults::standard() {
  static const UserDefaults defaults = fromFile(pathFromEnvironment());
  return defaults;
}

std::filesystem::path UserDefaults::pathFromEnvironment() {
  if (const char* explicitPath = nonEmptyEnvironment("ZETOSYNCTOOL_DEFAULTS")) return explicitPath;
  std::filesystem::path configHome;
  if (const char* xdg = nonEmptyEnvironment("XDG_CONFIG_HOME"); xdg && xdg[0] == '/')
    configHome = xdg;
  else
    configHome = homeFolder() / ".config";
  return configHome / "zetosynctool" / "defaults.conf";
}

UserDefaults UserDefaults::fromFile(const std::filesystem::path& path) {
  std::ifstream file(path, std::ios::binary);
  if (!file) return UserDefaults();
  std::ostringstream text;
  // A folder opens but reads as nothing, so it holds no defaults either.
  text << file.rdbuf();
  return fromText(text.str());
}

UserDefaults UserDefaults::fromText(std::string_view text) {
  UserDefaults defaults;
  while (!text.empty()) {
    const std::size_t end = text.find('\n');
    std::string_view line = text.substr(0, end);
    text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);

    line = trim(withoutComment(line));
    if (line.empty()) continue;
    const std::size_t equals = line.find('=');
    const std::string_view key = trim(line.substr(0, equals));
    if (equals == std::string_view::npos || key.empty()) {
      Log::debug("Ignoring user defaults line without a key and a value: %@", line);
      continue;
    }
    defaults.values_.insert_or_assign(std::string(key), std::string(trim(line.substr(equals + 1))));
  }
  return defaults;
}

std::optional<bool> UserDefaults::boolForKey(std::string_view key) const {
  const auto found = values_.find(key);
  if (found == values_.end()) return std::nullopt;
  const std::string value = lowerAscii(found->second);
  if (value == "true" || value == "yes" || value == "1") return true;
  if (value == "false" || value == "no" || value == "0") return false;
  Log::debug("User default %@ is not a boolean: %@", key, found->second);
  return std::nullopt;
}

std::optional<std::string> UserDefaults::stringForKey(std::string_view key) const {
  const auto found = values_.find(key);
  if (found == values_.end()) return std::nullopt;
  return found->second;
}

}  // namespace zt::platform
