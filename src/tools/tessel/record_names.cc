#include "tools/tessel/record_names.h"

#include "tessel/schema.h"
#include "tools/tessel/usage_error.h"

namespace tessel::cli {

namespace {

std::string_view what(NamedEntity entity) {
  return entity == NamedEntity::ContactGroup ? "contact group" : "calendar";
}

}  // namespace

std::vector<NamedRecord> namedRecords(const Store& store, NamedEntity entity) {
  const bool groups = entity == NamedEntity::ContactGroup;
  const std::string_view nameKey =
      groups ? TesselAttribute_Contacts_Group_Name : TesselAttribute_Calendars_Calendar_Title;
  std::vector<NamedRecord> found;
  store.forEachRecord(
      [&](const Record& record) {
        const std::string* name = record.record.stringAt(nameKey);
        found.push_back({record.id, name != nullptr ? *name : std::string()});
      },
      groups ? TesselEntity_Contacts_Group : TesselEntity_Calendars_Calendar);
  return found;
}

std::string resolveName(const std::vector<NamedRecord>& records, const std::string& given,
                        NamedEntity entity) {
  for (const NamedRecord& record : records) {
    if (record.id == given) return record.id;
  }
  std::vector<const NamedRecord*> exact, prefixed;
  for (const NamedRecord& record : records) {
    if (record.name == given) exact.push_back(&record);
    if (!given.empty() && record.name.starts_with(given)) prefixed.push_back(&record);
  }
  const std::vector<const NamedRecord*>& matches = exact.empty() ? prefixed : exact;
  if (matches.size() == 1) return matches.front()->id;
  if (matches.empty()) {
    throw UsageError("\"" + given + "\" is not a " + std::string(what(entity)) +
                     " of the store (its name, the start of its name, or its identifier)");
  }
  std::string candidates;
  for (const NamedRecord* match : matches) {
    candidates += (candidates.empty() ? "" : ", ") + match->name + " (" + match->id + ")";
  }
  throw UsageError("\"" + given + "\" names more than one " + std::string(what(entity)) + ": " +
                   candidates);
}

std::string describeSelection(const std::vector<NamedRecord>& records,
                              const std::vector<std::string>& identifiers) {
  std::string text;
  for (const std::string& id : identifiers) {
    std::string shown = id;
    for (const NamedRecord& record : records) {
      if (record.id == id)
        shown = (record.name.empty() ? "(untitled)" : record.name) + " (" + id + ")";
    }
    text += (text.empty() ? "" : ", ") + shown;
  }
  return text;
}

}  // namespace tessel::cli
