#pragma once

#include <optional>
#include <string>

#include "tools/tessel/command_context.h"

namespace tessel::cli {

// Which data classes a registered client syncs; each brings all its entities.
enum class ContactsSync { Off, On };
enum class CalendarsSync { Off, On };

// `client register ID`: registers the client, or updates the name and data classes of an
// existing one (its settings, filters and mirror stay). The name defaults to the identifier.
void registerClient(CommandContext& context, const std::string& identifier, ContactsSync contacts,
                    CalendarsSync calendars, const std::optional<std::string>& displayName);

// `client show ID`: name, entities, settings, filters, mirror size and last session.
void showClient(CommandContext& context, const std::string& identifier);

// `client set ID KEY VALUE`: VALUE is read by parseSettingValue (UsageError otherwise).
void setClientSetting(CommandContext& context, const std::string& identifier,
                      const std::string& key, const std::string& value);
// `client unset ID KEY`: fails when the key is not set, so that a mistyped key is noticed.
void unsetClientSetting(CommandContext& context, const std::string& identifier,
                        const std::string& key);

// `session cancel ID`: cancels the client's running session, in whichever process it runs.
void cancelSession(CommandContext& context, const std::string& identifier);

}  // namespace tessel::cli
