// Runs on a private session bus: dbus-run-session starts a dbus-daemon for this binary alone,
// and the real zetosynctool posts its notifications there.
#include <gtest/gtest.h>

#include <chrono>
#include <cstdlib>
#include <string>
#include <vector>

#include "platform/notification_listener.h"
#include "platform/value.h"
#include "sync/synctool_fixture.h"

namespace zt::sync::test_support {
namespace {

using namespace std::chrono_literals;
using platform::Array;
using platform::Dictionary;
using platform::Value;

Dictionary payload(const std::string& phase, double percent, std::optional<std::int64_t> status,
                   std::optional<Array> dataClasses = std::nullopt) {
  Dictionary userInfo;
  userInfo.set("TesselClientCurrentPhase", phase);
  if (status) userInfo.set("TesselClientStatus", Value::integer(*status));
  if (dataClasses) userInfo.set("TesselClientDataClassSyncing", Value(*dataClasses));
  userInfo.set("TesselClientPercentProgressionPhase", Value::real(percent));
  return userInfo;
}

using SyncOnSessionBus = SynctoolTest;

TEST_F(SyncOnSessionBus, AListenerReceivesEveryNotificationOfARun) {
  ASSERT_NE(std::getenv("DBUS_SESSION_BUS_ADDRESS"), nullptr) << "run under dbus-run-session";
  auto listener = platform::NotificationListener::connectToSessionBus();
  ASSERT_NE(listener, nullptr);

  registerClient(kClientID, false, false);
  useSessionBus();
  const SynctoolRun run = syncClient(kClientID);
  EXPECT_EQ(run.exitStatus, 0);

  const std::vector<Dictionary> expected = {
      payload("TesselClientConnectingPhase", 0, std::nullopt),
      payload("TesselClientConnectingPhase", 100, std::nullopt, Array{}),
      payload("TesselClientMinglingPhase", 0, std::nullopt),
      payload("TesselClientUploadingPhase", 100, std::nullopt),
      payload("TesselClientDisconnectingPhase", 100, 0),
  };
  const auto heard = [&] {
    std::vector<Dictionary> payloads;
    while (const auto received = listener->next(payloads.empty() ? 5s : 500ms)) {
      EXPECT_EQ(received->name, "TesselClientSyncNotification");
      EXPECT_EQ(received->sender, kClientID);
      payloads.push_back(received->userInfo);
    }
    return payloads;
  };
  EXPECT_EQ(heard(), expected);
  // The bus does not replace the notification log.
  EXPECT_EQ(run.notifications.size(), expected.size());

  // A run that fails is heard to the end too.
  setPlayers({});
  syncClient(kClientID);
  EXPECT_EQ(heard(),
            (std::vector<Dictionary>{payload("TesselClientConnectingPhase", 0, std::nullopt),
                                     payload("TesselClientDisconnectingPhase", 100, 3)}));
}

}  // namespace
}  // namespace zt::sync::test_support
