// `tessel watch` on a private session bus (run under dbus-run-session): notifications posted
// by another process become progress lines, and watching one client ends with its outcome.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "platform/notification_center.h"
#include "platform/value.h"

extern char** environ;

namespace {

namespace fs = std::filesystem;
using zt::platform::Array;
using zt::platform::Dictionary;
using zt::platform::Value;

Dictionary progress(const char* phase, double percent) {
  return Dictionary{{"TesselClientCurrentPhase", phase},
                    {"TesselClientPercentProgressionPhase", Value::real(percent)}};
}

TEST(TesselWatch, FollowsOneClientUntilItsFinalNotification) {
  ASSERT_NE(std::getenv("DBUS_SESSION_BUS_ADDRESS"), nullptr) << "run under dbus-run-session";
  const fs::path out = fs::temp_directory_path() / ("tessel-watch-" + std::to_string(getpid()));

  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, 1, out.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
  std::vector<std::string> args = {TESSEL_BINARY, "watch", "zeto-1A2B"};
  std::vector<char*> argv;
  for (std::string& arg : args) argv.push_back(arg.data());
  argv.push_back(nullptr);
  pid_t pid = 0;
  ASSERT_EQ(posix_spawn(&pid, argv[0], &actions, nullptr, argv.data(), environ), 0);
  posix_spawn_file_actions_destroy(&actions);
  // The watcher subscribes before it reads; give it a moment to be on the bus.
  std::this_thread::sleep_for(std::chrono::milliseconds(500));

  zt::platform::NotificationCenter& center = zt::platform::NotificationCenter::system();
  const char* name = "TesselClientSyncNotification";
  center.post(name, "zeto-1A2B", progress("TesselClientConnectingPhase", 0));
  Dictionary connected = progress("TesselClientConnectingPhase", 100);
  connected.set("TesselClientDataClassSyncing", Array{"tessel.contacts", "tessel.calendars"});
  center.post(name, "zeto-1A2B", connected);
  // Another player's sync is not this watcher's business.
  center.post(name, "zeto-FFFF", progress("TesselClientUploadingPhase", 50));
  center.post(name, "zeto-1A2B", progress("TesselClientUploadingPhase", 50.5));
  Dictionary last = progress("TesselClientDisconnectingPhase", 100);
  last.set("TesselClientStatus", Value::integer(3));
  center.post(name, "zeto-1A2B", last);

  int status = 0;
  ASSERT_EQ(waitpid(pid, &status, 0), pid);
  ASSERT_TRUE(WIFEXITED(status));
  EXPECT_EQ(WEXITSTATUS(status), 3);

  std::ifstream in(out);
  std::stringstream text;
  text << in.rdbuf();
  fs::remove(out);
  EXPECT_EQ(text.str(),
            "zeto-1A2B [------------------------------]   0.0% connecting\n"
            "zeto-1A2B [##############################] 100.0% connecting (contacts, calendars)\n"
            "zeto-1A2B [###############---------------]  50.5% writing (contacts, calendars)\n"
            "zeto-1A2B [##############################] 100.0% done (contacts, calendars): "
            "player unavailable\n");
}

}  // namespace
