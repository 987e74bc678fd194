#pragma once

#include <functional>

#include "tools/tessel/command_context.h"

namespace CLI {
class App;
}

namespace tessel::cli {

// What the command line asked for: the command to run once the whole line is parsed (so that
// a usage error runs nothing), and the exit status it leaves.
struct CommandLine {
  std::function<void(CommandContext&)> command;
  int status = 0;
};

// Each adds one group of subcommands to the `tessel` command line; their callbacks fill in
// `line`. The option values live as long as `app`.
void addStoreCommands(CLI::App& app, CommandLine& line);     // init
void addRecordCommands(CLI::App& app, CommandLine& line);    // records put, delete, list
void addImportCommands(CLI::App& app, CommandLine& line);    // import vcard, ical
void addCalendarCommands(CLI::App& app, CommandLine& line);  // calendars order
void addClientCommands(CLI::App& app, CommandLine& line);    // client ..., client filter ...
void addSessionCommands(CLI::App& app, CommandLine& line);   // session cancel
void addDefaultsCommands(CLI::App& app, CommandLine& line);  // defaults [set|unset]
void addDeviceCommands(CLI::App& app, CommandLine& line);    // devices, watch, sync
void addSourceCommands(CLI::App& app, CommandLine& line);    // source ..., refresh

}  // namespace tessel::cli
