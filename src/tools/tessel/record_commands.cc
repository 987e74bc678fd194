#include "tools/tessel/record_commands.h"

#include <cerrno>
#include <cstring>
#include <fstream>
#include <iterator>
#include <ostream>
#include <sstream>
#include <stdexcept>

#include "tessel/record_json.h"
#include "tessel/schema.h"
#include "tools/tessel/counted.h"
#include "tools/tessel/record_summary.h"

namespace tessel::cli {

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
  return readAll(in, file);
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

void orderCalendars(CommandContext& context, const std::vector<std::string>& calendarIdentifiers) {
  context.store().setCalendarOrder(calendarIdentifiers);
  context.out() << "calendar order set: "
                << counted(calendarIdentifiers.size(), "calendar", "calendars") << '\n';
}

}  // namespace tessel::cli
