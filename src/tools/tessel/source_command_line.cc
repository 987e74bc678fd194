// The `source` and `refresh` commands of the `tessel` command line.

#include <CLI/CLI.hpp>
#include <memory>
#include <optional>
#include <string>

#include "tools/tessel/command_line.h"
#include "tools/tessel/refresh_command.h"
#include "tools/tessel/source_commands.h"

namespace tessel::cli {

void addSourceCommands(CLI::App& app, CommandLine& line) {
  struct Options {
    std::string location;
    bool calendar = false;
    bool addressBook = false;
    std::optional<std::string> title;
    std::optional<std::string> credentials;
    std::optional<std::string> user;
    bool secretService = false;
    bool lenient = false;
    std::string removed;
  };
  auto options = std::make_shared<Options>();

  auto* source = app.add_subcommand(
      "source",
      "Where contacts and calendars come from, kept current elsewhere: files, vdir folders and "
      "collections on servers (kept in $XDG_CONFIG_HOME/tessel/sources.json)");
  source->require_subcommand(1);

  auto* add = source->add_subcommand(
      "add",
      "Add a .vcf or .ics file, a vdir folder (one .vcf or .ics per item), or the http(s):// or "
      "webcal:// address of a collection (a Nextcloud ?export link, a Radicale collection, a "
      "calendar's secret iCal address)");
  add->add_option("LOCATION", options->location, "File, folder or address")->required();
  auto* calendar = add->add_flag("--calendar", options->calendar,
                                 "It holds one calendar (default: read from it)");
  add->add_flag("--address-book", options->addressBook, "It holds contacts")->excludes(calendar);
  add->add_option(
      "--title", options->title,
      "Title of the calendar, over the name the source gives it; a label for an address book");
  auto* credentials =
      add->add_option("--credentials", options->credentials,
                      "File whose first line is USER:PASSWORD for the address (chmod 600)");
  auto* user = add->add_option("--user", options->user,
                               "User name on the server, whose password the desktop's secret "
                               "service keeps (with --secret-service)");
  auto* secretService = add->add_flag(
      "--secret-service", options->secretService,
      "Ask the desktop's secret service for the password of --user at each refresh (store it "
      "with: secret-tool store --label=LABEL xdg:schema org.zeto.tessel.Source user USER server "
      "HOST[:PORT])");
  user->needs(secretService)->excludes(credentials);
  secretService->needs(user)->excludes(credentials);
  add->add_flag("--lenient", options->lenient,
                "Read it as `tessel import` does: a fault costs only what cannot be read, with a "
                "warning (default: the source keeps what it brought before, and the refresh says "
                "why)");
  add->callback([&line, options] {
    line.command = [options](CommandContext& context) {
      std::optional<sources::Collection> collection;
      if (options->calendar) collection = sources::Collection::Calendar;
      if (options->addressBook) collection = sources::Collection::AddressBook;
      addSource(context, options->location, collection, options->title, options->credentials,
                options->user,
                options->lenient ? importers::OnFault::Skip : importers::OnFault::Refuse);
    };
  });

  auto* list = source->add_subcommand("list", "The sources: identifier, collection, location");
  list->callback([&line] { line.command = [](CommandContext& context) { listSources(context); }; });

  auto* remove =
      source->add_subcommand("remove", "Forget a source (what it brought stays in the store)");
  remove->add_option("SOURCE", options->removed, "Identifier or location")->required();
  remove->callback([&line, options] {
    line.command = [options](CommandContext& context) { removeSource(context, options->removed); };
  });

  auto* refresh = app.add_subcommand(
      "refresh",
      "Bring every source into the store: what left a source leaves the store; a source that "
      "cannot be read keeps what it brought before, and the exit status is 1");
  refresh->callback([&line] {
    line.command = [&line](CommandContext& context) {
      const RefreshOutcome outcome = refreshSources(context);
      if (outcome.sources == 0)
        context.out() << "no sources to refresh (tessel source add LOCATION adds one)\n";
      if (!outcome.ok()) line.status = 1;
    };
  });
}

}  // namespace tessel::cli
