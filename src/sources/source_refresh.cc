#include "sources/source_refresh.h"

#include <algorithm>
#include <exception>
#include <optional>
#include <set>
#include <utility>

#include "importers/ical_import.h"
#include "importers/import_error.h"
#include "importers/import_warnings.h"
#include "importers/stable_hash.h"
#include "importers/vcard_identifiers.h"
#include "importers/vcard_import.h"
#include "platform/value.h"
#include "sources/collection_text.h"
#include "sources/credentials.h"
#include "tessel/exception.h"
#include "tessel/schema.h"

namespace tessel::sources {

namespace {

using importers::SyncDeletes;
using zt::platform::Error;
using zt::platform::Result;

// The text of a collection on a server, or none when it has not changed since the last refresh.
struct Download {
  std::optional<std::string> text;
  Validators validators;
};

Result<Download> download(const Source& source, const SourceState& previous, HttpClient& http,
                          SecretService& secrets) {
  auto credentials = credentialsOf(source, secrets);
  if (!credentials) return Error{credentials.error()};
  auto response = http.get(source.location, *credentials, previous.validators);
  if (!response) return Error{response.error()};
  if (response->freshness == Freshness::NotModified)
    return Download{std::nullopt, previous.validators};
  if (auto checked = checkDownload(*response, source.collection); !checked)
    return Error{checked.error()};
  return Download{std::move(response->body), std::move(response->validators)};
}

// A calendar named by nothing else is named by its address's last path segment
// (".../calendars/alice/work/?export" gives "work").
std::string titleOfAddress(const std::string& address) {
  std::string path = address.substr(0, address.find_first_of("?#"));
  while (!path.empty() && path.back() == '/') path.pop_back();
  std::string last = path.substr(path.find_last_of('/') + 1);
  if (const std::size_t dot = last.rfind('.'); dot != std::string::npos && dot > 0) last.erase(dot);
  return last.empty() ? address : last;
}

std::string counted(std::size_t count, const char* one, const char* many) {
  return std::to_string(count) + " " + (count == 1 ? one : many);
}

std::string refreshCalendar(Store& store, const Source& source, std::optional<std::string> text,
                            importers::ImportWarnings& warnings) {
  std::vector<importers::ICalCalendar> calendars;
  if (text) {
    importers::ICalCalendarSource read;
    read.identifier = calendarIdentifierForAddress(source.location);
    read.files.push_back({source.location, std::move(*text)});
    read.title = source.title;
    read.fallbackTitle = titleOfAddress(source.location);
    calendars.push_back(importers::readICalCalendar(std::move(read), warnings));
  } else {
    // The calendar is found as `tessel import ical` finds it, so that a file imported once and
    // then refreshed as a source stays one calendar.
    importers::ICalImportTarget target;
    target.title = source.title;
    calendars =
        importers::readICalendarPaths(importers::parseICalendarPaths({source.location}, warnings),
                                      target, importers::knownCalendars(store), warnings);
  }
  const importers::ICalImportCounts counts =
      importers::writeICalCalendars(store, calendars, SyncDeletes::On);
  const importers::ICalCalendar& calendar = calendars.front();
  return "\"" + calendar.title + "\": " + counted(calendar.eventCount, "event", "events") + ", " +
         counted(calendar.taskCount, "task", "tasks") + "; " + std::to_string(counts.written) +
         " written, " + std::to_string(counts.deleted) + " deleted";
}

// The contacts and groups an import produces, sorted.
std::vector<std::string> producedIdentifiers(const importers::VCardImport& import) {
  std::vector<std::string> produced;
  for (const Record& record : import.records()) {
    if (importers::owningContactIdentifier(record.id) == record.id ||
        record.id.starts_with(importers::kGroupPrefix))
      produced.push_back(record.id);
  }
  std::sort(produced.begin(), produced.end());
  return produced;
}

// What this source had and has no more, unless another source still has it; a group only
// once no contact that stays is in it.
std::vector<std::string> staleRecords(const Store& store, const std::vector<std::string>& before,
                                      const std::vector<std::string>& now,
                                      const std::set<std::string>& elsewhere) {
  std::set<std::string> contacts, groups;
  for (const std::string& id : before) {
    if (std::binary_search(now.begin(), now.end(), id) || elsewhere.count(id) != 0) continue;
    (id.starts_with(importers::kGroupPrefix) ? groups : contacts).insert(id);
  }
  std::vector<std::string> stale;
  if (contacts.empty() && groups.empty()) return stale;
  // A contact goes with the records that are its own (phones, addresses, ...).
  store.forEachRecord([&](const Record& record) {
    if (contacts.count(std::string(importers::owningContactIdentifier(record.id))) != 0)
      stale.push_back(record.id);
  });
  for (const std::string& group : groups) {
    const std::optional<zt::platform::Dictionary> stored = store.record(group);
    if (!stored) continue;
    const std::vector<std::string> members =
        zt::platform::stringsIn(stored->find(TesselRelationship_Contacts_Group_Members));
    if (std::all_of(members.begin(), members.end(),
                    [&](const std::string& member) { return contacts.count(member) != 0; }))
      stale.push_back(group);
  }
  return stale;
}

std::string refreshAddressBook(Store& store, const Source& source,
                               const std::vector<Source>& sources, const SourceStates& states,
                               std::optional<std::string> text, importers::ImportWarnings& warnings,
                               SourceState& state) {
  importers::VCardImport import(warnings);
  if (!text) {
    import.addPaths({source.location});
  } else if (text->find_first_not_of(" \r\n") != std::string::npos) {
    import.addText(*text, source.location);
  }
  // Else the server sent an emptied address book as nothing at all (checkDownload allowed it
  // for a vCard answer): every contact left it. The importer would refuse the empty text as a
  // file that is not a vCard file.
  const std::vector<std::string> produced = producedIdentifiers(import);
  std::set<std::string> elsewhere;
  for (const Source& other : sources) {
    if (other.identifier == source.identifier || other.collection != Collection::AddressBook)
      continue;
    for (std::string& id : states.load(other).records) elsewhere.insert(std::move(id));
  }
  // Before the store changes, the state remembers every contact this source may add now, with
  // the earlier validators: should a later step fail, the next refresh downloads again and
  // still knows to remove what left the source.
  SourceState provisional = states.load(source);
  provisional.records.insert(provisional.records.end(), produced.begin(), produced.end());
  std::sort(provisional.records.begin(), provisional.records.end());
  provisional.records.erase(std::unique(provisional.records.begin(), provisional.records.end()),
                            provisional.records.end());
  if (auto saved = states.save(source, provisional); !saved)
    throw importers::ImportError(source.location, std::nullopt,
                                 "its state cannot be kept: " + saved.error());
  const importers::VCardImportSummary summary = std::move(import).writeTo(store, SyncDeletes::Off);
  const std::size_t deleted =
      store.deleteRecords(staleRecords(store, state.records, produced, elsewhere));
  state.records = produced;
  return counted(summary.contacts, "contact", "contacts") + ", " +
         counted(summary.groups, "group", "groups") + "; " + std::to_string(summary.written) +
         " written, " + std::to_string(summary.deleted + deleted) + " deleted";
}

SourceRefresh refreshOne(Store& store, const Source& source, const std::vector<Source>& sources,
                         const SourceStates& states, HttpClient& http, SecretService& secrets) {
  SourceRefresh outcome;
  outcome.source = source;
  SourceState state = states.load(source);
  std::optional<std::string> text;
  if (source.isAddress()) {
    auto fetched = download(source, state, http, secrets);
    if (!fetched) {
      outcome.detail = fetched.error();
      return outcome;
    }
    if (!fetched->text) {
      outcome.result = RefreshResult::Unchanged;
      outcome.detail = "not changed since the last refresh";
      return outcome;
    }
    text = std::move(fetched->text);
    state.validators = std::move(fetched->validators);
  }
  try {
    importers::ImportWarnings warnings(source.onFault);
    outcome.detail =
        source.collection == Collection::Calendar
            ? refreshCalendar(store, source, std::move(text), warnings)
            : refreshAddressBook(store, source, sources, states, std::move(text), warnings, state);
    for (const importers::ImportWarning& warning : warnings.all())
      outcome.warnings.push_back(importers::warningText(warning));
    if (warnings.count() != 0)
      outcome.detail += "; " + counted(warnings.count(), "warning", "warnings");
  } catch (const importers::ImportError& error) {
    outcome.detail = error.what();
    return outcome;
  } catch (const Exception& error) {
    outcome.detail = error.reason().empty() ? error.name() : error.reason();
    return outcome;
  } catch (const std::exception& error) {
    outcome.detail = error.what();
    return outcome;
  }
  state.location = source.location;
  // Without its state the next refresh downloads everything again, which is slower, not wrong.
  if (auto saved = states.save(source, state); !saved) {
    outcome.detail += "; its state was not kept: " + saved.error();
    return outcome;
  }
  outcome.result = RefreshResult::Imported;
  return outcome;
}

}  // namespace

std::string calendarIdentifierForAddress(const std::string& address) {
  return "ical-" + importers::stableHash(address);
}

std::vector<SourceRefresh> refreshSources(Store& store, const std::vector<Source>& sources,
                                          const SourceStates& states, HttpClient& http,
                                          SecretService& secrets,
                                          const std::function<void(const SourceRefresh&)>& report) {
  std::vector<SourceRefresh> outcomes;
  for (const Source& source : sources) {
    outcomes.push_back(refreshOne(store, source, sources, states, http, secrets));
    if (report) report(outcomes.back());
  }
  return outcomes;
}

}  // namespace tessel::sources
