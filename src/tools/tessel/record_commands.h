#pragma once

#include <optional>
#include <string>
#include <vector>

#include "tools/tessel/command_context.h"

namespace tessel::cli {

enum class ListFormat { Readable, TypedJson };

// `records put FILE`: inserts or replaces records by identifier from typed JSON Lines ("-"
// reads standard input). The whole file is read and checked before the store is opened, and
// written in one transaction, so a fault anywhere changes nothing.
void putRecords(CommandContext& context, const std::string& file);

// `records delete ID...`: all or nothing; an unknown identifier fails the command.
void deleteRecords(CommandContext& context, const std::vector<std::string>& identifiers);

// `records list`: one line per record, in identifier order. Readable lines are
// "id<TAB>entity<TAB>summary"; TypedJson lines are what `records put` reads back.
void listRecords(CommandContext& context, const std::optional<std::string>& entityName,
                 ListFormat format);

// `calendars order CALENDAR...`: the store's one CalendarOrder record lists every calendar,
// the named ones (names, unique prefixes or identifiers) first. It orders; it selects nothing.
void orderCalendars(CommandContext& context, const std::vector<std::string>& calendars);

// `calendars list` and `groups list`: identifier and name, one a line; calendars in order.
void listCalendars(CommandContext& context);
void listGroups(CommandContext& context);

}  // namespace tessel::cli
