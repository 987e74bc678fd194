#include "tools/tessel/command_line.h"

#include <CLI/CLI.hpp>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "tools/tessel/client_commands.h"
#include "tools/tessel/defaults_commands.h"
#include "tools/tessel/device_commands.h"
#include "tools/tessel/filter_commands.h"
#include "tools/tessel/import_ical_command.h"
#include "tools/tessel/import_vcard_command.h"
#include "tools/tessel/record_commands.h"
#include "tools/tessel/sync_command.h"
#include "tools/tessel/usage_error.h"

namespace tessel::cli {

using importers::OnFault;
using importers::SyncDeletes;

void addStoreCommands(CLI::App& app, CommandLine& line) {
  auto* init = app.add_subcommand("init", "Create the store (or migrate an existing one)");
  init->callback([&line] {
    line.command = [](CommandContext& context) {
      context.store(StoreOpening::CreateIfMissing);
      context.out() << "store ready: " << context.storePath().string() << '\n';
    };
  });
}

void addRecordCommands(CLI::App& app, CommandLine& line) {
  struct Options {
    std::string putFile;
    std::vector<std::string> deleteIds;
    std::optional<std::string> listEntity;
    bool listJson = false;
  };
  auto options = std::make_shared<Options>();

  auto* records = app.add_subcommand("records", "Records of truth");
  records->require_subcommand(1);

  auto* put = records->add_subcommand(
      "put",
      "Insert or replace records by id from typed JSON Lines; nothing is written unless "
      "every line is valid");
  put->add_option("FILE", options->putFile, "JSON Lines file, or - for standard input")->required();
  put->callback([&line, options] {
    line.command = [options](CommandContext& context) { putRecords(context, options->putFile); };
  });

  auto* del = records->add_subcommand("delete", "Delete records (all or none)");
  del->add_option("ID", options->deleteIds, "Record identifiers")->required();
  del->callback([&line, options] {
    line.command = [options](CommandContext& context) {
      deleteRecords(context, options->deleteIds);
    };
  });

  auto* list = records->add_subcommand("list", "List records: id, entity and a summary");
  list->add_option("--entity", options->listEntity, "Only records of this entity name");
  list->add_flag("--json", options->listJson, "Typed JSON Lines, as records put reads them");
  list->callback([&line, options] {
    line.command = [options](CommandContext& context) {
      listRecords(context, options->listEntity,
                  options->listJson ? ListFormat::TypedJson : ListFormat::Readable);
    };
  });
}

void addImportCommands(CLI::App& app, CommandLine& line) {
  struct Options {
    std::vector<std::string> vcardPaths;
    bool vcardSyncDeletes = false;
    std::vector<std::string> icalPaths;
    ICalImportChoices ical;
    bool icalSyncDeletes = false;
    bool strict = false;
  };
  auto options = std::make_shared<Options>();

  auto* import = app.add_subcommand("import", "Read address books and calendars into truth");
  import->require_subcommand(1);

  auto* vcard = import->add_subcommand(
      "vcard",
      "vCard 2.1, 3.0 and 4.0 files, and folders of .vcf files (vdir); CATEGORIES become "
      "groups. What cannot be read is left out with a warning, and the rest imported");
  vcard->add_option("PATH", options->vcardPaths, ".vcf files or folders")->required();
  vcard->add_flag("--sync-deletes", options->vcardSyncDeletes,
                  "Also delete the records of earlier vCard imports that this one does not "
                  "produce");
  vcard->add_flag("--strict", options->strict,
                  "Import nothing unless every file is valid: the first fault is an error");
  vcard->callback([&line, options] {
    line.command = [options](CommandContext& context) {
      importVCards(context, options->vcardPaths,
                   options->vcardSyncDeletes ? SyncDeletes::On : SyncDeletes::Off,
                   options->strict ? OnFault::Refuse : OnFault::Skip);
    };
  });

  auto* ical = import->add_subcommand(
      "ical",
      "iCalendar (and vCalendar 1.0) files and folders of .ics files (vdir), one calendar per "
      "file or folder. A calendar imported before is found again by its X-WR-RELCALID, else by "
      "its title, also when the file was moved or downloaded again under another name. What "
      "cannot be read is left out with a warning, and the rest imported");
  ical->add_option("PATH", options->icalPaths, ".ics files or folders")->required();
  ical->add_option("--title", options->ical.title,
                   "Title of the calendars, over the one their files give (default: "
                   "X-WR-CALNAME, else the file or folder name)");
  ical->add_option("--calendar", options->ical.calendar,
                   "Import into this calendar of the store (its title, a unique start of it, or "
                   "its identifier)");
  ical->add_flag("--sync-deletes", options->icalSyncDeletes,
                 "Also delete the events and tasks of these calendars that this import does not "
                 "produce");
  ical->add_flag("--strict", options->strict,
                 "Import nothing unless every file is valid: the first fault is an error");
  ical->callback([&line, options] {
    line.command = [options](CommandContext& context) {
      importICalendars(context, options->icalPaths, options->ical,
                       options->icalSyncDeletes ? SyncDeletes::On : SyncDeletes::Off,
                       options->strict ? OnFault::Refuse : OnFault::Skip);
    };
  });
}

void addCalendarCommands(CLI::App& app, CommandLine& line) {
  auto calendarIds = std::make_shared<std::vector<std::string>>();
  auto* calendars = app.add_subcommand("calendars", "Calendars");
  calendars->require_subcommand(1);
  auto* order = calendars->add_subcommand(
      "order",
      "Set the order in which the player lists the calendars: these first, then the others "
      "(it chooses none: that is `client filter ID calendars`)");
  order->add_option("CALENDAR", *calendarIds, "Calendar titles, unique prefixes or identifiers")
      ->required();
  order->callback([&line, calendarIds] {
    line.command = [calendarIds](CommandContext& context) {
      orderCalendars(context, *calendarIds);
    };
  });
  auto* list = calendars->add_subcommand("list", "The calendars in order: identifier and title");
  list->callback(
      [&line] { line.command = [](CommandContext& context) { listCalendars(context); }; });

  auto* groups = app.add_subcommand("groups", "Contact groups");
  groups->require_subcommand(1);
  auto* groupList = groups->add_subcommand("list", "The contact groups: identifier and name");
  groupList->callback(
      [&line] { line.command = [](CommandContext& context) { listGroups(context); }; });
}

namespace {

struct ClientOptions {
  std::string clientId;
  bool withContacts = false;
  bool withoutContacts = false;
  bool withCalendars = false;
  bool withoutCalendars = false;
  bool noDataClasses = false;
  std::optional<std::string> clientName;
  std::string settingKey;
  std::string settingValue;
  bool filterAll = false;
  std::vector<std::string> filterIds;
};

// `client filter contacts` and `client filter calendars`: --all, or the identifiers of what
// the client gets.
void addFilterCommand(CLI::App& filter, CommandLine& line,
                      const std::shared_ptr<ClientOptions>& options, const char* name,
                      FilterDataClass dataClass, const std::string& idsOption,
                      const char* idsHelp) {
  auto* sub = filter.add_subcommand(name, std::string("Select ") + name + " for the client");
  auto* all = sub->add_flag("--all", options->filterAll, std::string("Every one of the ") + name);
  auto* ids = sub->add_option(idsOption, options->filterIds, idsHelp)->delimiter(',');
  all->excludes(ids);
  sub->callback([&line, options, dataClass, idsOption] {
    line.command = [options, dataClass, idsOption](CommandContext& context) {
      if (!options->filterAll && options->filterIds.empty()) {
        throw UsageError(std::string("say --all or ") + idsOption);
      }
      setClientFilter(context, options->clientId, dataClass,
                      options->filterAll
                          ? std::nullopt
                          : std::optional<std::vector<std::string>>(options->filterIds));
    };
  });
}

}  // namespace

void addClientCommands(CLI::App& app, CommandLine& line) {
  auto options = std::make_shared<ClientOptions>();

  auto* client = app.add_subcommand("client", "Sync clients");
  client->require_subcommand(1);

  auto* reg = client->add_subcommand(
      "register",
      "Register a client, or update one: the data classes not mentioned stay as they are");
  reg->add_option("ID", options->clientId, "Client identifier")->required();
  auto* contacts = reg->add_flag("--contacts", options->withContacts, "Sync contacts");
  auto* noContacts =
      reg->add_flag("--no-contacts", options->withoutContacts, "Stop syncing contacts");
  auto* calendars = reg->add_flag("--calendars", options->withCalendars, "Sync calendars");
  auto* noCalendars =
      reg->add_flag("--no-calendars", options->withoutCalendars, "Stop syncing calendars");
  contacts->excludes(noContacts);
  calendars->excludes(noCalendars);
  reg->add_flag("--no-data-classes", options->noDataClasses,
                "Allow a client that syncs nothing (refused otherwise)");
  reg->add_option("--name", options->clientName,
                  "Display name (default: the identifier, or the name it has)");
  reg->callback([&line, options] {
    line.command = [options](CommandContext& context) {
      const auto change = [](bool on, bool off) {
        return on ? DataClassChange::On : off ? DataClassChange::Off : DataClassChange::Keep;
      };
      registerClient(context, options->clientId,
                     change(options->withContacts, options->withoutContacts),
                     change(options->withCalendars, options->withoutCalendars),
                     options->noDataClasses ? EmptyClient::Allowed : EmptyClient::Refused,
                     options->clientName);
    };
  });

  auto* list = client->add_subcommand("list", "The clients: identifier, name, data classes");
  list->callback([&line] { line.command = [](CommandContext& context) { listClients(context); }; });

  auto* show = client->add_subcommand("show", "Settings, filters, mirror size and last session");
  show->add_option("ID", options->clientId, "Client identifier")->required();
  show->callback([&line, options] {
    line.command = [options](CommandContext& context) { showClient(context, options->clientId); };
  });

  std::string settingsHelp =
      "Set a client setting. The settings zetosynctool reads:\n"
      "  SyncContactPicturesEnabled  false leaves contact photos off the player (default: "
      "true when the player says it takes them)\n"
      "  LastModDateForVCF           when the tool last wrote Contacts/Tessel.vcf; it rewrites "
      "the file when the player's copy is newer or missing\n"
      "  DidSyncContactImages        whether that file carries photos; a change of the photo "
      "choice rewrites it\n"
      "  LastSyncToolVersion         the tool version of the last sync; another version "
      "rebuilds the client's filters";
  auto* set = client->add_subcommand("set", settingsHelp);
  set->add_option("ID", options->clientId, "Client identifier")->required();
  set->add_option("KEY", options->settingKey, "Setting key")->required();
  set->add_option("VALUE", options->settingValue,
                  "true, false, an integer, or an ISO date (2026-11-21T10:00:00Z, "
                  "2026-11-21T11:00:00+01:00)")
      ->required();
  set->callback([&line, options] {
    line.command = [options](CommandContext& context) {
      setClientSetting(context, options->clientId, options->settingKey, options->settingValue);
    };
  });

  auto* unset = client->add_subcommand("unset", "Remove a client setting");
  unset->add_option("ID", options->clientId, "Client identifier")->required();
  unset->add_option("KEY", options->settingKey, "Setting key")->required();
  unset->callback([&line, options] {
    line.command = [options](CommandContext& context) {
      unsetClientSetting(context, options->clientId, options->settingKey);
    };
  });

  auto* filter = client->add_subcommand("filter", "Choose what goes to the client's player");
  filter->add_option("ID", options->clientId, "Client identifier")->required();
  filter->require_subcommand(1);
  addFilterCommand(
      *filter, line, options, "contacts", FilterDataClass::Contacts, "--groups",
      "Only the members of these contact groups (names, unique prefixes or identifiers, "
      "comma-separated)");
  addFilterCommand(
      *filter, line, options, "calendars", FilterDataClass::Calendars, "--calendars",
      "Only these calendars (titles, unique prefixes or identifiers, comma-separated)");
}

void addDefaultsCommands(CLI::App& app, CommandLine& line) {
  struct Options {
    std::string key;
    std::string value;
  };
  auto options = std::make_shared<Options>();
  std::string help =
      "zetosynctool's own defaults ($ZETOSYNCTOOL_DEFAULTS, else "
      "$XDG_CONFIG_HOME/zetosynctool/defaults.conf):";
  for (const ToolDefault& known : kToolDefaults) {
    help += std::string("\n  ") + known.key + ": " + known.effect;
  }
  auto* defaults = app.add_subcommand("defaults", help);
  defaults->callback([&line, defaults] {
    if (defaults->get_subcommands().empty()) {
      line.command = [](CommandContext& context) { showDefaults(context); };
    }
  });
  auto* set = defaults->add_subcommand("set", "Set one default to true or false");
  set->add_option("KEY", options->key, "DebugLog, AlwaysSyncContactImages or AlwaysPushVCard")
      ->required();
  set->add_option("VALUE", options->value, "true or false")->required();
  set->callback([&line, options] {
    line.command = [options](CommandContext& context) {
      setDefault(context, options->key, options->value);
    };
  });
  auto* unset = defaults->add_subcommand("unset", "Remove one default (it is then false)");
  unset->add_option("KEY", options->key, "The key")->required();
  unset->callback([&line, options] {
    line.command = [options](CommandContext& context) {
      setDefault(context, options->key, std::nullopt);
    };
  });
}

void addSessionCommands(CLI::App& app, CommandLine& line) {
  auto clientId = std::make_shared<std::string>();
  auto* session = app.add_subcommand("session", "Sync sessions");
  session->require_subcommand(1);
  auto* cancel = session->add_subcommand("cancel", "Cancel the client's running session");
  cancel->add_option("ID", *clientId, "Client identifier")->required();
  cancel->callback([&line, clientId] {
    line.command = [clientId](CommandContext& context) { cancelSession(context, *clientId); };
  });
}

void addDeviceCommands(CLI::App& app, CommandLine& line) {
  auto* devices = app.add_subcommand("devices", "The connected Zeto players and their identifiers");
  devices->callback(
      [&line] { line.command = [](CommandContext& context) { listDevices(context); }; });

  auto watchedClient = std::make_shared<std::optional<std::string>>();
  auto* watch = app.add_subcommand(
      "watch",
      "Show the progress of running syncs; with a client, until its sync ends (exit status: "
      "0 success, 1 cancelled, 2 error, 3 player unavailable)");
  watch->add_option("ID", *watchedClient, "Client identifier");
  watch->callback([&line, watchedClient] {
    line.command = [&line, watchedClient](CommandContext& context) {
      line.status = watchSyncs(context, *watchedClient);
    };
  });

  auto syncedClient = std::make_shared<std::optional<std::string>>();
  auto* sync = app.add_subcommand(
      "sync",
      "Refresh every source, then sync with zetosynctool (beside tessel, else on PATH) the "
      "client's player, or every connected player whose client is registered, one after "
      "another: the progress, one line of outcome per player, and at the end a desktop "
      "notification when a session bus is there. Exit status:\n"
      "  0  synced\n"
      "  1  cancelled\n"
      "  2  failed (also: no such client, no zetosynctool, no store)\n"
      "  3  player unavailable (not connected, not mounted, or in another sync)\n"
      "     of several players, the highest of theirs\n"
      "  4  synced, but a source could not be refreshed\n"
      "  5  no registered player is connected");
  sync->add_option("ID", *syncedClient, "Client identifier (default: every connected player's)");
  sync->callback([&line, syncedClient] {
    line.command = [&line, syncedClient](CommandContext& context) {
      line.status = syncPlayers(context, *syncedClient);
    };
  });
}

}  // namespace tessel::cli
