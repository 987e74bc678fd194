#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/value.h"

namespace tessel::cli {

// The text forms of client settings on the command line.
//
// Reads "true"/"false" (a boolean number), a decimal integer (64-bit), or an ISO 8601 date
// with seconds and a zone designator: "2026-11-21T10:00:00Z", "2026-11-21T10:00:00+01:00",
// optionally with a fraction of a second. Nothing for any other text.
std::optional<zt::platform::Value> parseSettingValue(std::string_view text);

// The same forms for showing a setting: dates in their own zone's offset ("Z" for GMT and
// UTC); values of kinds the command line cannot give (strings, data...) in typed JSON.
std::string formatSettingValue(const zt::platform::Value& value);

}  // namespace tessel::cli
