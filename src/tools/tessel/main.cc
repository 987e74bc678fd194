// `tessel`: the sync engine's command. This file only wires the command groups of
// command_line.cc into one command line and runs what it asks for; failures become a
// "tessel: ..." line on standard error.

#include <CLI/CLI.hpp>
#include <exception>
#include <filesystem>
#include <iostream>
#include <optional>
#include <string>

#include "filters/filter_classes.h"
#include "tessel/exception.h"
#include "tools/tessel/command_context.h"
#include "tools/tessel/command_line.h"
#include "tools/tessel/usage_error.h"

namespace {

constexpr int kFailure = 1;
constexpr int kUsage = 2;

int fail(int status, const std::string& message) {
  std::cerr << "tessel: " << message << '\n';
  return status;
}

}  // namespace

int main(int argc, char** argv) {
  using namespace tessel::cli;
  // The desktop application knows the tool's filters, so its stand-in shows them decoded.
  zt::filters::registerFilterClasses();

  CLI::App app{"The Tessel sync engine's command: its store of records and sync clients.",
               "tessel"};
  app.require_subcommand(1);
  app.set_version_flag("--version", "tessel " ZT_PROJECT_VERSION);

  std::optional<std::string> storePath;
  app.add_option("--store", storePath,
                 "Store file (default: $TESSEL_STORE, else $XDG_DATA_HOME/tessel/truth.db)");

  CommandLine line;
  addStoreCommands(app, line);
  addRecordCommands(app, line);
  addImportCommands(app, line);
  addCalendarCommands(app, line);
  addClientCommands(app, line);
  addSessionCommands(app, line);
  addDeviceCommands(app, line);
  addDefaultsCommands(app, line);
  addSourceCommands(app, line);

  try {
    app.parse(argc, argv);
  } catch (const CLI::CallForHelp& e) {
    return app.exit(e);
  } catch (const CLI::CallForAllHelp& e) {
    return app.exit(e);
  } catch (const CLI::CallForVersion& e) {
    return app.exit(e);
  } catch (const CLI::ParseError& e) {
    return fail(kUsage, std::string(e.what()) + "\nRun with --help for more information.");
  }

  try {
    CommandContext context(
        storePath ? std::optional<std::filesystem::path>(*storePath) : std::nullopt, std::cin,
        std::cout);
    if (line.command) line.command(context);
    std::cout.flush();
    if (!std::cout) return fail(kFailure, "cannot write to standard output");
    return line.status;
  } catch (const UsageError& e) {
    return fail(kUsage, e.what());
  } catch (const tessel::Exception& e) {
    return fail(kFailure, e.reason().empty() ? e.name() : e.reason());
  } catch (const std::exception& e) {
    return fail(kFailure, e.what());
  } catch (...) {
    return fail(kFailure, "unexpected failure");
  }
}
