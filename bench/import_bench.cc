// Imports at scale: a deterministic .ics of 20,000 events (rules, exception dates, overrides,
// alarms, attendees, a defined zone and IANA zones) and a .vcf of 50,000 cards (some with
// photos), against libical's own parse of the same .ics (icalparser_parse_string).
//
// Times: libical's parse alone, the importer's read step, and the whole import into a fresh
// store. Memory: the peak resident memory of each step, measured in a child process started
// afresh (this program again, with --memory), less what the child held before the step, and
// compared with the size of the file.
#include <benchmark/benchmark.h>
#include <libical/ical.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "importers/ical_import.h"
#include "importers/import_file.h"
#include "importers/vcard_import.h"
#include "tessel/store.h"

namespace {

namespace fs = std::filesystem;
using namespace tessel;
using namespace tessel::importers;

constexpr int kEvents = 20'000;
constexpr int kCards = 50'000;

// Lines longer than 75 octets are folded, as exporters do.
void putLine(std::string& out, std::string_view line) {
  while (line.size() > 75) {
    out.append(line.substr(0, 75));
    out.append("\r\n ");
    line.remove_prefix(75);
  }
  out.append(line);
  out.append("\r\n");
}

std::string two(int n) {
  return (n < 10 ? "0" : "") + std::to_string(n);
}

std::string icsText() {
  std::string out;
  putLine(out, "BEGIN:VCALENDAR");
  putLine(out, "VERSION:2.0");
  putLine(out, "PRODID:-//zetosynctool//import bench//EN");
  putLine(out, "X-WR-CALNAME:Bench");
  for (const char* line :
       {"BEGIN:VTIMEZONE", "TZID:Bench Standard Time", "BEGIN:STANDARD", "DTSTART:19701025T030000",
        "RRULE:FREQ=YEARLY;BYMONTH=10;BYDAY=-1SU", "TZOFFSETFROM:+0200", "TZOFFSETTO:+0100",
        "END:STANDARD", "BEGIN:DAYLIGHT", "DTSTART:19700329T020000",
        "RRULE:FREQ=YEARLY;BYMONTH=3;BYDAY=-1SU", "TZOFFSETFROM:+0100", "TZOFFSETTO:+0200",
        "END:DAYLIGHT", "END:VTIMEZONE"}) {
    putLine(out, line);
  }
  for (int i = 0; i < kEvents; ++i) {
    const int month = 1 + i % 12, day = 1 + i % 28, hour = 8 + i % 10;
    const std::string date = std::to_string(2020 + i % 6) + two(month) + two(day);
    const std::string zone = i % 3 == 0   ? ";TZID=Bench Standard Time"
                             : i % 3 == 1 ? ";TZID=Europe/Paris"
                                          : "";
    const std::string uid = "event-" + std::to_string(i / 50 * 50 + (i % 50 == 49 ? 0 : i % 50));
    putLine(out, "BEGIN:VEVENT");
    putLine(out, "UID:" + uid + "@bench.example");
    putLine(out, "DTSTAMP:20240101T000000Z");
    if (i % 50 == 49) {
      // An override of the first event of the group of fifty, which recurs.
      putLine(out, "RECURRENCE-ID;TZID=Bench Standard Time:" + std::to_string(2020 + (i - 49) % 6) +
                       two(1 + (i - 49) % 12) + two(1 + (i - 49) % 28) + "T" +
                       two(8 + (i - 49) % 10) + "0000");
    }
    putLine(out,
            "DTSTART" + zone + ":" + date + "T" + two(hour) + "0000" + (zone.empty() ? "Z" : ""));
    putLine(out,
            "DTEND" + zone + ":" + date + "T" + two(hour + 1) + "3000" + (zone.empty() ? "Z" : ""));
    putLine(out, "SUMMARY:Meeting " + std::to_string(i) + " about the quarterly figures");
    putLine(out, "DESCRIPTION:Agenda for meeting " + std::to_string(i) +
                     ":\\n1. Figures of the quarter\\, by region\\n2. Plans for the next quarter"
                     "\\n3. Anything else that the participants bring along to the meeting");
    putLine(out, "LOCATION:Room " + std::to_string(i % 40));
    if (i % 4 == 0 && i % 50 != 49) {
      putLine(out, "RRULE:FREQ=WEEKLY;COUNT=" + std::to_string(5 + i % 20) + ";BYDAY=MO,WE");
      putLine(out, "EXDATE" + zone + ":" + date + "T" + two(hour) + "0000" +
                       (zone.empty() ? "Z" : "") + "," + date.substr(0, 6) +
                       two(day == 28 ? 1 : day + 1) + "T" + two(hour) + "0000" +
                       (zone.empty() ? "Z" : ""));
    }
    if (i % 3 == 0) {
      putLine(out, "BEGIN:VALARM");
      putLine(out, "ACTION:DISPLAY");
      putLine(out, "DESCRIPTION:Reminder");
      putLine(out, "TRIGGER:-PT15M");
      putLine(out, "END:VALARM");
    }
    if (i % 10 == 0) {
      putLine(out, "ORGANIZER;CN=Organizer " + std::to_string(i % 97) + ":mailto:organizer" +
                       std::to_string(i % 97) + "@bench.example");
      for (int a = 0; a < 3; ++a) {
        putLine(out, "ATTENDEE;CN=Attendee " + std::to_string(a) +
                         ";ROLE=REQ-PARTICIPANT;PARTSTAT=ACCEPTED:mailto:attendee" +
                         std::to_string((i + a) % 500) + "@bench.example");
      }
    }
    putLine(out, "END:VEVENT");
  }
  putLine(out, "END:VCALENDAR");
  return out;
}

std::string vcfText() {
  // A small JPEG-like payload: its bytes do not matter, only that it is base64.
  std::string photo;
  for (int i = 0; i < 6000; ++i)
    photo += "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/"[(i * 7) % 64];
  std::string out;
  for (int i = 0; i < kCards; ++i) {
    const std::string n = std::to_string(i);
    putLine(out, "BEGIN:VCARD");
    putLine(out, "VERSION:3.0");
    putLine(out, "UID:card-" + n);
    putLine(out, "N:Family" + n + ";Given" + n + ";;;");
    putLine(out, "FN:Given" + n + " Family" + n);
    putLine(out, "ORG:Company " + std::to_string(i % 300));
    putLine(out, "TEL;TYPE=CELL:+49 170 " + std::to_string(1000000 + i));
    putLine(out, "TEL;TYPE=WORK,VOICE:+49 30 " + std::to_string(2000000 + i));
    putLine(out, "EMAIL;TYPE=INTERNET,HOME:given" + n + "@bench.example");
    putLine(out, "ADR;TYPE=HOME:;;Street " + n + ";Berlin;;10115;Germany");
    if (i % 5 == 0) putLine(out, "CATEGORIES:Group " + std::to_string(i % 20));
    if (i % 7 == 0)
      putLine(out, "NOTE:Met at the conference number " + n + "\\, talked about books");
    if (i % 100 == 0) putLine(out, "PHOTO;ENCODING=b;TYPE=JPEG:/9j/" + photo);
    putLine(out, "END:VCARD");
  }
  return out;
}

struct Files {
  fs::path folder;
  fs::path ics, vcf;
  std::string icsText;
};

const Files& files() {
  static const Files made = [] {
    Files f;
    f.folder = fs::temp_directory_path() / ("import_bench_" + std::to_string(getpid()));
    fs::create_directories(f.folder);
    f.ics = f.folder / "bench.ics";
    f.vcf = f.folder / "bench.vcf";
    f.icsText = icsText();
    std::ofstream(f.ics, std::ios::binary) << f.icsText;
    std::ofstream(f.vcf, std::ios::binary) << vcfText();
    return f;
  }();
  return made;
}

void removeFiles() {
  std::error_code error;
  fs::remove_all(files().folder, error);
}

// ----- the steps, shared by the timed benchmarks and the memory children ------------------

void libicalParse(const std::string& text) {
  icalcomponent* root = icalparser_parse_string(text.c_str());
  benchmark::DoNotOptimize(root);
  icalcomponent_free(root);
}

void icalRead(const fs::path& ics) {
  auto calendars = readICalendarPaths({ics});
  benchmark::DoNotOptimize(calendars);
}

void icalImport(const fs::path& ics, const fs::path& store) {
  auto opened = Store::open(store);
  writeICalCalendars(*opened, readICalendarPaths({ics}), SyncDeletes::Off);
}

void vcardRead(const fs::path& vcf) {
  VCardImport import;
  import.addPaths({vcf});
  benchmark::DoNotOptimize(import);
}

void vcardImport(const fs::path& vcf, const fs::path& store) {
  auto opened = Store::open(store);
  VCardImport import;
  import.addPaths({vcf});
  std::move(import).writeTo(*opened, SyncDeletes::Off);
}

fs::path freshStore(const char* name) {
  const fs::path store = files().folder / name;
  std::error_code error;
  for (const char* suffix : {"", "-wal", "-shm", "-journal"}) {
    fs::remove(store.string() + suffix, error);
  }
  return store;
}

// ----- times ------------------------------------------------------------------------------

void BM_ICal_LibicalParse(benchmark::State& state) {
  const std::string text = readImportFile(files().ics, "bench.ics");
  for (auto _ : state) libicalParse(text);
}
BENCHMARK(BM_ICal_LibicalParse)->Unit(benchmark::kMillisecond)->UseRealTime();

void BM_ICal_Read(benchmark::State& state) {
  for (auto _ : state) icalRead(files().ics);
}
BENCHMARK(BM_ICal_Read)->Unit(benchmark::kMillisecond)->UseRealTime();

void BM_ICal_Import(benchmark::State& state) {
  for (auto _ : state) {
    state.PauseTiming();
    const fs::path store = freshStore("ical.db");
    state.ResumeTiming();
    icalImport(files().ics, store);
  }
}
BENCHMARK(BM_ICal_Import)->Unit(benchmark::kMillisecond)->UseRealTime();

void BM_VCard_Read(benchmark::State& state) {
  for (auto _ : state) vcardRead(files().vcf);
}
BENCHMARK(BM_VCard_Read)->Unit(benchmark::kMillisecond)->UseRealTime();

void BM_VCard_Import(benchmark::State& state) {
  for (auto _ : state) {
    state.PauseTiming();
    const fs::path store = freshStore("vcard.db");
    state.ResumeTiming();
    vcardImport(files().vcf, store);
  }
}
BENCHMARK(BM_VCard_Import)->Unit(benchmark::kMillisecond)->UseRealTime();

// ----- memory -----------------------------------------------------------------------------

long statusKiB(std::string_view key) {
  std::ifstream status("/proc/self/status");
  std::string line;
  while (std::getline(status, line)) {
    if (line.rfind(key, 0) == 0) return std::strtol(line.c_str() + key.size(), nullptr, 10);
  }
  return -1;
}

// In the child: runs one step and prints the growth of its peak resident memory, in KiB.
int memoryChild(std::string_view step, const fs::path& input, const fs::path& store) {
  std::string text;
  if (step == "libical") text = readImportFile(input, "input");
  const long before = statusKiB("VmRSS:");
  if (step == "libical") {
    libicalParse(text);
  } else if (step == "ical-read") {
    icalRead(input);
  } else if (step == "ical-import") {
    icalImport(input, store);
  } else if (step == "vcard-read") {
    vcardRead(input);
  } else if (step == "vcard-import") {
    vcardImport(input, store);
  } else {
    return 2;
  }
  std::printf("%ld\n", statusKiB("VmHWM:") - before);
  return 0;
}

// The growth of peak memory of one step, in bytes, from a child started afresh.
double childPeakBytes(const char* step, const fs::path& input, const fs::path& store) {
  int pipes[2];
  if (pipe(pipes) != 0) return -1;
  const pid_t child = fork();
  if (child == 0) {
    dup2(pipes[1], STDOUT_FILENO);
    close(pipes[0]);
    execl("/proc/self/exe", "import_bench", "--memory", step, input.c_str(), store.c_str(),
          static_cast<char*>(nullptr));
    _exit(127);
  }
  close(pipes[1]);
  std::string output;
  char buffer[64];
  for (ssize_t n; (n = read(pipes[0], buffer, sizeof buffer)) > 0;) output.append(buffer, n);
  close(pipes[0]);
  int status = 0;
  waitpid(child, &status, 0);
  if (!WIFEXITED(status) || WEXITSTATUS(status) != 0) return -1;
  return std::strtod(output.c_str(), nullptr) * 1024;
}

// Peak memory of each step as a multiple of the file's size (counters), and the bytes above
// the file's size (in MiB).
void BM_Memory(benchmark::State& state, const char* step, bool ics) {
  const fs::path input = ics ? files().ics : files().vcf;
  const double size = static_cast<double>(fs::file_size(input));
  double peak = 0;
  for (auto _ : state) peak = childPeakBytes(step, input, freshStore("memory.db"));
  state.counters["file_MiB"] = size / (1 << 20);
  state.counters["peak_MiB"] = peak / (1 << 20);
  state.counters["peak_per_file"] = peak / size;
  state.counters["above_file_MiB"] = (peak - size) / (1 << 20);
}
BENCHMARK_CAPTURE(BM_Memory, ical_libical, "libical", true)
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_Memory, ical_read, "ical-read", true)
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_Memory, ical_import, "ical-import", true)
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_Memory, vcard_read, "vcard-read", false)
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_Memory, vcard_import, "vcard-import", false)
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond);

}  // namespace

int main(int argc, char** argv) {
  if (argc == 5 && std::string_view(argv[1]) == "--memory") {
    return memoryChild(argv[2], argv[3], argv[4]);
  }
  // The generated files, written to a folder to look at (or to import by hand).
  if (argc == 3 && std::string_view(argv[1]) == "--write") {
    std::ofstream(fs::path(argv[2]) / "bench.ics", std::ios::binary) << icsText();
    std::ofstream(fs::path(argv[2]) / "bench.vcf", std::ios::binary) << vcfText();
    return 0;
  }
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  removeFiles();
  return 0;
}
