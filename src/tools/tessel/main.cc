// `tessel`: the sync engine's command. This file only reads the command line and hands each
// command to tessel_cli; failures become a "tessel: ..." line on standard error.

#include <CLI/CLI.hpp>
#include <exception>
#include <filesystem>
#include <functional>
#include <iostream>
#include <optional>
#include <string>
#include <vector>

#include "filters/filter_classes.h"
#include "tessel/exception.h"
#include "tools/tessel/client_commands.h"
#include "tools/tessel/command_context.h"
#include "tools/tessel/device_commands.h"
#include "tools/tessel/filter_commands.h"
#include "tools/tessel/import_ical_command.h"
#include "tools/tessel/import_vcard_command.h"
#include "tools/tessel/record_commands.h"
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

  std::optional<std::string> storePath;
  app.add_option("--store", storePath,
                 "Store file (default: $TESSEL_STORE, else $XDG_DATA_HOME/tessel/truth.db)");

  // Commands run after the whole line is parsed, so that a usage error runs nothing.
  std::function<void(CommandContext&)> command;

  auto* init = app.add_subcommand("init", "Create the store (or migrate an existing one)");
  init->callback([&] {
    command = [](CommandContext& context) {
      context.store(tessel::StoreOpening::CreateIfMissing);
      context.out() << "store ready: " << context.storePath().string() << '\n';
    };
  });

  auto* records = app.add_subcommand("records", "Records of truth");
  records->require_subcommand(1);

  std::string putFile;
  auto* put = records->add_subcommand(
      "put",
      "Insert or replace records by id from typed JSON Lines; nothing is written unless "
      "every line is valid");
  put->add_option("FILE", putFile, "JSON Lines file, or - for standard input")->required();
  put->callback([&] { command = [&](CommandContext& context) { putRecords(context, putFile); }; });

  std::vector<std::string> deleteIds;
  auto* del = records->add_subcommand("delete", "Delete records (all or none)");
  del->add_option("ID", deleteIds, "Record identifiers")->required();
  del->callback(
      [&] { command = [&](CommandContext& context) { deleteRecords(context, deleteIds); }; });

  std::optional<std::string> listEntity;
  bool listJson = false;
  auto* list = records->add_subcommand("list", "List records: id, entity and a summary");
  list->add_option("--entity", listEntity, "Only records of this entity name");
  list->add_flag("--json", listJson, "Typed JSON Lines, as records put reads them");
  list->callback([&] {
    command = [&](CommandContext& context) {
      listRecords(context, listEntity, listJson ? ListFormat::TypedJson : ListFormat::Readable);
    };
  });

  auto* import = app.add_subcommand("import", "Read address books and calendars into truth");
  import->require_subcommand(1);

  std::vector<std::string> vcardPaths;
  bool vcardSyncDeletes = false;
  auto* vcard = import->add_subcommand(
      "vcard",
      "vCard 2.1, 3.0 and 4.0 files, and folders of .vcf files (vdir); CATEGORIES become "
      "groups. Nothing is imported unless every file is valid");
  vcard->add_option("PATH", vcardPaths, ".vcf files or folders")->required();
  vcard->add_flag("--sync-deletes", vcardSyncDeletes,
                  "Also delete the records of earlier vCard imports that this one does not "
                  "produce");
  vcard->callback([&] {
    command = [&](CommandContext& context) {
      importVCards(context, vcardPaths,
                   vcardSyncDeletes ? tessel::importers::SyncDeletes::On
                                    : tessel::importers::SyncDeletes::Off);
    };
  });

  std::vector<std::string> icalPaths;
  std::optional<std::string> icalTitle;
  bool icalSyncDeletes = false;
  auto* ical = import->add_subcommand(
      "ical",
      "iCalendar files and folders of .ics files (vdir), one calendar per file or folder. "
      "Nothing is imported unless every file is valid");
  ical->add_option("PATH", icalPaths, ".ics files or folders")->required();
  ical->add_option("--title", icalTitle,
                   "Title of calendars whose source names none (default: the file name)");
  ical->add_flag("--sync-deletes", icalSyncDeletes,
                 "Also delete the records of these calendars that this import does not produce");
  ical->callback([&] {
    command = [&](CommandContext& context) {
      importICalendars(context, icalPaths, icalTitle,
                       icalSyncDeletes ? tessel::importers::SyncDeletes::On
                                       : tessel::importers::SyncDeletes::Off);
    };
  });

  auto* calendars = app.add_subcommand("calendars", "Calendars");
  calendars->require_subcommand(1);
  std::vector<std::string> calendarIds;
  auto* order = calendars->add_subcommand("order", "Set the order of the calendars");
  order->add_option("ID", calendarIds, "Calendar identifiers in order")->required();
  order->callback(
      [&] { command = [&](CommandContext& context) { orderCalendars(context, calendarIds); }; });

  auto* client = app.add_subcommand("client", "Sync clients");
  client->require_subcommand(1);

  std::string clientId;
  bool withContacts = false;
  bool withCalendars = false;
  std::optional<std::string> clientName;
  auto* reg = client->add_subcommand("register", "Register a client, or update one");
  reg->add_option("ID", clientId, "Client identifier")->required();
  reg->add_flag("--contacts", withContacts, "Sync contacts");
  reg->add_flag("--calendars", withCalendars, "Sync calendars");
  reg->add_option("--name", clientName, "Display name (default: the identifier)");
  reg->callback([&] {
    command = [&](CommandContext& context) {
      registerClient(context, clientId, withContacts ? ContactsSync::On : ContactsSync::Off,
                     withCalendars ? CalendarsSync::On : CalendarsSync::Off, clientName);
    };
  });

  auto* show = client->add_subcommand("show", "Settings, filters, mirror size and last session");
  show->add_option("ID", clientId, "Client identifier")->required();
  show->callback(
      [&] { command = [&](CommandContext& context) { showClient(context, clientId); }; });

  std::string settingKey;
  std::string settingValue;
  auto* set = client->add_subcommand("set", "Set a client setting");
  set->add_option("ID", clientId, "Client identifier")->required();
  set->add_option("KEY", settingKey, "Setting key")->required();
  set->add_option("VALUE", settingValue,
                  "true, false, an integer, or an ISO date (2026-11-21T10:00:00Z, "
                  "2026-11-21T11:00:00+01:00)")
      ->required();
  set->callback([&] {
    command = [&](CommandContext& context) {
      setClientSetting(context, clientId, settingKey, settingValue);
    };
  });

  auto* unset = client->add_subcommand("unset", "Remove a client setting");
  unset->add_option("ID", clientId, "Client identifier")->required();
  unset->add_option("KEY", settingKey, "Setting key")->required();
  unset->callback([&] {
    command = [&](CommandContext& context) { unsetClientSetting(context, clientId, settingKey); };
  });

  auto* filter = client->add_subcommand("filter", "Choose what goes to the client's player");
  filter->add_option("ID", clientId, "Client identifier")->required();
  filter->require_subcommand(1);
  bool filterAll = false;
  std::vector<std::string> filterIds;
  auto addFilterCommand = [&](const char* name, FilterDataClass dataClass,
                              const std::string& idsOption, const char* idsHelp) {
    auto* sub = filter->add_subcommand(name, std::string("Select ") + name + " for the client");
    auto* all = sub->add_flag("--all", filterAll, std::string("Every one of the ") + name);
    auto* ids = sub->add_option(idsOption, filterIds, idsHelp)->delimiter(',');
    all->excludes(ids);
    sub->callback([&, dataClass, idsOption] {
      command = [&, dataClass, idsOption](CommandContext& context) {
        if (!filterAll && filterIds.empty()) {
          throw UsageError(std::string("say --all or ") + idsOption);
        }
        setClientFilter(
            context, clientId, dataClass,
            filterAll ? std::nullopt : std::optional<std::vector<std::string>>(filterIds));
      };
    });
  };
  addFilterCommand("contacts", FilterDataClass::Contacts, "--groups",
                   "Only the members of these contact groups (identifiers, comma-separated)");
  addFilterCommand("calendars", FilterDataClass::Calendars, "--calendars",
                   "Only these calendars (identifiers, comma-separated)");

  auto* session = app.add_subcommand("session", "Sync sessions");
  session->require_subcommand(1);
  auto* cancel = session->add_subcommand("cancel", "Cancel the client's running session");
  cancel->add_option("ID", clientId, "Client identifier")->required();
  cancel->callback(
      [&] { command = [&](CommandContext& context) { cancelSession(context, clientId); }; });

  auto* devices = app.add_subcommand("devices", "The connected Zeto players and their identifiers");
  devices->callback([&] { command = [](CommandContext& context) { listDevices(context); }; });

  std::optional<std::string> watchedClient;
  int commandStatus = 0;
  auto* watch = app.add_subcommand(
      "watch",
      "Show the progress of running syncs; with a client, until its sync ends (exit status: "
      "0 success, 1 cancelled, 2 error, 3 player unavailable)");
  watch->add_option("ID", watchedClient, "Client identifier");
  watch->callback([&] {
    command = [&](CommandContext& context) { commandStatus = watchSyncs(context, watchedClient); };
  });

  try {
    app.parse(argc, argv);
  } catch (const CLI::CallForHelp& e) {
    return app.exit(e);
  } catch (const CLI::CallForAllHelp& e) {
    return app.exit(e);
  } catch (const CLI::ParseError& e) {
    return fail(kUsage, std::string(e.what()) + "\nRun with --help for more information.");
  }

  try {
    CommandContext context(
        storePath ? std::optional<std::filesystem::path>(*storePath) : std::nullopt, std::cin,
        std::cout);
    if (command) command(context);
    std::cout.flush();
    if (!std::cout) return fail(kFailure, "cannot write to standard output");
    return commandStatus;
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
