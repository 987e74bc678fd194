// `tessel sync` through the binaries, on a real store and virtual players, under a session bus of
// its own (dbus-run-session): what it prints, its exit status, and the desktop notice that a
// notification service of the test's own receives.
#include <gtest/gtest.h>
#include <systemd/sd-bus.h>

#include <atomic>
#include <cstdint>
#include <cstdlib>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <tuple>
#include <vector>

#include "support/files.h"
#include "support/process.h"
#include "sync/synctool_fixture.h"

namespace zt::sync::test_support {
namespace {

const fs::path kSamples = fs::path(ZT_SAMPLES_DIR);

// One Notify call as the service received it.
struct Notice {
  std::string summary;
  std::string body;
  int urgency = -1;
  bool operator==(const Notice&) const = default;
};

std::ostream& operator<<(std::ostream& out, const Notice& notice) {
  return out << "{" << notice.summary << " | " << notice.body << " | " << notice.urgency << "}";
}

// org.freedesktop.Notifications on the session bus, as a desktop runs it: it reads body markup
// and records each notice.
class NotificationService {
 public:
  NotificationService() {
    if (sd_bus_open_user(&bus_) < 0 ||
        sd_bus_add_object_vtable(bus_, nullptr, "/org/freedesktop/Notifications",
                                 "org.freedesktop.Notifications", methods(), this) < 0 ||
        sd_bus_request_name(bus_, "org.freedesktop.Notifications", 0) < 0) {
      ADD_FAILURE() << "cannot offer org.freedesktop.Notifications";
      return;
    }
    serving_ = std::thread([this] {
      while (!stop_) {
        const int processed = sd_bus_process(bus_, nullptr);
        if (processed < 0) break;
        if (processed == 0) sd_bus_wait(bus_, 50'000);
      }
    });
  }
  ~NotificationService() {
    stop_ = true;
    if (serving_.joinable()) serving_.join();
    sd_bus_flush_close_unref(bus_);
  }

  std::vector<Notice> notices() {
    std::lock_guard lock(mutex_);
    return notices_;
  }

 private:
  static int capabilities(sd_bus_message* call, void*, sd_bus_error*) {
    return sd_bus_reply_method_return(call, "as", 2, "body", "body-markup");
  }
  static int notify(sd_bus_message* call, void* self, sd_bus_error*) {
    const char *application, *icon, *summary, *body;
    std::uint32_t replaces = 0;
    Notice notice;
    if (sd_bus_message_read(call, "susss", &application, &replaces, &icon, &summary, &body) < 0 ||
        sd_bus_message_skip(call, "as") < 0 ||
        sd_bus_message_enter_container(call, 'a', "{sv}") < 0)
      return -EINVAL;
    notice.summary = summary;
    notice.body = body;
    while (sd_bus_message_enter_container(call, 'e', "sv") > 0) {
      const char* key = nullptr;
      std::uint8_t urgency = 0;
      if (sd_bus_message_read(call, "s", &key) < 0) return -EINVAL;
      if (std::string_view(key) == "urgency" && sd_bus_message_read(call, "v", "y", &urgency) >= 0)
        notice.urgency = urgency;
      else
        sd_bus_message_skip(call, "v");
      sd_bus_message_exit_container(call);
    }
    auto* service = static_cast<NotificationService*>(self);
    std::lock_guard lock(service->mutex_);
    service->notices_.push_back(notice);
    return sd_bus_reply_method_return(call, "u",
                                      static_cast<std::uint32_t>(service->notices_.size()));
  }
  static const sd_bus_vtable* methods() {
    static const sd_bus_vtable table[] = {
        SD_BUS_VTABLE_START(0),
        SD_BUS_METHOD("GetCapabilities", "", "as", capabilities, SD_BUS_VTABLE_UNPRIVILEGED),
        SD_BUS_METHOD("Notify", "susssasa{sv}i", "u", notify, SD_BUS_VTABLE_UNPRIVILEGED),
        SD_BUS_VTABLE_END};
    return table;
  }

  sd_bus* bus_ = nullptr;
  std::thread serving_;
  std::atomic<bool> stop_ = false;
  std::mutex mutex_;
  std::vector<Notice> notices_;
};

enum class Desktop { Service, BusWithoutService, NoBus };

// The player "My Zeto", registered and connected, unless the scene says otherwise.
enum class Scene {
  Registered,
  // and a second registered player, "Other & Co", whose lock another process holds
  SecondPlayerBusy,
  NotRegistered,
  NotConnected,
  NoSynctool,  // zetosynctool is not on PATH
};

constexpr int kCritical = 2, kNormal = 1;
const std::string kClient = "zeto-A27001A2B3C4D";
const std::string kOther = "zeto-B0B0B";

// The case's name, its scene and desktop, the arguments after `tessel --store STORE sync`, and
// the exit status, part of standard output, part of standard error (empty: nothing there) and
// the desktop notice it gives.
using Case = std::tuple<std::string, Scene, Desktop, std::vector<std::string>, int, std::string,
                        std::string, std::optional<Notice>>;

const Case kCases[] = {
    {"OneClient",
     Scene::Registered,
     Desktop::Service,
     {kClient},
     0,
     kClient + ": synced: 4 contacts, 2 calendars\n",
     "",
     Notice{"My Zeto synced", "4 contacts, 2 calendars", kNormal}},
    // The service reads markup: the name's "&" is escaped.
    {"EveryConnectedPlayerAndTheWorstStatus",
     Scene::SecondPlayerBusy,
     Desktop::Service,
     {},
     3,
     kOther + ": not synced: another sync is using the player: tessel sync " + kOther +
         " once it ends\n",
     "",
     Notice{"Other & Co not synced",
            "My Zeto: synced: 4 contacts, 2 calendars\nOther &amp; Co: not synced: another sync "
            "is using the player: tessel sync " +
                kOther + " once it ends",
            kCritical}},
    {"NoRegisteredPlayer",
     Scene::NotRegistered,
     Desktop::Service,
     {},
     5,
     "",
     "tessel: the player A27001A2B3C4D is not registered: tessel client register " + kClient +
         " --contacts --calendars\ntessel: no connected Zeto player has a registered sync client "
         "(tessel devices shows them)\n",
     Notice{"No Zeto to sync",
            "no connected Zeto player has a registered sync client (tessel devices shows them)",
            kNormal}},
    {"PlayerNotConnected",
     Scene::NotConnected,
     Desktop::Service,
     {kClient},
     3,
     kClient + ": not synced: the player is not connected: plug it in (tessel devices)\n",
     "",
     Notice{"My Zeto not synced", "the player is not connected: plug it in (tessel devices)",
            kCritical}},
    {"UnknownClient",
     Scene::Registered,
     Desktop::Service,
     {"zeto-FFFF"},
     2,
     "zeto-FFFF: failed: no sync client zeto-FFFF in the store",
     "",
     Notice{"Zeto sync failed",
            "no sync client zeto-FFFF in the store: tessel devices suggests one for each player, "
            "tessel client register registers it",
            kCritical}},
    {"NoSynctool",
     Scene::NoSynctool,
     Desktop::Service,
     {},
     2,
     "",
     "tessel: zetosynctool is neither beside tessel nor on PATH",
     Notice{"Zeto not synced",
            "zetosynctool is neither beside tessel nor on PATH: install both programs together "
            "(docs/USAGE.md)",
            kCritical}},
    // Without a notification service, or a bus at all, the notice is left out without a word.
    {"NoNotificationService",
     Scene::Registered,
     Desktop::BusWithoutService,
     {},
     0,
     kClient + ": synced: 4 contacts, 2 calendars\n",
     "",
     std::nullopt},
    {"NoSessionBus",
     Scene::Registered,
     Desktop::NoBus,
     {},
     0,
     kClient + ": synced: 4 contacts, 2 calendars\n",
     "",
     std::nullopt},
};

class TesselSync : public SynctoolTest, public ::testing::WithParamInterface<Case> {};

TEST_P(TesselSync, SaysHowItWentOnTheTerminalAndTheDesktop) {
  const auto& [name, scene, desktop, arguments, status, out, err, notice] = GetParam();
  ASSERT_NE(std::getenv("DBUS_SESSION_BUS_ADDRESS"), nullptr) << "run under dbus-run-session";
  tessel({"import", "vcard", (kSamples / "contacts" / "family-vdir").string()});
  tessel({"import", "ical", (kSamples / "calendars" / "home.ics").string(),
          (kSamples / "calendars" / "work.ics").string()});
  if (scene != Scene::NotRegistered)
    tessel({"client", "register", kClient, "--contacts", "--calendars", "--name", "My Zeto"});
  std::vector<Player> players;
  if (scene != Scene::NotConnected) players.emplace_back("000A27001A2B3C4D");
  if (scene == Scene::SecondPlayerBusy) {
    fs::create_directories(folder() / "other");
    players.emplace_back("B0B0B", folder() / "other");
    tessel({"client", "register", kOther, "--contacts", "--name", "Other & Co"});
  }
  setPlayers(players);
  if (desktop != Desktop::NoBus) useSessionBus();
  // Beside the tessel of the build tree there is no zetosynctool: PATH finds it, or not.
  setEnvironment("PATH", scene == Scene::NoSynctool
                             ? folder().string()
                             : fs::path(ZETOSYNCTOOL_BINARY).parent_path().string());
  // Without a notifications log of the person's, the command follows one of its own.
  if (desktop == Desktop::NoBus) setEnvironment("TESSEL_NOTIFICATIONS_LOG", "");

  std::optional<NotificationService> service;
  if (desktop == Desktop::Service) service.emplace();
  std::optional<LockHolder> holder;
  if (scene == Scene::SecondPlayerBusy) {
    holder.emplace(environment(), 0xB0B0B);
    ASSERT_EQ(holder->result(), 0);
  }
  zt::test_support::ProcessOptions options;
  options.environment = environment();
  std::vector<std::string> words = {TESSEL_BINARY, "--store", (folder() / "truth.db").string(),
                                    "sync"};
  words.insert(words.end(), arguments.begin(), arguments.end());
  const zt::test_support::ProcessRun run = zt::test_support::runProcess(words, options);

  EXPECT_EQ(run.status, status) << run.out << run.err;
  EXPECT_CONTAINS(run.out, out);
  if (err.empty()) {
    EXPECT_EQ(run.err, "");
  } else {
    EXPECT_CONTAINS(run.err, err);
  }
  if (service) {
    const std::vector<Notice> notices = service->notices();
    ASSERT_EQ(notices.size(), notice ? 1u : 0u);
    if (notice) {
      EXPECT_EQ(notices.front(), *notice);
    }
  }
  // The progress went through a file of the command's own, which it removed.
  EXPECT_EQ(zt::test_support::namesIn(folder() / "run"), std::vector<std::string>{});
}

INSTANTIATE_TEST_SUITE_P(Cases, TesselSync, ::testing::ValuesIn(kCases),
                         [](const ::testing::TestParamInfo<Case>& param) {
                           return std::get<0>(param.param);
                         });

}  // namespace
}  // namespace zt::sync::test_support
