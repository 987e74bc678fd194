#pragma once

#include <optional>
#include <string>

#include "tools/tessel/command_context.h"

namespace tessel::cli {

// What `client register` says of one data class; each brings all its entities. Keep leaves an
// existing client's choice as it is (and is off for a new client).
enum class DataClassChange { Keep, On, Off };
// Whether a client for no data class at all is wanted (`--no-data-classes`).
enum class EmptyClient { Refused, Allowed };

// `client register ID`: registers the client, or updates the name and the data classes named
// of an existing one (the others, its settings, filters and mirror stay). The name defaults to
// the identifier, or to the existing client's name. A client left with no data class is refused
// unless `empty` allows it.
void registerClient(CommandContext& context, const std::string& identifier,
                    DataClassChange contacts, DataClassChange calendars, EmptyClient empty,
                    const std::optional<std::string>& displayName);

// `client list`: identifier, name and data classes of each client, one a line.
void listClients(CommandContext& context);

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
