#pragma once

#include <optional>
#include <string>

#include "tools/tessel/command_context.h"

namespace tessel::cli {

// The keys zetosynctool reads from its own defaults file, with what each does.
struct ToolDefault {
  const char* key;
  const char* effect;
};
inline constexpr ToolDefault kToolDefaults[] = {
    {"DebugLog", "a detailed log of every step"},
    {"AlwaysSyncContactImages", "photos go to the player even if it does not say it takes them"},
    {"AlwaysPushVCard", "the contacts file is rewritten on every sync"},
};

// `defaults`: the file zetosynctool reads ($ZETOSYNCTOOL_DEFAULTS, else
// $XDG_CONFIG_HOME/zetosynctool/defaults.conf) and each key's value.
void showDefaults(CommandContext& context);
// `defaults set KEY true|false` and `defaults unset KEY`: one line `KEY = value` of that file,
// the other lines kept; the file is replaced whole, never half-written.
void setDefault(CommandContext& context, const std::string& key,
                const std::optional<std::string>& value);

}  // namespace tessel::cli
