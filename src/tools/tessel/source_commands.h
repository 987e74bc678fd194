#pragma once

#include <optional>
#include <string>

#include "sources/source.h"
#include "tools/tessel/command_context.h"

namespace tessel::cli {

// `tessel source add LOCATION`: a file, a vdir folder, or the http(s) or webcal address of a
// collection. What it holds is `collection` when given, else read from it (a download for an
// address). An address carries no password: `credentialsFile` names a file with USER:PASSWORD
// that only its owner can read, or `secretServiceUser` the user whose password for the
// address's server the desktop's secret service keeps; either is read here once, so that a
// password that cannot be had fails now rather than at every refresh. Prints "source N:
// <collection> LOCATION".
// With OnFault::Skip (--lenient) a fault in its text costs only what cannot be read, with a
// warning, as `tessel import` reads; else the whole refresh of the source.
void addSource(CommandContext& context, const std::string& location,
               std::optional<sources::Collection> collection,
               const std::optional<std::string>& title,
               const std::optional<std::string>& credentialsFile,
               const std::optional<std::string>& secretServiceUser, importers::OnFault onFault);

// `tessel source list`: one line per source, "ID<TAB>collection<TAB>LOCATION", then its title
// and where its password comes from (a credentials file, or "secret service, user USER at
// SERVER"; never the password) when it has them.
void listSources(CommandContext& context);

// `tessel source remove ID|LOCATION`: forgets the source. What it brought stays in the store.
void removeSource(CommandContext& context, const std::string& source);

}  // namespace tessel::cli
