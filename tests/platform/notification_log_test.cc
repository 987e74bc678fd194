#include "platform/notification_log.h"

#include <gtest/gtest.h>

#include <fstream>
#include <iterator>
#include <limits>
#include <string>

#include "platform/linux/dbus_notification_center.h"
#include "support/scoped_environment.h"
#include "support/temporary_folder.h"

namespace zt::platform {
namespace {

using zt::test_support::ScopedEnvironment;
using zt::test_support::TemporaryFolder;

TEST(NotificationLog, EveryValueKindHasAJsonForm) {
  Dictionary nested;
  nested.set("z", Value::boolean(true));
  nested.set("a", Value::boolean(false));
  Dictionary userInfo;
  userInfo.set("half", Value::real(50.5));
  userInfo.set("big", Value::integer(-5000000000));
  userInfo.set("empty", Value(Array{}));
  userInfo.set("nothing", Value(Dictionary{}));
  userInfo.set("nested", Value(nested));
  userInfo.set("mixed", Value(Array{Value::integer(1), "two", Value::real(0.25)}));
  userInfo.set("url", Value(Url{"file:///Volumes/ZETO"}));
  userInfo.set("bytes", Value(Data{0x0a, 0xff}));
  userInfo.set("notANumber", Value::real(std::numeric_limits<double>::quiet_NaN()));
  userInfo.set("broken", Value(std::string("caf\xe9")));
  EXPECT_EQ(NotificationLog::jsonLine("n", "", userInfo),
            R"({"name":"n","object":"","userInfo":{"half":50.5,"big":-5000000000,"empty":[],)"
            R"("nothing":{},"nested":{"z":true,"a":false},"mixed":[1,"two",0.25],)"
            R"("url":"file:///Volumes/ZETO","bytes":"<0aff>","notANumber":null,)"
            "\"broken\":\"caf\xEF\xBF\xBD\"}}");
}

TEST(NotificationLog, NoLogFileWithoutTheVariableOrWhereItCannotBeWritten) {
  TemporaryFolder folder;
  ScopedEnvironment environment;
  environment.unset("TESSEL_NOTIFICATIONS_LOG");
  environment.set("DBUS_SESSION_BUS_ADDRESS", "unix:path=" + (folder / "no-bus").string());
  EXPECT_FALSE(NotificationLog::fromEnvironment().has_value());
  environment.set("TESSEL_NOTIFICATIONS_LOG", "");
  EXPECT_FALSE(NotificationLog::fromEnvironment().has_value());

  environment.set("TESSEL_NOTIFICATIONS_LOG", (folder / "missing" / "log.jsonl").string());
  DbusNotificationCenter center;
  center.post("TesselClientSyncNotification", "ABC", {});
  EXPECT_TRUE(std::filesystem::is_empty(folder.path()));
}

}  // namespace
}  // namespace zt::platform
