// Runs on a private session bus: dbus-run-session starts a dbus-daemon for this binary alone.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <map>
#include <string>

#include "platform/linux/dbus_notification_center.h"
#include "platform/notification_listener.h"
#include "support/scoped_environment.h"
#include "support/temporary_folder.h"

namespace zt::platform {
namespace {

using namespace std::chrono_literals;
using zt::test_support::ScopedEnvironment;
using zt::test_support::TemporaryFolder;

// What a receiver written against the bus alone sees: the D-Bus type of every payload value.
class RawSignalWatcher {
 public:
  RawSignalWatcher() {
    EXPECT_GE(sd_bus_open_user(&bus_), 0);
    EXPECT_GE(sd_bus_match_signal(bus_, &slot_, nullptr, "/org/tessel/Notifications",
                                  "org.tessel.Notifications", "Posted", &RawSignalWatcher::onSignal,
                                  this),
              0);
  }
  ~RawSignalWatcher() {
    sd_bus_slot_unref(slot_);
    sd_bus_flush_close_unref(bus_);
  }

  // Payload key -> signature of its variant, for the next signal.
  std::map<std::string, std::string> nextPayloadTypes() {
    const auto deadline = std::chrono::steady_clock::now() + 5s;
    while (types_.empty() && std::chrono::steady_clock::now() < deadline) {
      if (sd_bus_process(bus_, nullptr) > 0) continue;
      sd_bus_wait(bus_, 100000);
    }
    return std::exchange(types_, {});
  }
  std::string signature() const { return signature_; }

 private:
  static int onSignal(sd_bus_message* m, void* self, sd_bus_error*) {
    auto* watcher = static_cast<RawSignalWatcher*>(self);
    watcher->signature_ = sd_bus_message_get_signature(m, 1);
    const char* name = nullptr;
    const char* sender = nullptr;
    sd_bus_message_read(m, "ss", &name, &sender);
    sd_bus_message_enter_container(m, 'a', "{sv}");
    while (sd_bus_message_enter_container(m, 'e', "sv") > 0) {
      const char* key = nullptr;
      sd_bus_message_read_basic(m, 's', &key);
      char type = 0;
      const char* contents = nullptr;
      sd_bus_message_peek_type(m, &type, &contents);
      watcher->types_[key] = contents;
      sd_bus_message_skip(m, "v");
      sd_bus_message_exit_container(m);
    }
    return 0;
  }

  sd_bus* bus_ = nullptr;
  sd_bus_slot* slot_ = nullptr;
  std::string signature_;
  std::map<std::string, std::string> types_;
};

Dictionary everyKind() {
  Dictionary nested;
  nested.set("inner", Value::integer(7));
  Dictionary userInfo;
  userInfo.set("phase", "TesselClientUploadingPhase");
  userInfo.set("status", Value::integer(-8865));
  userInfo.set("wide", Value::integer(0x123456789));
  userInfo.set("flag", Value::boolean(true));
  userInfo.set("percent", Value::real(50.5));
  userInfo.set("classes", Value(Array{"TesselDataClass_Contacts", "TesselDataClass_Calendars"}));
  userInfo.set("none", Value(Array{}));
  userInfo.set("mixed", Value(Array{Value::integer(1), "two"}));
  userInfo.set("nested", Value(nested));
  userInfo.set("bytes", Value(Data{0, 1, 254}));
  return userInfo;
}

TEST(DbusNotifications, AListenerReceivesEveryPostWithItsPayload) {
  ASSERT_NE(std::getenv("DBUS_SESSION_BUS_ADDRESS"), nullptr) << "run under dbus-run-session";
  auto listener = NotificationListener::connectToSessionBus();
  ASSERT_NE(listener, nullptr);
  RawSignalWatcher watcher;

  DbusNotificationCenter center;
  Dictionary first;
  first.set("TesselClientCurrentPhase", "TesselClientConnectingPhase");
  first.set("TesselClientPercentProgressionPhase", Value::real(0.0));
  center.post("TesselClientSyncNotification", "000A27001A2B3C4D", first);
  center.post("OtherNotification", "sender two", everyKind());

  const auto one = listener->next(5s);
  ASSERT_TRUE(one.has_value());
  EXPECT_EQ(one->name, "TesselClientSyncNotification");
  EXPECT_EQ(one->sender, "000A27001A2B3C4D");
  EXPECT_EQ(one->userInfo, first);

  const auto two = listener->next(5s);
  ASSERT_TRUE(two.has_value());
  EXPECT_EQ(two->name, "OtherNotification");
  EXPECT_EQ(two->sender, "sender two");
  EXPECT_EQ(two->userInfo, everyKind());  // same keys, order and value kinds

  EXPECT_FALSE(listener->next(200ms).has_value());

  EXPECT_EQ(watcher.nextPayloadTypes(),
            (std::map<std::string, std::string>{{"TesselClientCurrentPhase", "s"},
                                                {"TesselClientPercentProgressionPhase", "d"}}));
  EXPECT_EQ(watcher.signature(), "ssa{sv}");
  EXPECT_EQ(watcher.nextPayloadTypes(), (std::map<std::string, std::string>{{"phase", "s"},
                                                                            {"status", "i"},
                                                                            {"wide", "x"},
                                                                            {"flag", "b"},
                                                                            {"percent", "d"},
                                                                            {"classes", "as"},
                                                                            {"none", "as"},
                                                                            {"mixed", "av"},
                                                                            {"nested", "a{sv}"},
                                                                            {"bytes", "ay"}}));
}

TEST(DbusNotifications, WithoutABusPostingDoesNothingAndDoesNotFail) {
  auto listener = NotificationListener::connectToSessionBus();
  ASSERT_NE(listener, nullptr);
  TemporaryFolder folder;
  {
    ScopedEnvironment environment;
    environment.unset("DBUS_SESSION_BUS_ADDRESS");
    // The fallback location of a user bus, empty here.
    environment.set("XDG_RUNTIME_DIR", folder.path().string());
    EXPECT_EQ(NotificationListener::connectToSessionBus(), nullptr);

    DbusNotificationCenter center;
    center.post("Lost", "nobody", Dictionary{{"k", "v"}});
    center.post("Lost", "nobody", Dictionary{{"k", "v"}});
  }
  EXPECT_FALSE(listener->next(300ms).has_value());
}

}  // namespace
}  // namespace zt::platform
