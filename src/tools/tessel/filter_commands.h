#pragma once

#include <optional>
#include <string>
#include <vector>

#include "tools/tessel/command_context.h"

namespace tessel::cli {

enum class FilterDataClass { Contacts, Calendars };

// `client filter ID contacts|calendars (--all | --groups|--calendars ID,...)`: stores the
// player's selection as the tool's own filter, replacing an earlier filter of that data class
// and keeping every other filter. `selection` absent selects everything; otherwise every
// identifier must be a contact group (or a calendar) of the store.
void setClientFilter(CommandContext& context, const std::string& identifier,
                     FilterDataClass dataClass,
                     const std::optional<std::vector<std::string>>& selection);

}  // namespace tessel::cli
