// The contacts sync at scale: 10,000 contacts with four related records each, 1,000 of them
// with a photo (half JPEGs over 20 KiB, a quarter small JPEGs, a quarter PNGs), synced to a
// virtual player by the real sync manager, and the same photos through ImageMagick's
// `convert -thumbnail 256x256` in the same run for comparison. The photo cache is measured
// by a second push of the same photos against the first, and the conversion of the photos on
// one thread against prefetching them on every core.
//
//   contacts_bench [--contacts N] [--photos N] [--no-convert]
#include <fcntl.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include "contacts/contact_photo.h"
#include "contacts/zt_contacts_syncer.h"
#include "platform/file_system.h"
#include "platform/log.h"
#include "platform/notification_center.h"
#include "platform/run_loop.h"
#include "platform/user_defaults.h"
#include "platform/virtual/virtual_device_library.h"
#include "support/picture_maker.h"
#include "sync/sync_services.h"
#include "sync/zt_sync_manager.h"
#include "tessel/schema.h"
#include "tessel/store.h"

extern char** environ;

namespace {

namespace fs = std::filesystem;
using Clock = std::chrono::steady_clock;
using zt::platform::Data;
using zt::platform::Dictionary;
using zt::platform::Value;

constexpr std::string_view kClientID = "000A27001A2B3C4D";

double seconds(Clock::duration d) {
  return std::chrono::duration<double>(d).count();
}

long peakResidentKiB() {
  rusage usage{};
  getrusage(RUSAGE_SELF, &usage);
  return usage.ru_maxrss;
}

// Notes when each progress notification of the contacts step arrives.
class TimingCenter final : public zt::platform::NotificationCenter {
 public:
  void post(std::string_view, std::string_view, const Dictionary& userInfo) override {
    const Value* phase = userInfo.find("TesselClientCurrentPhase");
    const Value* percent = userInfo.find("TesselClientPercentProgressionPhase");
    if (!phase || !percent || !percent->asNumber()) return;
    const std::string key = *phase->asString() + " " +
                            std::to_string(static_cast<int>(percent->asNumber()->doubleValue()));
    if (!at.contains(key)) at[key] = Clock::now();
  }
  double between(const std::string& from, const std::string& to) const {
    if (!at.contains(from) || !at.contains(to)) return 0.0;
    return seconds(at.at(to) - at.at(from));
  }
  std::map<std::string, Clock::time_point> at;
};

struct Photos {
  std::vector<Data> pictures;
  std::vector<std::string> extensions;
};

// Distinct pictures, cycled over the contacts that have one: the decoder's work depends on
// size and content, not on having seen the bytes before (libvips caches no operation here).
Photos makePhotos(int count) {
  using zt::test_support::PictureFormat;
  using zt::test_support::PicturePattern;
  Photos photos;
  for (int i = 0; i < count; ++i) {
    zt::test_support::PictureRecipe recipe;
    if (i % 2 == 0) {  // a camera photo: large, detailed
      recipe = {.size = {640 + 16 * (i % 40), 480 + 12 * (i % 40)},
                .pattern = PicturePattern::Noise,
                .jpegQuality = 85};
    } else if (i % 4 == 1) {  // a small JPEG, embedded as it is
      recipe = {.size = {96, 96}, .pattern = PicturePattern::Gradient, .jpegQuality = 75};
    } else {  // a PNG: always converted
      recipe = {.size = {300 + (i % 50), 300}, .format = PictureFormat::PNG};
    }
    std::optional<Data> bytes = zt::test_support::makePicture(recipe);
    if (!bytes) {
      std::fprintf(stderr, "libvips cannot make pictures\n");
      std::exit(1);
    }
    photos.pictures.push_back(std::move(*bytes));
    photos.extensions.push_back(recipe.format == PictureFormat::PNG ? ".png" : ".jpg");
  }
  return photos;
}

std::vector<tessel::Record> makeRecords(int contacts, const Photos& photos) {
  using namespace tessel;
  std::vector<Record> records;
  records.reserve(static_cast<std::size_t>(contacts) * 5 + 10);
  for (int g = 0; g < 10; ++g) {
    records.push_back(
        {"group-" + std::to_string(g),
         Dictionary{{TesselRecordEntityNameKey, TesselEntity_Contacts_Group},
                    {TesselAttribute_Contacts_Group_Name, "Group " + std::to_string(g)}}});
  }
  const int withPhoto = static_cast<int>(photos.pictures.size());
  for (int c = 0; c < contacts; ++c) {
    const std::string id = "contact-" + std::to_string(100000 + c);
    Dictionary contact{
        {TesselRecordEntityNameKey, TesselEntity_Contacts_Contact},
        {TesselAttribute_Contacts_Contact_FirstName, "First" + std::to_string(c)},
        {TesselAttribute_Contacts_Contact_LastName, "Last, " + std::to_string(c)},
        {TesselAttribute_Contacts_Contact_CompanyName, "Company " + std::to_string(c % 97)},
        {TesselAttribute_Contacts_Contact_JobTitle, "Engineer"},
        {TesselAttribute_Contacts_Contact_Notes, "Met at the fair;\nlikes tea, not coffee"},
        {TesselRelationship_Contacts_Contact_ParentGroups,
         zt::platform::Array{"group-" + std::to_string(c % 10)}},
        {TesselRelationship_Contacts_Contact_PhoneNumbers, zt::platform::Array{id + "-phone"}},
        {TesselRelationship_Contacts_Contact_EmailAddresses, zt::platform::Array{id + "-email"}},
        {TesselRelationship_Contacts_Contact_StreetAddresses, zt::platform::Array{id + "-address"}},
        {TesselRelationship_Contacts_Contact_IMs, zt::platform::Array{id + "-im"}},
    };
    // Photos are spread evenly over the contacts.
    if (withPhoto > 0 && c % (contacts / withPhoto) == 0 &&
        c / (contacts / withPhoto) < withPhoto) {
      contact.set(TesselAttribute_Contacts_Contact_Image,
                  photos.pictures[static_cast<std::size_t>(c / (contacts / withPhoto))]);
    }
    records.push_back({id, std::move(contact)});
    records.push_back(
        {id + "-phone",
         Dictionary{{TesselRecordEntityNameKey, TesselEntity_Contacts_PhoneNumber},
                    {TesselAttribute_Contacts_PhoneNumber_Value, "+1 555 01" + std::to_string(c)},
                    {TesselAttribute_Contacts_PhoneNumber_Type,
                     TesselEnumValue_Contacts_PhoneNumber_Type_Mobile}}});
    records.push_back(
        {id + "-email", Dictionary{{TesselRecordEntityNameKey, TesselEntity_Contacts_EmailAddress},
                                   {TesselAttribute_Contacts_EmailAddress_Value,
                                    "person" + std::to_string(c) + "@example.org"},
                                   {TesselAttribute_Contacts_EmailAddress_Type,
                                    TesselEnumValue_Contacts_EmailAddress_Type_Work}}});
    records.push_back({id + "-address",
                       Dictionary{{TesselRecordEntityNameKey, TesselEntity_Contacts_StreetAddress},
                                  {TesselAttribute_Contacts_StreetAddress_Type,
                                   TesselEnumValue_Contacts_StreetAddress_Type_Home},
                                  {TesselAttribute_Contacts_StreetAddress_Street,
                                   std::to_string(c) + " Main Street"},
                                  {TesselAttribute_Contacts_StreetAddress_City, "Springfield"},
                                  {TesselAttribute_Contacts_StreetAddress_PostalCode, "62701"},
                                  {TesselAttribute_Contacts_StreetAddress_Country, "USA"}}});
    records.push_back(
        {id + "-im", Dictionary{{TesselRecordEntityNameKey, TesselEntity_Contacts_IM},
                                {TesselAttribute_Contacts_IM_User, "user" + std::to_string(c)},
                                {TesselAttribute_Contacts_IM_Service, "Jabber"}}});
  }
  return records;
}

struct SyncTimes {
  double total = 0, changes = 0, cards = 0, upload = 0;
  std::uintmax_t fileSize = 0;
  std::int32_t status = 0;
};

SyncTimes runSync(const fs::path& folder, const fs::path& store, bool photos) {
  zt::platform::VirtualDeviceLibrary devices((folder / "devices.json").string());
  TimingCenter center;
  const zt::platform::UserDefaults defaults = zt::platform::UserDefaults::fromText("");
  const zt::platform::FileSystem files;
  zt::sync::SyncServices services{
      devices,
      center,
      defaults,
      files,
      zt::platform::RunLoop::current(),
      store,
      {.contacts = zt::contacts::makeContactsSyncer, .calendars = nullptr},
      [photos](const std::string&) { return photos; }};
  zt::sync::ZTSyncManager manager(std::string(kClientID), std::move(services));
  const Clock::time_point start = Clock::now();
  manager.doSync();
  SyncTimes times;
  times.total = seconds(Clock::now() - start);
  times.changes = center.between("TesselClientUploadingPhase 0", "TesselClientUploadingPhase 34");
  times.cards = center.between("TesselClientUploadingPhase 34", "TesselClientUploadingPhase 68");
  times.upload = center.between("TesselClientUploadingPhase 68", "TesselClientUploadingPhase 100");
  times.status = manager.lastStatus();
  std::error_code ignored;
  times.fileSize = fs::file_size(folder / "vol" / "Contacts" / "Tessel.vcf", ignored);
  return times;
}

int runQuietly(const std::vector<std::string>& arguments) {
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, 1, "/dev/null", O_WRONLY, 0);
  posix_spawn_file_actions_addopen(&actions, 2, "/dev/null", O_WRONLY, 0);
  std::vector<char*> argv;
  for (const std::string& argument : arguments) argv.push_back(const_cast<char*>(argument.c_str()));
  argv.push_back(nullptr);
  pid_t pid = 0;
  int status = -1;
  if (posix_spawnp(&pid, argv[0], &actions, nullptr, argv.data(), environ) == 0) {
    waitpid(pid, &status, 0);
  }
  posix_spawn_file_actions_destroy(&actions);
  return status;
}

}  // namespace

int main(int argc, char* argv[]) {
  int contactCount = 10000;
  int photoCount = 1000;
  bool compare = true;
  for (int i = 1; i < argc; ++i) {
    if (std::strcmp(argv[i], "--contacts") == 0 && i + 1 < argc)
      contactCount = std::atoi(argv[++i]);
    else if (std::strcmp(argv[i], "--photos") == 0 && i + 1 < argc)
      photoCount = std::atoi(argv[++i]);
    else if (std::strcmp(argv[i], "--no-convert") == 0)
      compare = false;
  }
  photoCount = std::min(photoCount, contactCount);

  std::string pattern = (fs::temp_directory_path() / "contacts-bench-XXXXXX").string();
  if (!mkdtemp(pattern.data())) return 1;
  const fs::path folder = pattern;
  fs::create_directories(folder / "vol");
  std::ofstream(folder / "devices.json") << R"([{"id": ")" << kClientID << R"(", "volume": ")"
                                         << (folder / "vol").string() << R"(", "mounted": true}])";
  setenv("XDG_RUNTIME_DIR", folder.c_str(), 1);
  setenv("ZETOSYNCTOOL_LOG", (folder / "log").c_str(), 1);
  // The photo cache of the syncs, empty at the start.
  setenv("XDG_CACHE_HOME", (folder / "cache").c_str(), 1);
  zt::platform::Log::configureFromEnvironment();

  std::printf("contacts_bench: %d contacts with 4 related records each, %d photos\n", contactCount,
              photoCount);
  // The pictures and the store are made in a child process, so that the peak memory figures
  // below are those of the syncs alone.
  const fs::path storePath = folder / "truth.db";
  std::fflush(stdout);
  const pid_t child = fork();
  if (child == 0) {
    Clock::time_point made = Clock::now();
    const Photos photos = makePhotos(photoCount);
    std::size_t large = 0, bytes = 0;
    for (const Data& picture : photos.pictures) {
      bytes += picture.size();
      large += picture.size() > 20480 && picture[0] == 0xFF ? 1 : 0;
    }
    std::printf("  photos made with libvips:   %.2f s (%zu JPEGs over 20 KiB, %.1f MiB in all)\n",
                seconds(Clock::now() - made), large, bytes / 1048576.0);
    made = Clock::now();
    std::unique_ptr<tessel::Store> store = tessel::Store::open(storePath);
    store->putRecords(makeRecords(contactCount, photos));
    store->registerClient(kClientID, "Zeto", zt::sync::ZTSyncManager::entitiesForContacts());
    std::printf("  store filled:               %.2f s\n", seconds(Clock::now() - made));
    std::fflush(stdout);
    _exit(0);
  }
  int childStatus = -1;
  waitpid(child, &childStatus, 0);
  if (childStatus != 0) return 1;
  Clock::time_point start;

  // 1. Without photos: every contact changed, the whole file built and written.
  const SyncTimes plain = runSync(folder, storePath, false);
  std::printf("\nsync without photos (status %d, %.1f MiB file)\n", plain.status,
              plain.fileSize / 1048576.0);
  std::printf("  whole sync %.2f s; accepting changes %.2f s; cards %.2f s; write %.3f s\n",
              plain.total, plain.changes, plain.cards, plain.upload);
  std::printf("  contacts/s (cards):         %.0f\n", contactCount / plain.cards);
  std::printf("  contacts/s (contacts step): %.0f\n",
              contactCount / (plain.changes + plain.cards + plain.upload));

  // 2. Nothing changed: the decision alone.
  const SyncTimes idle = runSync(folder, storePath, false);
  std::printf("  second run, nothing to push: %.3f s\n", idle.total);
  const long rssContacts = peakResidentKiB();

  // 3. Photos on: the setting change pushes the file again, photos embedded.
  const SyncTimes withPhotos = runSync(folder, storePath, true);
  std::printf("\nsync with photos (status %d, %.1f MiB file)\n", withPhotos.status,
              withPhotos.fileSize / 1048576.0);
  std::printf("  cards with photos %.2f s, of which photos ~%.2f s\n", withPhotos.cards,
              withPhotos.cards - plain.cards);
  const long rssPhotos = peakResidentKiB();

  // 3b. The same photos pushed again (the file on the player is gone): every photo from the
  // cache; the file must be the same bytes.
  const fs::path vcf = folder / "vol" / "Contacts" / "Tessel.vcf";
  const auto fileBytes = [](const fs::path& path) {
    std::ifstream in(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(in), {});
  };
  const std::string firstFile = fileBytes(vcf);
  fs::remove(vcf);
  const SyncTimes again = runSync(folder, storePath, true);
  std::printf("second push of the same photos (status %d, %s file)\n", again.status,
              fileBytes(vcf) == firstFile ? "same" : "DIFFERENT");
  std::printf("  cards with photos %.2f s, of which photos ~%.2f s\n", again.cards,
              again.cards - plain.cards);
  std::printf("  ratio first / second push:  cards %.1fx, photos %.1fx\n",
              withPhotos.cards / again.cards,
              (withPhotos.cards - plain.cards) / std::max(1e-6, again.cards - plain.cards));

  // 4. The photos alone, as the card writer prepares them.
  Photos photos;
  tessel::Store::open(storePath)->forEachRecord(
      [&photos](const tessel::Record& record) {
        const Value* image = record.record.find(tessel::TesselAttribute_Contacts_Contact_Image);
        if (!image || !image->asData()) return;
        photos.pictures.push_back(*image->asData());
        photos.extensions.push_back(photos.pictures.back()[0] == 0xFF ? ".jpg" : ".png");
      },
      tessel::TesselEntity_Contacts_Contact);
  zt::contacts::ContactPhotoPreparation preparation(zt::platform::makeImageService);
  std::vector<Dictionary> photoContacts;
  for (const Data& picture : photos.pictures) {
    photoContacts.push_back(Dictionary{{tessel::TesselAttribute_Contacts_Contact_Image, picture}});
  }
  start = Clock::now();
  std::size_t prepared = 0;
  for (const Dictionary& contact : photoContacts)
    prepared += preparation.photoForContact(contact) ? 1 : 0;
  const double ours = seconds(Clock::now() - start);
  std::printf("\nphoto preparation (libvips, shrink-on-load): %zu photos in %.2f s\n", prepared,
              ours);
  std::printf("  photos/s:                   %.0f\n", photoCount / ours);

  // The same photos prefetched on every core, then asked for card by card.
  using Threads = zt::contacts::ContactPhotoPreparation::Threads;
  const auto prefetchedRun = [&](std::unique_ptr<zt::contacts::PhotoCache> cache, Threads threads) {
    zt::contacts::ContactPhotoPreparation prefetching(zt::platform::makeImageService,
                                                      std::move(cache), threads);
    std::vector<const Data*> pictures;
    for (const Dictionary& contact : photoContacts) {
      pictures.push_back(contact.dataAt(tessel::TesselAttribute_Contacts_Contact_Image));
    }
    const Clock::time_point from = Clock::now();
    prefetching.prefetch(pictures);
    for (const Dictionary& contact : photoContacts) prefetching.photoForContact(contact);
    prefetching.finishRun();
    return seconds(Clock::now() - from);
  };
  const double parallel = prefetchedRun(nullptr, Threads::AllCores);
  std::printf("  prefetched on %u threads:     %.2f s, ratio one thread / all: %.1fx\n",
              std::thread::hardware_concurrency(), parallel, ours / parallel);
  const fs::path benchCache = folder / "bench-cache";
  const double cold = prefetchedRun(zt::contacts::PhotoCache::open(benchCache), Threads::AllCores);
  const double warm = prefetchedRun(zt::contacts::PhotoCache::open(benchCache), Threads::AllCores);
  const double warmOne = prefetchedRun(zt::contacts::PhotoCache::open(benchCache), Threads::One);
  std::printf("  with the cache, all threads: first %.2f s, again %.3f s (one thread %.3f s)\n",
              cold, warm, warmOne);
  std::printf("  ratio no cache one thread / cache hit: %.0fx; first / again: %.0fx\n", ours / warm,
              cold / warm);

  if (compare) {
    const fs::path pictures = folder / "pictures";
    fs::create_directories(pictures);
    std::vector<std::string> names;
    for (std::size_t i = 0; i < photos.pictures.size(); ++i) {
      const std::string name =
          (pictures / ("photo" + std::to_string(i) + photos.extensions[i])).string();
      std::ofstream(name, std::ios::binary)
          .write(reinterpret_cast<const char*>(photos.pictures[i].data()),
                 static_cast<std::streamsize>(photos.pictures[i].size()));
      names.push_back(name);
    }
    const std::string convert = fs::exists("/usr/bin/convert") ? "/usr/bin/convert" : "convert";
    start = Clock::now();
    int failures = 0;
    for (std::size_t i = 0; i < names.size(); ++i) {
      failures += runQuietly({convert, names[i], "-thumbnail", "256x256",
                              (pictures / ("thumb" + std::to_string(i) + ".jpg")).string()}) == 0
                      ? 0
                      : 1;
    }
    const double theirs = seconds(Clock::now() - start);
    std::printf("\nImageMagick `convert -thumbnail 256x256`, one process per photo (%d failed)\n",
                failures);
    std::printf("  %zu photos in %.2f s, photos/s: %.0f\n", names.size(), theirs,
                names.size() / theirs);
    std::printf("  ratio convert / ours:       %.1fx\n", theirs / ours);
  }

  std::printf(
      "\npeak resident memory of this process: %.1f MiB after the contacts syncs, "
      "%.1f MiB after the sync with photos, %.1f MiB at the end (photos loaded)\n",
      rssContacts / 1024.0, rssPhotos / 1024.0, peakResidentKiB() / 1024.0);
  std::error_code ignored;
  fs::remove_all(folder, ignored);
  return 0;
}
