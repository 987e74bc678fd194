// `tessel watch` on a private session bus (run under dbus-run-session): notifications posted
// by another process become progress lines, and watching one client ends with its outcome.

#include <gtest/gtest.h>

#include <chrono>
#include <cstdlib>
#include <thread>

#include "platform/notification_center.h"
#include "platform/value.h"
#include "support/process.h"

namespace {

using zt::platform::Array;
using zt::platform::Dictionary;
using zt::platform::Value;

Dictionary progress(const char* phase, double percent) {
  return Dictionary{{"TesselClientCurrentPhase", phase},
                    {"TesselClientPercentProgressionPhase", Value::real(percent)}};
}

TEST(TesselWatch, FollowsOneClientUntilItsFinalNotification) {
  ASSERT_NE(std::getenv("DBUS_SESSION_BUS_ADDRESS"), nullptr) << "run under dbus-run-session";
  zt::test_support::BackgroundProcess watcher({TESSEL_BINARY, "watch", "zeto-1A2B"});
  ASSERT_TRUE(watcher.started());
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

  const zt::test_support::ProcessRun run = watcher.wait();
  EXPECT_EQ(run.status, 3);
  EXPECT_EQ(run.out,
            "zeto-1A2B [------------------------------]   0.0% connecting\n"
            "zeto-1A2B [##############################] 100.0% connecting (contacts, calendars)\n"
            "zeto-1A2B [###############---------------]  50.5% writing (contacts, calendars)\n"
            "zeto-1A2B [##############################] 100.0% done (contacts, calendars): "
            "player unavailable\n");
}

}  // namespace
