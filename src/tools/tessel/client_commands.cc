#include "tools/tessel/client_commands.h"

#include <algorithm>
#include <chrono>
#include <ctime>
#include <memory>
#include <ostream>
#include <stdexcept>
#include <string_view>
#include <vector>

#include "filters/zeto_calendar_filter.h"
#include "filters/zeto_contact_filter.h"
#include "tessel/client.h"
#include "tessel/exception.h"
#include "tessel/schema.h"
#include "tessel/snapshot.h"
#include "tools/tessel/record_names.h"
#include "tools/tessel/setting_value.h"
#include "tools/tessel/usage_error.h"

namespace tessel::cli {

namespace {

// The entities of each data class, in the order the tool itself asks for them.
const std::vector<std::string_view> kContactsEntities = {
    TesselEntity_Contacts_Contact,       TesselEntity_Contacts_EmailAddress,
    TesselEntity_Contacts_PhoneNumber,   TesselEntity_Contacts_IM,
    TesselEntity_Contacts_StreetAddress, TesselEntity_Contacts_URL,
    TesselEntity_Contacts_Group,
};
const std::vector<std::string_view> kCalendarsEntities = {
    TesselEntity_Calendars_CalendarOrder, TesselEntity_Calendars_Calendar,
    TesselEntity_Calendars_Event,         TesselEntity_Calendars_Task,
    TesselEntity_Calendars_Recurrence,    TesselEntity_Calendars_AudioAlarm,
    TesselEntity_Calendars_MailAlarm,     TesselEntity_Calendars_DisplayAlarm,
    TesselEntity_Calendars_Organizer,     TesselEntity_Calendars_Attendee,
};

std::unique_ptr<Client> existingClient(CommandContext& context, const std::string& identifier) {
  std::unique_ptr<Client> client = context.store().clientWithIdentifier(identifier);
  if (!client) {
    throw Exception(
        TesselUnknownClientException,
        "no client \"" + identifier + "\" is registered in " + context.storePath().string());
  }
  return client;
}

std::string localTime(std::chrono::system_clock::time_point time) {
  const std::time_t seconds = std::chrono::system_clock::to_time_t(time);
  std::tm fields{};
  localtime_r(&seconds, &fields);
  char buffer[64];
  std::strftime(buffer, sizeof buffer, "%Y-%m-%d %H:%M:%S %z", &fields);
  return buffer;
}

std::string_view outcomeName(SessionOutcome outcome) {
  switch (outcome) {
    case SessionOutcome::Running:
      return "running";
    case SessionOutcome::Finished:
      return "finished";
    case SessionOutcome::Cancelled:
      return "cancelled";
  }
  return "unknown";
}

// A filter as a person reads it: what it lets through, by name.
std::string filterSelection(CommandContext& context, Client& client, const Filtering& filter) {
  const auto* contacts = dynamic_cast<const zt::filters::ZetoContactFilter*>(&filter);
  const auto* calendars = dynamic_cast<const zt::filters::ZetoCalendarFilter*>(&filter);
  if (contacts == nullptr && calendars == nullptr) {
    return filter.className() + ": " + filter.description();
  }
  const bool all = contacts ? contacts->useAllContacts() : calendars->useAllCalendars();
  std::string line = contacts ? "contacts: " : "calendars: ";
  if (all) return line + (contacts ? "all contacts" : "all calendars");
  Store& store = context.store();
  const std::shared_ptr<Snapshot> snapshot = store.snapshotOfRecordsInTruth(
      {std::string(contacts ? TesselEntity_Contacts_Group : TesselEntity_Calendars_Calendar)},
      client);
  const std::vector<std::string> ids = contacts
                                           ? contacts->usedContactGroupIDsForSnapshot(*snapshot)
                                           : calendars->usedCalendarGroupIDsForSnapshot(*snapshot);
  const std::vector<NamedRecord> known =
      namedRecords(store, contacts ? NamedEntity::ContactGroup : NamedEntity::Calendar);
  if (ids.empty()) return line + "none (what it named is gone)";
  return line + (contacts ? "the members of " : "") + describeSelection(known, ids);
}

}  // namespace

void registerClient(CommandContext& context, const std::string& identifier,
                    DataClassChange contacts, DataClassChange calendars, EmptyClient empty,
                    const std::optional<std::string>& displayName) {
  if (identifier.empty()) throw UsageError("a client identifier cannot be empty");
  Store& store = context.store();
  const std::unique_ptr<Client> existing = store.clientWithIdentifier(identifier);
  const auto enabled = [&existing](std::string_view firstEntity) {
    if (!existing) return false;
    const std::vector<std::string> names = existing->enabledEntityNames();
    return std::find(names.begin(), names.end(), firstEntity) != names.end();
  };
  const auto decide = [](DataClassChange change, bool before) {
    return change == DataClassChange::Keep ? before : change == DataClassChange::On;
  };
  const bool withContacts = decide(contacts, enabled(kContactsEntities.front()));
  const bool withCalendars = decide(calendars, enabled(kCalendarsEntities.front()));
  if (!withContacts && !withCalendars && empty == EmptyClient::Refused) {
    throw UsageError("client " + identifier +
                     " would sync nothing: say --contacts and/or --calendars (or "
                     "--no-data-classes for a client of no data class)");
  }
  std::vector<std::string> entities;
  if (withContacts)
    entities.insert(entities.end(), kContactsEntities.begin(), kContactsEntities.end());
  if (withCalendars)
    entities.insert(entities.end(), kCalendarsEntities.begin(), kCalendarsEntities.end());
  const std::string name = displayName ? *displayName
                           : existing  ? existing->displayName()
                                       : identifier;
  store.registerClient(identifier, name, entities);
  context.out() << "client " << identifier << (existing ? " updated" : " registered") << " for "
                << (entities.empty()                ? "no data class"
                    : withContacts && withCalendars ? "contacts and calendars"
                    : withContacts                  ? "contacts"
                                                    : "calendars")
                << '\n';
}

void listClients(CommandContext& context) {
  Store& store = context.store();
  const std::vector<std::string> identifiers = store.clientIdentifiers();
  if (identifiers.empty()) context.out() << "no clients (tessel devices suggests one)\n";
  for (const std::string& identifier : identifiers) {
    const std::unique_ptr<Client> client = store.clientWithIdentifier(identifier);
    if (!client) continue;
    const std::vector<std::string> names = client->enabledEntityNames();
    const auto has = [&names](std::string_view entity) {
      return std::find(names.begin(), names.end(), entity) != names.end();
    };
    const bool contacts = has(kContactsEntities.front());
    const bool calendars = has(kCalendarsEntities.front());
    context.out() << identifier << '\t' << client->displayName() << '\t'
                  << (contacts && calendars ? "contacts, calendars"
                      : contacts            ? "contacts"
                      : calendars           ? "calendars"
                                            : "no data class")
                  << '\n';
  }
}

void showClient(CommandContext& context, const std::string& identifier) {
  const std::unique_ptr<Client> client = existingClient(context, identifier);
  std::ostream& out = context.out();
  out << "client: " << client->identifier() << '\n';
  out << "name: " << client->displayName() << '\n';

  out << "entities:";
  const std::vector<std::string> entities = client->enabledEntityNames();
  if (entities.empty()) out << " none";
  out << '\n';
  for (const std::string& entity : entities) out << "  " << entity << '\n';

  const zt::platform::Dictionary settings = client->settings();
  out << "settings:" << (settings.empty() ? " none" : "") << '\n';
  for (const auto& [key, value] : settings) {
    out << "  " << key << " = " << formatSettingValue(value) << '\n';
  }

  const FilterList filters = client->filters();
  out << "filters:" << (filters.empty() ? " none" : "") << '\n';
  for (const auto& filter : filters)
    out << "  " << filterSelection(context, *client, *filter) << '\n';

  out << "mirror: " << client->mirrorSize() << " records\n";

  out << "last session: ";
  if (const std::optional<SessionSummary> session = client->lastSession()) {
    out << outcomeName(session->outcome) << ", began " << localTime(session->began);
    if (session->ended) out << ", ended " << localTime(*session->ended);
    out << ", process " << session->ownerProcess;
    if (session->cancelRequested) out << ", cancel requested";
    out << '\n';
  } else {
    out << "none\n";
  }
}

void setClientSetting(CommandContext& context, const std::string& identifier,
                      const std::string& key, const std::string& value) {
  const std::optional<zt::platform::Value> parsed = parseSettingValue(value);
  if (!parsed) {
    throw UsageError("setting value \"" + value +
                     "\" is not true, false, an integer or an ISO date such as "
                     "2026-11-21T10:00:00Z");
  }
  if (key.empty()) throw UsageError("a setting key cannot be empty");
  existingClient(context, identifier)->setSetting(key, *parsed);
}

void unsetClientSetting(CommandContext& context, const std::string& identifier,
                        const std::string& key) {
  const std::unique_ptr<Client> client = existingClient(context, identifier);
  if (!client->setting(key)) {
    throw std::runtime_error("client \"" + identifier + "\" has no setting \"" + key + "\"");
  }
  client->unsetSetting(key);
}

void cancelSession(CommandContext& context, const std::string& identifier) {
  if (context.store().cancelSession(identifier)) {
    context.out() << "session of client " << identifier << " cancelled\n";
  } else {
    context.out() << "no session of client " << identifier << " is running\n";
  }
}

}  // namespace tessel::cli
