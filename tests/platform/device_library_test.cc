#include "platform/device_library.h"

#include <gtest/gtest.h>
#include <poll.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/device_locks.h"
#include "platform/linux/linux_device_library.h"
#include "platform/log.h"
#include "platform/run_loop.h"
#include "platform/virtual/virtual_device_library.h"
#include "platform/virtual/virtual_players.h"

namespace zt::platform {
namespace {

namespace fs = std::filesystem;
using RunResult = RunLoop::RunResult;
using ReturnAfter = RunLoop::ReturnAfter;

struct Delivered {
  ZetoRef device;
  std::int32_t event;
};

struct Receiver {
  std::vector<Delivered> events;
  DeviceLibrary* unregisterOn = nullptr;  // unregisters from inside its first callback

  static void callback(ZetoRef device, std::int32_t event, void* ignored, void* context) {
    EXPECT_EQ(ignored, nullptr);
    auto* self = static_cast<Receiver*>(context);
    self->events.push_back({device, event});
    if (self->unregisterOn) self->unregisterOn->ZetoUnregisterFromServer();
  }
};

// Each case gets its own folder, with the lock folder inside it.
class DeviceLibraryTest : public ::testing::Test {
 protected:
  void SetUp() override {
    char pattern[] = "/tmp/zt-device-XXXXXX";
    ASSERT_NE(mkdtemp(pattern), nullptr);
    dir_ = pattern;
    fs::create_directory(dir_ / "runtime");
    fs::create_directory(dir_ / "volume");
    setenv("XDG_RUNTIME_DIR", (dir_ / "runtime").c_str(), 1);
    unsetenv("ZETOSYNCTOOL_LOG");
    Log::configureFromEnvironment();
  }
  void TearDown() override {
    unsetenv("XDG_RUNTIME_DIR");
    unsetenv("ZETO_VIRTUAL_DEVICES");
    unsetenv("ZETOSYNCTOOL_LOG");
    Log::configureFromEnvironment();
    fs::remove_all(dir_);
  }

  std::string writeDeviceFile(const std::string& json) {
    std::string path = dir_ / "devices.json";
    std::ofstream(path) << json;
    return path;
  }
  std::string volume() const { return dir_ / "volume"; }

  // The players most cases use: one mounted, one mounting late, one never mounting.
  std::string threePlayers(double mountAfter = 0.3) {
    std::ostringstream json;
    json << R"([{"id": "000A27001A2B3C4D", "volume": ")" << volume()
         << R"(", "mounted": true, "checkpoint": "/x/self.xml"},)"
         << R"({"id": "1a2b", "volume": ")" << volume() << R"(", "mount_after": )" << mountAfter
         << "},"
         << R"({"id": "F", "volume": ")" << volume() << R"(", "mounted": false}])";
    return writeDeviceFile(json.str());
  }

  fs::path dir_;
};

TEST_F(DeviceLibraryTest, VirtualListsPlayersWithIdsAndMountPoints) {
  VirtualDeviceLibrary library(threePlayers());
  std::vector<ZetoRef> devices;
  ASSERT_EQ(library.ZetoCopyConnected(devices), kZetoSuccess);
  ASSERT_EQ(devices.size(), 3u);
  EXPECT_EQ(library.ZetoGetUniqueID(devices[0]), 0xA27001A2B3C4DULL);
  EXPECT_EQ(library.ZetoGetUniqueID(devices[1]), 0x1A2BULL);

  std::string path = "unchanged";
  EXPECT_EQ(library.ZetoCopyMountpoint(devices[0], path), kZetoSuccess);
  EXPECT_EQ(path, volume());
  EXPECT_EQ(library.mountedFromDevice(devices[0]), "/dev/zetovirt0");
  EXPECT_EQ(library.checkpoint(devices[0]), "/x/self.xml");

  for (ZetoRef unmounted : {devices[1], devices[2]}) {
    path = "unchanged";
    EXPECT_EQ(library.ZetoCopyMountpoint(unmounted, path), kZetoErrorNotMounted);
    EXPECT_EQ(path, "unchanged");
    EXPECT_EQ(library.mountedFromDevice(unmounted), std::nullopt);
  }

  // A second listing gives references equal to the first.
  std::vector<ZetoRef> again;
  ASSERT_EQ(library.ZetoCopyConnected(again), kZetoSuccess);
  EXPECT_EQ(again, devices);
}

TEST_F(DeviceLibraryTest, VirtualLateMountArrivesAsAttachedThenMountedInTheRegisteredMode) {
  RunLoop loop;  // outlives the registration
  VirtualDeviceLibrary library(threePlayers(0.3));
  std::vector<ZetoRef> devices;
  ASSERT_EQ(library.ZetoCopyConnected(devices), kZetoSuccess);
  Receiver receiver;
  auto start = RunLoop::Clock::now();
  ASSERT_EQ(library.ZetoRegisterWithServer(loop, "ZetoMode", &Receiver::callback, &receiver),
            kZetoSuccess);

  // Running another mode past the mount time delivers nothing.
  int quiet[2];
  ASSERT_EQ(pipe(quiet), 0);
  auto other = loop.addDescriptor(quiet[0], POLLIN, {"Other"}, [](int, short) {});
  EXPECT_EQ(loop.runInMode("Other", 0.5, ReturnAfter::SourceHandled), RunResult::TimedOut);
  loop.removeSource(other);
  close(quiet[0]);
  close(quiet[1]);
  EXPECT_TRUE(receiver.events.empty());

  EXPECT_EQ(loop.runInMode("ZetoMode", 5.0, ReturnAfter::SourceHandled), RunResult::SourceHandled);
  EXPECT_GE(std::chrono::duration<double>(RunLoop::Clock::now() - start).count(), 0.3);
  ASSERT_EQ(receiver.events.size(), 2u);
  EXPECT_EQ(receiver.events[0].device, devices[1]);
  EXPECT_EQ(receiver.events[0].event, static_cast<std::int32_t>(ZetoEvent::Attached));
  EXPECT_EQ(receiver.events[1].device, devices[1]);
  EXPECT_EQ(receiver.events[1].event, static_cast<std::int32_t>(ZetoEvent::Mounted));

  std::string path;
  EXPECT_EQ(library.ZetoCopyMountpoint(devices[1], path), kZetoSuccess);
  EXPECT_EQ(path, volume());
  EXPECT_EQ(library.mountedFromDevice(devices[1]), "/dev/zetovirt1");
  EXPECT_EQ(library.ZetoUnregisterFromServer(), kZetoSuccess);
  EXPECT_EQ(loop.runInMode("ZetoMode", 0.1, ReturnAfter::SourceHandled), RunResult::NoSources);
}

TEST_F(DeviceLibraryTest, VirtualUnregisterStopsDelivery) {
  RunLoop loop;
  VirtualDeviceLibrary library(threePlayers(0.1));
  std::vector<ZetoRef> devices;
  ASSERT_EQ(library.ZetoCopyConnected(devices), kZetoSuccess);
  Receiver receiver;
  ASSERT_EQ(library.ZetoRegisterWithServer(loop, "ZetoMode", &Receiver::callback, &receiver),
            kZetoSuccess);
  library.ZetoUnregisterFromServer();
  EXPECT_EQ(loop.runInMode("ZetoMode", 0.3, ReturnAfter::TimeElapsed), RunResult::NoSources);
  EXPECT_TRUE(receiver.events.empty());
  std::string path;
  EXPECT_EQ(library.ZetoCopyMountpoint(devices[1], path), kZetoErrorNotMounted);

  // Unregistering from inside the callback stops the rest of that delivery.
  receiver.unregisterOn = &library;
  ASSERT_EQ(library.ZetoRegisterWithServer(loop, "ZetoMode", &Receiver::callback, &receiver),
            kZetoSuccess);
  EXPECT_EQ(loop.runInMode("ZetoMode", 5.0, ReturnAfter::SourceHandled), RunResult::SourceHandled);
  ASSERT_EQ(receiver.events.size(), 1u);
  EXPECT_EQ(receiver.events[0].event, static_cast<std::int32_t>(ZetoEvent::Attached));
  EXPECT_EQ(loop.runInMode("ZetoMode", 0.1, ReturnAfter::SourceHandled), RunResult::NoSources);
}

TEST_F(DeviceLibraryTest, VirtualMalformedFilesAreErrorsWithAReasonInTheLog) {
  const std::vector<std::pair<std::string, std::string>> cases = {
      {"[{\"id\": ", "not JSON"},
      {R"({"id": "F", "volume": "/v"})", "not an array"},
      {R"([{"volume": "/v"}])", "\"id\" is missing"},
      {R"([{"id": "0x1F", "volume": "/v"}])", "hexadecimal"},
      {R"([{"id": "F", "volume": "/v"}, {"id": "E"}])", "entry 1: \"volume\""},
      {R"([{"id": "F", "volume": "/v", "mount_after": -1}])", "\"mount_after\""},
  };
  for (std::size_t i = 0; i < cases.size(); ++i) {
    const auto& [json, reason] = cases[i];
    SCOPED_TRACE(json);
    std::string log = dir_ / ("log" + std::to_string(i) + ".txt");
    setenv("ZETOSYNCTOOL_LOG", log.c_str(), 1);
    Log::configureFromEnvironment();
    RunLoop loop;
    VirtualDeviceLibrary library(writeDeviceFile(json));
    std::vector<ZetoRef> devices;
    EXPECT_NE(library.ZetoCopyConnected(devices), kZetoSuccess);
    EXPECT_TRUE(devices.empty());
    EXPECT_NE(library.ZetoRegisterWithServer(loop, "ZetoMode", &Receiver::callback, nullptr),
              kZetoSuccess);
    std::ifstream in(log);
    std::string line;
    ASSERT_TRUE(std::getline(in, line));
    EXPECT_NE(line.find("devices.json"), std::string::npos) << line;
    EXPECT_NE(line.find(reason), std::string::npos) << line;
  }
  VirtualDeviceLibrary missing((dir_ / "absent.json").string());
  std::vector<ZetoRef> devices;
  EXPECT_EQ(missing.ZetoCopyConnected(devices), kZetoErrorBadDeviceFile);
}

// Runs `body` in a child process and returns its exit status.
template <typename Body>
int inChild(Body body) {
  pid_t pid = fork();
  if (pid == 0) _exit(body());
  int status = 0;
  waitpid(pid, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

TEST_F(DeviceLibraryTest, LockIsExclusiveAcrossProcessesUntilReleased) {
  std::string file = threePlayers();
  VirtualDeviceLibrary library(file);
  std::vector<ZetoRef> devices;
  ASSERT_EQ(library.ZetoCopyConnected(devices), kZetoSuccess);
  // The other process runs for another user's session: its own runtime folder and home, and
  // it names the device file through a link.
  fs::create_symlink(dir_, dir_ / "link");
  auto childTakesLock = [&] {
    return inChild([&] {
      setenv("XDG_RUNTIME_DIR", (dir_ / "volume").c_str(), 1);
      setenv("HOME", (dir_ / "volume").c_str(), 1);
      VirtualDeviceLibrary other((dir_ / "link/devices.json").string());
      std::vector<ZetoRef> theirs;
      if (other.ZetoCopyConnected(theirs) != kZetoSuccess) return 2;
      std::int32_t result = other.ZetoAquireLock(theirs[0]);
      if (result == kZetoErrorLockBusy) return 1;
      return result == kZetoSuccess ? 0 : 3;
    });
  };

  ASSERT_EQ(library.ZetoAquireLock(devices[0]), kZetoSuccess);
  EXPECT_EQ(childTakesLock(), 1);
  // Not re-entrant, and other players' locks are separate.
  EXPECT_EQ(library.ZetoAquireLock(devices[0]), kZetoErrorLockBusy);
  EXPECT_EQ(library.ZetoAquireLock(devices[1]), kZetoSuccess);
  // Beside the device file, readable by every user's syncs.
  EXPECT_EQ(fs::status(dir_ / "zeto-A27001A2B3C4D.lock").permissions() & fs::perms::all,
            fs::perms::owner_read | fs::perms::owner_write | fs::perms::group_read |
                fs::perms::others_read);

  EXPECT_EQ(library.ZetoReleaseLock(devices[0]), kZetoSuccess);
  EXPECT_EQ(childTakesLock(), 0);
  EXPECT_EQ(library.ZetoReleaseLock(devices[0]), kZetoErrorNotLocked);
  EXPECT_EQ(library.ZetoReleaseLock(devices[2]), kZetoErrorNotLocked);
}

TEST_F(DeviceLibraryTest, LockDiesWithItsHolder) {
  VirtualDeviceLibrary library(threePlayers());
  std::vector<ZetoRef> devices;
  ASSERT_EQ(library.ZetoCopyConnected(devices), kZetoSuccess);
  EXPECT_EQ(inChild([&] {
              auto* leaked = new DeviceLocks(dir_.string());  // never destroyed: the process ends
              return leaked->acquire(0xA27001A2B3C4DULL) == kZetoSuccess ? 0 : 1;
            }),
            0);
  EXPECT_EQ(library.ZetoAquireLock(devices[0]), kZetoSuccess);
}

TEST_F(DeviceLibraryTest, RealPlayersLockInTheMachineFolderWhateverTheEnvironment) {
  unsetenv("XDG_RUNTIME_DIR");
  const std::string folder = DeviceLocks::machineFolder();
  EXPECT_EQ(folder, fs::is_directory("/run/lock") ? "/run/lock" : folder);
  EXPECT_EQ(DeviceLocks(folder).lockPathFor(0x1A2B), folder + "/zeto-1A2B.lock");
  setenv("XDG_RUNTIME_DIR", (dir_ / "runtime").c_str(), 1);
  EXPECT_EQ(DeviceLocks::machineFolder(), folder);
}

TEST_F(DeviceLibraryTest, LockRefusesWhatOthersPlantedInASharedFolder) {
  // A world-writable sticky folder like /run/lock.
  const fs::path shared = dir_ / "shared";
  fs::create_directory(shared);
  fs::permissions(shared, fs::perms::all | fs::perms::sticky_bit);
  DeviceLocks locks(shared.string());

  fs::create_symlink(dir_ / "victim", shared / "zeto-1.lock");
  fs::create_directory(shared / "zeto-2.lock");
  ASSERT_EQ(mkfifo((shared / "zeto-3.lock").c_str(), 0666), 0);
  EXPECT_EQ(locks.acquire(1), kZetoErrorFailed);
  EXPECT_FALSE(fs::exists(dir_ / "victim"));
  EXPECT_EQ(locks.acquire(2), kZetoErrorFailed);
  EXPECT_EQ(locks.acquire(3), kZetoErrorFailed);  // and does not hang on the FIFO

  // Another user's lock file, read-only to us, still locks.
  const fs::path theirs = shared / "zeto-4.lock";
  std::ofstream(theirs).put('\0');
  fs::permissions(theirs, fs::perms::owner_read | fs::perms::group_read | fs::perms::others_read);
  if (geteuid() == 0) {
    ASSERT_EQ(chown(theirs.c_str(), 65534, 65534), 0);
  }
  EXPECT_EQ(locks.acquire(4), kZetoSuccess);
  EXPECT_EQ(inChild([&] { return DeviceLocks(shared.string()).acquire(4) == kZetoErrorLockBusy; }),
            1);
}

TEST_F(DeviceLibraryTest, FactoryChoosesVirtualWhenTheDeviceFileIsNamed) {
  setenv("ZETO_VIRTUAL_DEVICES", threePlayers().c_str(), 1);
  auto library = makeDeviceLibrary();
  EXPECT_NE(dynamic_cast<VirtualDeviceLibrary*>(library.get()), nullptr);
  std::vector<ZetoRef> devices;
  EXPECT_EQ(library->ZetoCopyConnected(devices), kZetoSuccess);
  EXPECT_EQ(devices.size(), 3u);

  unsetenv("ZETO_VIRTUAL_DEVICES");
  EXPECT_NE(dynamic_cast<LinuxDeviceLibrary*>(makeDeviceLibrary().get()), nullptr);
  setenv("ZETO_VIRTUAL_DEVICES", "", 1);
  EXPECT_NE(dynamic_cast<LinuxDeviceLibrary*>(makeDeviceLibrary().get()), nullptr);
}

}  // namespace
}  // namespace zt::platform
