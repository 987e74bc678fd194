#include "platform/notification_log.h"

#include <gtest/gtest.h>

#include <string>

#include "platform/linux/dbus_notification_center.h"
#include "support/scoped_environment.h"
#include "support/temporary_folder.h"

namespace zt::platform {
namespace {

using zt::test_support::ScopedEnvironment;
using zt::test_support::TemporaryFolder;

TEST(NotificationLog, NoLogFileWithoutTheVariableOrWhereItCannotBeWritten) {
  TemporaryFolder folder;
  ScopedEnvironment environment;
  environment.unset("TESSEL_NOTIFICATIONS_LOG");
  environment.set("DBUS_SESSION_BUS_ADDRESS", "unix:path=" + (folder / "no-bus").string());
  EXPECT_FALSE(NotificationLog::fromEnvironment().has_value());

  environment.set("TESSEL_NOTIFICATIONS_LOG", (folder / "missing" / "log.jsonl").string());
  DbusNotificationCenter center;
  center.post("TesselClientSyncNotification", "ABC", {});
  EXPECT_TRUE(std::filesystem::is_empty(folder.path()));
}

}  // namespace
}  // namespace zt::platform
