#pragma once

#include <filesystem>
#include <map>
#include <optional>
#include <string>
#include <string_view>

namespace zt::platform {

// The tool's own user defaults: a text file of `Key = value` lines. Blank lines and lines
// starting with "#" are ignored, as is the rest of a line after a "#" that follows a space.
// Keys are case-sensitive; a key given twice keeps its last value. A missing or unreadable
// file holds no defaults at all.
class UserDefaults {
 public:
  // The tool's defaults, read from pathFromEnvironment() at the first call, once per process.
  static const UserDefaults& standard();

  // $ZETOSYNCTOOL_DEFAULTS, else $XDG_CONFIG_HOME/zetosynctool/defaults.conf, else
  // $HOME/.config/zetosynctool/defaults.conf (the home folder of the user's account when
  // $HOME is unset). Empty or relative XDG_CONFIG_HOME is ignored, as XDG asks.
  static std::filesystem::path pathFromEnvironment();

  static UserDefaults fromFile(const std::filesystem::path& path);
  static UserDefaults fromText(std::string_view text);

  // true/yes/1 and false/no/0, in any case. A key whose value is none of these is absent
  // (and says so in a debug line).
  std::optional<bool> boolForKey(std::string_view key) const;
  std::optional<std::string> stringForKey(std::string_view key) const;

 private:
  UserDefaults() = default;

  std::map<std::string, std::string, std::less<>> values_;
};

}  // namespace zt::platform
