#include "tools/tessel/defaults_commands.h"

#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <ostream>
#include <sstream>
#include <stdexcept>
#include <string_view>
#include <vector>

#include "platform/user_defaults.h"
#include "tools/tessel/usage_error.h"

namespace tessel::cli {

namespace fs = std::filesystem;

namespace {

std::string trimmed(std::string_view text) {
  const auto first = text.find_first_not_of(" \t");
  if (first == std::string_view::npos) return {};
  const auto last = text.find_last_not_of(" \t\r");
  return std::string(text.substr(first, last - first + 1));
}

std::string knownKeys() {
  std::string keys;
  for (const ToolDefault& known : kToolDefaults)
    keys += (keys.empty() ? "" : ", ") + std::string(known.key);
  return keys;
}

}  // namespace

void showDefaults(CommandContext& context) {
  const fs::path path = zt::platform::UserDefaults::pathFromEnvironment();
  const zt::platform::UserDefaults defaults = zt::platform::UserDefaults::fromFile(path);
  context.out() << "file: " << path.string() << '\n';
  for (const ToolDefault& known : kToolDefaults) {
    const std::optional<bool> value = defaults.boolForKey(known.key);
    context.out() << known.key << " = " << (value ? (*value ? "true" : "false") : "(unset: false)")
                  << "\t# " << known.effect << '\n';
  }
}

void setDefault(CommandContext& context, const std::string& key,
                const std::optional<std::string>& value) {
  bool known = false;
  for (const ToolDefault& tool : kToolDefaults) known = known || key == tool.key;
  if (!known) throw UsageError("\"" + key + "\" is not a default of zetosynctool: " + knownKeys());
  if (value && !zt::platform::UserDefaults::fromText("k = " + *value).boolForKey("k")) {
    throw UsageError("the value of " + key + " is true or false, not \"" + *value + "\"");
  }
  const fs::path path = zt::platform::UserDefaults::pathFromEnvironment();
  std::vector<std::string> lines;
  {
    std::ifstream in(path);
    for (std::string line; std::getline(in, line);) {
      const auto equals = line.find('=');
      const std::string lineKey = trimmed(std::string_view(line).substr(0, equals));
      if (equals != std::string::npos && lineKey == key) continue;
      lines.push_back(line);
    }
  }
  if (value) lines.push_back(key + " = " + *value);

  std::error_code error;
  if (path.has_parent_path()) fs::create_directories(path.parent_path(), error);
  const fs::path temporary = path.string() + ".tessel-" + std::to_string(::getpid());
  {
    std::ofstream out(temporary, std::ios::trunc);
    for (const std::string& line : lines) out << line << '\n';
    out.flush();
    if (!out) {
      fs::remove(temporary, error);
      throw std::runtime_error("cannot write " + temporary.string() + ": " + std::strerror(errno));
    }
  }
  fs::rename(temporary, path, error);
  if (error) {
    fs::remove(temporary, error);
    throw std::runtime_error("cannot replace " + path.string() + ": " + error.message());
  }
  context.out() << path.string() << ": " << key << (value ? " = " + *value : " unset") << '\n';
}

}  // namespace tessel::cli
