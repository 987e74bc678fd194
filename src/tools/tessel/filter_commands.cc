#include "tools/tessel/filter_commands.h"

#include <memory>
#include <ostream>

#include "filters/zeto_calendar_filter.h"
#include "filters/zeto_contact_filter.h"
#include "tessel/client.h"
#include "tessel/exception.h"
#include "tessel/schema.h"
#include "tessel/snapshot.h"
#include "tools/tessel/record_names.h"
#include "tools/tessel/usage_error.h"

namespace tessel::cli {

namespace {

// Refuses identifiers that are not records of the entity, so that a typing error cannot
// silently turn into "sync everything".
void checkSelection(const Snapshot& snapshot, const std::vector<std::string>& identifiers,
                    std::string_view entity, std::string_view what) {
  if (identifiers.empty()) throw UsageError("name at least one " + std::string(what));
  RecordMap found = snapshot.recordsWithIdentifiers(identifiers);
  for (const std::string& identifier : identifiers) {
    auto it = found.find(identifier);
    const zt::platform::Value* kind =
        it == found.end() ? nullptr : it->second.find(TesselRecordEntityNameKey);
    const std::string* name = kind ? kind->asString() : nullptr;
    if (!name || *name != entity) {
      throw UsageError("\"" + identifier + "\" is not a " + std::string(what) + " of the store");
    }
  }
}

}  // namespace

void setClientFilter(CommandContext& context, const std::string& identifier,
                     FilterDataClass dataClass,
                     const std::optional<std::vector<std::string>>& selection) {
  Store& store = context.store();
  std::unique_ptr<Client> client = store.clientWithIdentifier(identifier);
  if (!client) {
    throw Exception(
        TesselUnknownClientException,
        "no client \"" + identifier + "\" is registered in " + context.storePath().string());
  }

  const bool contacts = dataClass == FilterDataClass::Contacts;
  std::string_view entity =
      contacts ? TesselEntity_Contacts_Group : TesselEntity_Calendars_Calendar;
  std::shared_ptr<Snapshot> snapshot =
      store.snapshotOfRecordsInTruth({std::string(entity)}, *client);

  // Names and unique prefixes stand for their records.
  std::optional<std::vector<std::string>> chosen;
  if (selection) {
    const std::vector<NamedRecord> known =
        namedRecords(store, contacts ? NamedEntity::ContactGroup : NamedEntity::Calendar);
    chosen.emplace();
    for (const std::string& given : *selection) {
      chosen->push_back(
          resolveName(known, given, contacts ? NamedEntity::ContactGroup : NamedEntity::Calendar));
    }
  }

  std::shared_ptr<Filtering> filter;
  if (contacts) {
    auto contactFilter = std::make_shared<zt::filters::ZetoContactFilter>();
    if (chosen) {
      checkSelection(*snapshot, *chosen, entity, "contact group");
      contactFilter->setUseAllContacts(false);
      contactFilter->setUsedContactGroupIDs(*chosen, *snapshot);
    }
    filter = contactFilter;
  } else {
    auto calendarFilter = std::make_shared<zt::filters::ZetoCalendarFilter>();
    if (chosen) {
      checkSelection(*snapshot, *chosen, entity, "calendar");
      calendarFilter->setUseAllCalendars(false);
      calendarFilter->setUsedCalendarGroupIDs(*chosen, *snapshot);
    }
    filter = calendarFilter;
  }

  FilterList filters = client->filters();
  bool replaced = false;
  for (std::shared_ptr<Filtering>& existing : filters) {
    if (existing->className() == filter->className()) {
      existing = filter;
      replaced = true;
    }
  }
  if (!replaced) filters.push_back(filter);
  client->setFilters(filters);

  context.out() << "client " << identifier << " syncs "
                << (selection ? std::to_string(selection->size()) +
                                    (contacts ? " contact group(s)" : " calendar(s)")
                              : std::string(contacts ? "all contacts" : "all calendars"))
                << '\n';
}

}  // namespace tessel::cli
