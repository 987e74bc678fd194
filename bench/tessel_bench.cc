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
#include "tessel/schema.h"
#include "tessel/session.h"
#include "tessel/store.h"

namespace {

using zt::platform::Array;
using zt::platform::Dictionary;
using zt::platform::Value;

const std::vector<std::string> kContacts{std::string(tessel::TesselEntity_Contacts_Contact)};

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
    if (!folder_.empty()) std::filesystem::remove_all(folder_);
  }

  tessel::Store& withRecords(std::size_t count) {
    auto found = stores_.find(count);
    if (found != stores_.end()) return *found->second;
    if (folder_.empty()) {
      char pattern[] = "/tmp/tessel-bench-XXXXXX";
      if (!mkdtemp(pattern)) std::abort();
      folder_ = pattern;
    }
    auto store = tessel::Store::open(folder_ / ("truth-" + std::to_string(count) + ".db"));
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

 private:
  std::filesystem::path folder_;
  std::map<std::size_t, std::unique_ptr<tessel::Store>> stores_;
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
void BM_WholeSession(benchmark::State& state) {
  const auto count = static_cast<std::size_t>(state.range(0));
  tessel::Store& store = stores().withRecords(count);
  int round = 0;
  for (auto _ : state) {
    state.PauseTiming();
    auto client = store.registerClient("whole-" + std::to_string(round++), "Whole", kContacts);
    state.ResumeTiming();
    auto session = tessel::Session::begin(*client, kContacts);
    session->prepareToPullChanges(kContacts);
    auto changes = session->changeEnumerator(kContacts);
    std::size_t seen = 0;
    while (auto change = changes.next()) {
      session->clientAcceptedChanges(change->recordIdentifier);
      ++seen;
    }
    session->clientCommittedAcceptedChanges();
    session->finishSyncing();
    if (seen != count) state.SkipWithError("not every record was offered");
  }
  state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * count));
}
BENCHMARK(BM_WholeSession)->Arg(100000)->Unit(benchmark::kMillisecond)->Iterations(3);

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
