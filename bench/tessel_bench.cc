// Sync-engine throughput on stores of realistic size: records by identifier from a session
// snapshot, and change preparation (with and without a filter that must decode every
// record), plus a whole session that accepts and commits every change. Each benchmark
// reports records per second; the peak resident memory of the run is printed at the end.
#include <benchmark/benchmark.h>
#include <stdlib.h>
#include <sys/resource.h>
#include <unistd.h>

#include <cstdio>
#include <filesystem>
#include <map>
#include <memory>

#include "tessel/coder.h"
#include "tessel/decoder.h"
#include "tessel/filter_registry.h"
#include "tessel/record_json.h"
#include "tessel/schema.h"
#include "tessel/session.h"
#include "tessel/store.h"

namespace {

using zt::platform::Array;
using zt::platform::Dictionary;
using zt::platform::Value;

const std::vector<std::string> kContacts{std::string(tessel::TesselEntity_Contacts_Contact)};
const std::vector<std::string> kCalendarEntities{
    std::string(tessel::TesselEntity_Calendars_CalendarOrder),
    std::string(tessel::TesselEntity_Calendars_Calendar),
    std::string(tessel::TesselEntity_Calendars_Event)};
constexpr std::size_t kCalendars = 20;

// Passes every contact but those named "nobody": it must decode and read each record.
class FirstNameFilter : public tessel::Filtering {
 public:
  std::string className() const override { return "BenchFirstNameFilter"; }
  std::vector<std::string> supportedEntityNames() const override { return kContacts; }
  bool shouldApplyRecord(const Dictionary& record, const std::string&) const override {
    const Value* name = record.find(tessel::TesselAttribute_Contacts_Contact_FirstName);
    return !name || !name->asString() || *name->asString() != "nobody";
  }
  bool isEqual(const Filtering& other) const override {
    return dynamic_cast<const FirstNameFilter*>(&other) != nullptr;
  }
  void encode(tessel::Coder& coder) const override { coder.encodeValue(Value::boolean(true)); }
  std::string description() const override { return "FirstNameFilter"; }
};

std::string identifierOf(std::size_t i) {
  return "contact-" + std::to_string(i);
}

tessel::Record contactRecord(std::size_t i) {
  return tessel::Record{
      identifierOf(i),
      Dictionary{
          {std::string(tessel::TesselRecordEntityNameKey), tessel::TesselEntity_Contacts_Contact},
          {std::string(tessel::TesselAttribute_Contacts_Contact_FirstName),
           "First" + std::to_string(i)},
          {std::string(tessel::TesselAttribute_Contacts_Contact_LastName),
           "Last" + std::to_string(i % 977)},
          {std::string(tessel::TesselAttribute_Contacts_Contact_CompanyName), "Kestro Systems"},
          {std::string(tessel::TesselAttribute_Contacts_Contact_Notes),
           "Met at the spring fair; prefers e-mail."},
          {std::string(tessel::TesselRelationship_Contacts_Contact_ParentGroups),
           Array{"group-" + std::to_string(i % 10)}},
          {std::string(tessel::TesselRelationship_Contacts_Contact_PhoneNumbers),
           Array{"phone-" + std::to_string(i)}},
      }};
}

// One store per size, made once per run in a temporary folder removed at exit.
class BenchStores {
 public:
  ~BenchStores() {
    stores_.clear();
    named_.clear();
    if (!folder_.empty()) std::filesystem::remove_all(folder_);
  }

  tessel::Store& withRecords(std::size_t count) {
    auto found = stores_.find(count);
    if (found != stores_.end()) return *found->second;
    auto store = tessel::Store::open(folder() / ("truth-" + std::to_string(count) + ".db"));
    constexpr std::size_t kBatch = 10000;
    for (std::size_t first = 0; first < count; first += kBatch) {
      std::vector<tessel::Record> batch;
      for (std::size_t i = first; i < std::min(count, first + kBatch); ++i) {
        batch.push_back(contactRecord(i));
      }
      store->putRecords(batch);
    }
    store->registerClient("plain", "Plain", kContacts);
    store->registerClient("filtered", "Filtered", kContacts)
        ->setFilters({std::make_shared<FirstNameFilter>()});
    auto& result = *store;
    stores_.emplace(count, std::move(store));
    return result;
  }

  // `events` events spread over 20 calendars, each calendar listing its events, and the
  // calendar order: what the calendars syncer replaces wholesale on every sync.
  tessel::Store& withEvents(std::size_t events) {
    return made("events-" + std::to_string(events), [&](tessel::Store& store) {
      std::vector<zt::platform::Array> members(kCalendars);
      std::vector<tessel::Record> batch;
      for (std::size_t i = 0; i < events; ++i) {
        std::string calendar = "calendar-" + std::to_string(i % kCalendars);
        members[i % kCalendars].emplace_back("event-" + std::to_string(i));
        batch.push_back(tessel::Record{
            "event-" + std::to_string(i),
            Dictionary{{std::string(tessel::TesselRecordEntityNameKey),
                        tessel::TesselEntity_Calendars_Event},
                       {std::string(tessel::TesselAttribute_Calendars_Event_Summary),
                        "Meeting " + std::to_string(i)},
                       {std::string(tessel::TesselRelationship_Calendars_Event_Calendar),
                        Array{calendar}}}});
        if (batch.size() == 10000) {
          store.putRecords(batch);
          batch.clear();
        }
      }
      std::vector<std::string> order;
      for (std::size_t c = 0; c < kCalendars; ++c) {
        order.push_back("calendar-" + std::to_string(c));
        batch.push_back(tessel::Record{
            order.back(),
            Dictionary{{std::string(tessel::TesselRecordEntityNameKey),
                        tessel::TesselEntity_Calendars_Calendar},
                       {std::string(tessel::TesselAttribute_Calendars_Calendar_Title),
                        "Calendar " + std::to_string(c)},
                       {std::string(tessel::TesselRelationship_Calendars_Calendar_Events),
                        Value(std::move(members[c]))}}});
      }
      store.putRecords(batch);
      store.setCalendarOrder(order);
    });
  }

  // `count` contacts of which one in ten has a photo of 30 to 300 KB.
  tessel::Store& withPhotos(std::size_t count) {
    return made(
        "photos-" + std::to_string(count),
        [&](tessel::Store& store) {
          std::vector<tessel::Record> batch;
          for (std::size_t i = 0; i < count; ++i) {
            tessel::Record record = contactRecord(i);
            if (i % 10 == 0) {
              const std::size_t size = 30 * 1024 + (i * 2654435761U) % (270 * 1024);
              zt::platform::Data photo(size);
              for (std::size_t b = 0; b < size; ++b)
                photo[b] = static_cast<std::uint8_t>(b * 31 + i);
              record.record.set(std::string(tessel::TesselAttribute_Contacts_Contact_Image),
                                Value(std::move(photo)));
            }
            batch.push_back(std::move(record));
            if (batch.size() == 1000) {
              store.putRecords(batch);
              batch.clear();
            }
          }
          store.putRecords(batch);
          store.registerClient("plain", "Plain", kContacts);
        },
        true);
  }

  // A fresh, empty store for each call.
  std::unique_ptr<tessel::Store> empty() {
    return tessel::Store::open(folder() / ("empty-" + std::to_string(++emptyStores_) + ".db"));
  }

 private:
  // $TESSEL_BENCH_KEPT names a folder where the photos store stays between runs, so that a
  // case run alone for its peak memory neither pays for making it nor counts it.
  template <typename Fill>
  tessel::Store& made(const std::string& name, Fill fill, bool keepable = false) {
    auto found = named_.find(name);
    if (found != named_.end()) return *found->second;
    const char* kept_folder = keepable ? std::getenv("TESSEL_BENCH_KEPT") : nullptr;
    const std::filesystem::path path =
        (kept_folder ? std::filesystem::path(kept_folder) : folder()) / (name + ".db");
    const bool kept = kept_folder && std::filesystem::exists(path);
    auto store = tessel::Store::open(path);
    if (!kept) fill(*store);
    auto& result = *store;
    named_.emplace(name, std::move(store));
    return result;
  }
  const std::filesystem::path& folder() {
    if (folder_.empty()) {
      char pattern[] = "/tmp/tessel-bench-XXXXXX";
      if (!mkdtemp(pattern)) std::abort();
      folder_ = pattern;
    }
    return folder_;
  }

  std::filesystem::path folder_;
  std::map<std::size_t, std::unique_ptr<tessel::Store>> stores_;
  std::map<std::string, std::unique_ptr<tessel::Store>> named_;
  int emptyStores_ = 0;
};

BenchStores& stores() {
  static BenchStores instance;
  return instance;
}

void BM_RecordsWithIdentifiers(benchmark::State& state) {
  const auto count = static_cast<std::size_t>(state.range(0));
  tessel::Store& store = stores().withRecords(count);
  auto client = store.clientWithIdentifier("plain");
  auto session = tessel::Session::begin(*client, kContacts);
  auto snapshot = session->snapshotOfRecordsInTruth();
  // The calendar flattening asks for a few records at a time: ask in groups of 20.
  std::vector<std::vector<std::string>> groups;
  for (std::size_t first = 0; first < count; first += 20) {
    std::vector<std::string> ids;
    for (std::size_t i = first; i < std::min(count, first + 20); ++i) {
      ids.push_back(identifierOf((i * 7919) % count));
    }
    groups.push_back(std::move(ids));
  }
  for (auto _ : state) {
    std::size_t found = 0;
    for (const auto& ids : groups) found += snapshot->recordsWithIdentifiers(ids).size();
    benchmark::DoNotOptimize(found);
  }
  state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * count));
  session->finishSyncing();
}
BENCHMARK(BM_RecordsWithIdentifiers)->Arg(50000)->Unit(benchmark::kMillisecond);

void BM_RecordsMatchingEntity(benchmark::State& state) {
  const auto count = static_cast<std::size_t>(state.range(0));
  tessel::Store& store = stores().withRecords(count);
  auto client = store.clientWithIdentifier("plain");
  auto snapshot = store.snapshotOfRecordsInTruth(kContacts, *client);
  Dictionary criteria{
      {std::string(tessel::TesselRecordEntityNameKey), tessel::TesselEntity_Contacts_Contact}};
  for (auto _ : state) {
    auto records = snapshot->recordsMatchingAttributes(criteria);
    benchmark::DoNotOptimize(records.size());
  }
  state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * count));
}
BENCHMARK(BM_RecordsMatchingEntity)->Arg(50000)->Unit(benchmark::kMillisecond);

// Preparation only: the client holds nothing, so every record becomes an add.
void BM_PrepareChanges(benchmark::State& state) {
  const auto count = static_cast<std::size_t>(state.range(0));
  tessel::Store& store = stores().withRecords(count);
  auto client = store.clientWithIdentifier(state.range(1) ? "filtered" : "plain");
  for (auto _ : state) {
    auto session = tessel::Session::begin(*client, kContacts);
    session->prepareToPullChanges(kContacts);
    session->cancelSyncing();
  }
  state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * count));
}
BENCHMARK(BM_PrepareChanges)
    ->Args({25000, 0})
    ->Args({100000, 0})
    ->Args({100000, 1})
    ->ArgNames({"records", "filter"})
    ->Unit(benchmark::kMillisecond);

// A whole first sync: prepare, enumerate every record, accept and commit all of it. Each
// iteration syncs a new client, registered outside the timing, whose mirror starts empty.
// With the second argument set, the records are left out of the changes and the changes
// accepted in one call, as a client that only needs to know what changed can.
void BM_WholeSession(benchmark::State& state) {
  const auto count = static_cast<std::size_t>(state.range(0));
  const bool lean = state.range(1) != 0;
  tessel::Store& store = stores().withRecords(count);
  static int round = 0;  // a new client in every run of every case
  for (auto _ : state) {
    state.PauseTiming();
    auto client = store.registerClient("whole-" + std::to_string(round++), "Whole", kContacts);
    state.ResumeTiming();
    auto session = tessel::Session::begin(*client, kContacts);
    session->prepareToPullChanges(kContacts);
    auto changes = session->changeEnumerator(
        kContacts, lean ? tessel::ChangeRecords::Omitted : tessel::ChangeRecords::Decoded);
    std::vector<std::string> accepted;
    while (auto change = changes.next()) {
      if (lean) {
        accepted.push_back(std::move(change->recordIdentifier));
      } else {
        session->clientAcceptedChanges(change->recordIdentifier);
        accepted.emplace_back();
      }
    }
    if (lean) session->clientAcceptedChangesOf(accepted);
    session->clientCommittedAcceptedChanges();
    session->finishSyncing();
    if (accepted.size() != count) state.SkipWithError("not every record was offered");
  }
  state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * count));
}
BENCHMARK(BM_WholeSession)
    ->Args({100000, 0})
    ->Args({100000, 1})
    ->ArgNames({"records", "lean"})
    ->Unit(benchmark::kMillisecond)
    ->Iterations(3);

// The calendars syncer's first sync: every calendar entity is replaced wholesale; the syncer
// enumerates only the calendar order (and calendars) and reads events through the snapshot.
void BM_FirstSyncReplacingCalendars(benchmark::State& state) {
  const auto count = static_cast<std::size_t>(state.range(0));
  tessel::Store& store = stores().withEvents(count);
  static int round = 0;  // a new client in every run of every case
  for (auto _ : state) {
    state.PauseTiming();
    auto client = store.registerClient("calendars-" + std::to_string(round++), "Calendars",
                                       kCalendarEntities);
    client->shouldReplaceClientRecords(kCalendarEntities);
    state.ResumeTiming();
    auto session = tessel::Session::begin(*client, kCalendarEntities);
    session->prepareToPullChanges(kCalendarEntities);
    std::size_t seen = 0;
    for (const std::string& entity : {std::string(tessel::TesselEntity_Calendars_CalendarOrder),
                                      std::string(tessel::TesselEntity_Calendars_Calendar)}) {
      auto changes = session->changeEnumerator({entity});
      while (auto change = changes.next()) {
        session->clientAcceptedChanges(change->recordIdentifier);
        ++seen;
      }
    }
    session->clientCommittedAcceptedChanges();
    session->finishSyncing();
    if (seen != kCalendars + 1) state.SkipWithError("not every calendar was offered");
  }
  state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * count));
}
BENCHMARK(BM_FirstSyncReplacingCalendars)
    ->Arg(100000)
    ->Unit(benchmark::kMillisecond)
    ->Iterations(3);

// `tessel records put`: typed JSON lines parsed and written to a fresh store, in batches of
// `count` small records.
void BM_PutRecordLines(benchmark::State& state) {
  const auto count = static_cast<std::size_t>(state.range(0));
  std::string lines;
  for (std::size_t i = 0; i < count; ++i) {
    tessel::Record record = contactRecord(i);
    lines += tessel::recordToJsonLine(record.id, record.record);
    lines += '\n';
  }
  for (auto _ : state) {
    state.PauseTiming();
    auto store = stores().empty();
    state.ResumeTiming();
    const std::size_t written = store->putRecords(tessel::parseRecordLines(lines));
    if (written != count) state.SkipWithError("not every record was written");
  }
  state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * count));
}
BENCHMARK(BM_PutRecordLines)->Arg(100000)->Unit(benchmark::kMillisecond)->Iterations(3);

// The contacts step's read of every contact, photos included, as one map. Run it alone
// (--benchmark_filter) to read its peak resident memory.
void BM_ContactsWithPhotosMap(benchmark::State& state) {
  const auto count = static_cast<std::size_t>(state.range(0));
  tessel::Store& store = stores().withPhotos(count);
  auto client = store.clientWithIdentifier("plain");
  auto snapshot = store.snapshotOfRecordsInTruth(kContacts, *client);
  Dictionary criteria{
      {std::string(tessel::TesselRecordEntityNameKey), tessel::TesselEntity_Contacts_Contact}};
  for (auto _ : state) {
    std::size_t names = 0;
    for (const auto& [identifier, record] : snapshot->recordsMatchingAttributes(criteria)) {
      names += record.find(tessel::TesselAttribute_Contacts_Contact_FirstName) != nullptr;
    }
    if (names != count) state.SkipWithError("not every contact was read");
  }
  state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * count));
}
BENCHMARK(BM_ContactsWithPhotosMap)->Arg(50000)->Unit(benchmark::kMillisecond)->Iterations(2);

// The same read, one contact at a time; with the second argument set, photos are left out.
void BM_ContactsWithPhotosStreamed(benchmark::State& state) {
  const auto count = static_cast<std::size_t>(state.range(0));
  const bool photosApart = state.range(1) != 0;
  tessel::Store& store = stores().withPhotos(count);
  auto client = store.clientWithIdentifier("plain");
  auto snapshot = store.snapshotOfRecordsInTruth(kContacts, *client);
  Dictionary criteria{
      {std::string(tessel::TesselRecordEntityNameKey), tessel::TesselEntity_Contacts_Contact}};
  const std::string image(tessel::TesselAttribute_Contacts_Contact_Image);
  std::vector<std::string> omitted;
  if (photosApart) omitted.push_back(image);
  for (auto _ : state) {
    std::size_t names = 0;
    std::size_t photoBytes = 0;
    snapshot->forEachRecordMatching(
        criteria,
        [&](tessel::Record& record) {
          names +=
              record.record.find(tessel::TesselAttribute_Contacts_Contact_FirstName) != nullptr;
          const Value* photo = record.record.find(image);
          if (photo && photo->asData()) photoBytes += photo->asData()->size();
        },
        omitted);
    if (names != count) state.SkipWithError("not every contact was read");
    benchmark::DoNotOptimize(photoBytes);
  }
  state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * count));
}
BENCHMARK(BM_ContactsWithPhotosStreamed)
    ->Args({50000, 0})
    ->Args({50000, 1})
    ->ArgNames({"contacts", "photos_apart"})
    ->Unit(benchmark::kMillisecond)
    ->Iterations(2);

}  // namespace

int main(int argc, char** argv) {
  tessel::FilterRegistry::shared().registerClass(
      "BenchFirstNameFilter", [](tessel::Decoder&) { return std::make_shared<FirstNameFilter>(); });
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  rusage usage{};
  getrusage(RUSAGE_SELF, &usage);
  std::printf("peak resident memory: %.1f MiB\n", static_cast<double>(usage.ru_maxrss) / 1024.0);
  return 0;
}
