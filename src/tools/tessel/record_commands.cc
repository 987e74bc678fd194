#include "tools/tessel/record_commands.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <ostream>
#include <sstream>
#include <stdexcept>

#include "tessel/record_json.h"
#include "tessel/schema.h"
#include "tools/tessel/counted.h"
#include "tools/tessel/record_names.h"
#include "tools/tessel/record_summary.h"
#include "tools/tessel/usage_error.h"

namespace tessel::cli {

using zt::platform::Value;

namespace {

std::string readAll(std::istream& in, const std::string& name) {
  std::ostringstream text;
  text << in.rdbuf();
  if (in.bad()) throw std::runtime_error("cannot read " + name);
  return std::move(text).str();
}

std::string readInput(CommandContext& context, const std::string& file) {
  if (file == "-") return readAll(context.in(), "standard input");
  std::error_code error;
  if (std::filesystem::is_directory(file, error)) {
    throw std::runtime_error("cannot read " + file + ": it is a folder");
  }
  std::ifstream in(file, std::ios::binary);
  if (!in) throw std::runtime_error("cannot read " + file + ": " + std::strerror(errno));
  // A regular file is read in one piece at its size; anything else (a pipe) as it comes.
  const std::uintmax_t size = std::filesystem::file_size(file, error);
  if (error || size == 0) return readAll(in, file);
  std::string text(size, '\0');
  in.read(text.data(), static_cast<std::streamsize>(size));
  if (in.bad()) throw std::runtime_error("cannot read " + file);
  text.resize(static_cast<std::size_t>(in.gcount()));
  // A file that grew while being read: the rest as it comes.
  if (!in.eof()) text += readAll(in, file);
  return text;
}

}  // namespace

void putRecords(CommandContext& context, const std::string& file) {
  const std::string text = readInput(context, file);
  std::vector<Record> records;
  try {
    records = parseRecordLines(text);
  } catch (const RecordJsonError& e) {
    throw std::runtime_error((file == "-" ? std::string("standard input") : file) + ": " +
                             e.what());
  }
  const std::size_t written = context.store().putRecords(records);
  context.out() << counted(records.size(), "record", "records") << " read, " << written
                << " written\n";
}

void deleteRecords(CommandContext& context, const std::vector<std::string>& identifiers) {
  const std::size_t deleted = context.store().deleteRecords(identifiers, MissingRecords::Fail);
  context.out() << counted(deleted, "record", "records") << " deleted\n";
}

void listRecords(CommandContext& context, const std::optional<std::string>& entityName,
                 ListFormat format) {
  std::ostream& out = context.out();
  const auto visit = [&](const Record& record) {
    if (format == ListFormat::TypedJson) {
      out << recordToJsonLine(record.id, record.record) << '\n';
      return;
    }
    const std::string* entityText = record.record.stringAt(TesselRecordEntityNameKey);
    out << record.id << '\t' << (entityText != nullptr ? *entityText : "") << '\t'
        << recordSummary(record.record) << '\n';
  };
  if (entityName) {
    context.store().forEachRecord(visit, *entityName);
  } else {
    context.store().forEachRecord(visit);
  }
  out.flush();
  if (!out) throw std::runtime_error("cannot write the listing");
}

void orderCalendars(CommandContext& context, const std::vector<std::string>& calendars) {
  Store& store = context.store();
  const std::vector<NamedRecord> known = namedRecords(store, NamedEntity::Calendar);
  // The named calendars first, then the others in the order they had, then any left out.
  std::vector<std::string> order;
  const auto add = [&order](const std::string& id) {
    if (std::find(order.begin(), order.end(), id) == order.end()) order.push_back(id);
  };
  for (const std::string& given : calendars) {
    const std::string id = resolveName(known, given, NamedEntity::Calendar);
    if (std::find(order.begin(), order.end(), id) != order.end()) {
      throw UsageError("calendar \"" + given + "\" is named twice");
    }
    order.push_back(id);
  }
  store.forEachRecord(
      [&](const Record& record) {
        const Value* listed =
            record.record.find(TesselRelationship_Calendars_CalendarOrder_Calendars);
        if (listed == nullptr || listed->asArray() == nullptr) return;
        for (const Value& id : *listed->asArray()) {
          if (id.asString() == nullptr) continue;
          for (const NamedRecord& calendar : known) {
            if (calendar.id == *id.asString()) add(calendar.id);
          }
        }
      },
      TesselEntity_Calendars_CalendarOrder);
  for (const NamedRecord& calendar : known) add(calendar.id);
  store.setCalendarOrder(order);
  context.out() << "calendar order:";
  for (const std::string& id : order) {
    context.out() << (id == order.front() ? " " : ", ") << describeSelection(known, {id});
  }
  context.out() << '\n';
}

void listCalendars(CommandContext& context) {
  Store& store = context.store();
  const std::vector<NamedRecord> known = namedRecords(store, NamedEntity::Calendar);
  std::vector<std::string> listed;
  store.forEachRecord(
      [&](const Record& record) {
        const Value* ids = record.record.find(TesselRelationship_Calendars_CalendarOrder_Calendars);
        if (ids == nullptr || ids->asArray() == nullptr) return;
        for (const Value& id : *ids->asArray()) {
          if (id.asString() != nullptr) listed.push_back(*id.asString());
        }
      },
      TesselEntity_Calendars_CalendarOrder);
  // In the player's order; calendars the order does not list (yet) at the end.
  std::vector<const NamedRecord*> shown;
  for (const std::string& id : listed) {
    for (const NamedRecord& calendar : known) {
      if (calendar.id == id) shown.push_back(&calendar);
    }
  }
  for (const NamedRecord& calendar : known) {
    if (std::find(listed.begin(), listed.end(), calendar.id) == listed.end()) {
      shown.push_back(&calendar);
    }
  }
  if (shown.empty()) context.out() << "no calendars\n";
  for (const NamedRecord* calendar : shown) {
    context.out() << calendar->id << '\t' << calendar->name << '\n';
  }
}

void listGroups(CommandContext& context) {
  const std::vector<NamedRecord> known = namedRecords(context.store(), NamedEntity::ContactGroup);
  if (known.empty()) context.out() << "no contact groups\n";
  for (const NamedRecord& group : known) {
    context.out() << group.id << '\t' << group.name << '\n';
  }
}

}  // namespace tessel::cli
