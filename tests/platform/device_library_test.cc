#include "platform/device_library.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "platform/linux/device_locks.h"
#include "platform/virtual/virtual_device_library.h"
#include "support/files.h"
#include "support/scoped_environment.h"
#include "support/temporary_folder.h"

namespace zt::platform {
namespace {

namespace fs = std::filesystem;
using test_support::ScopedEnvironment;
using test_support::TemporaryFolder;

// The locks of the players: each case gets its own folder, with the lock folder inside it.
// (What the virtual players do otherwise, the end-to-end syncs of tests/sync go through.)
class DeviceLibraryTest : public ::testing::Test {
 protected:
  DeviceLibraryTest() {
    fs::create_directory(dir_ / "runtime");
    fs::create_directory(dir_ / "volume");
    environment_.set("XDG_RUNTIME_DIR", (dir_ / "runtime").string());
  }
  std::string writeDeviceFile(const std::string& json) {
    test_support::writeFile(dir_ / "devices.json", json);
    return (dir_ / "devices.json").string();
  }
  // One player mounted, one mounting late, one never mounting.
  std::string threePlayers() {
    const std::string volume = (dir_ / "volume").string();
    return writeDeviceFile(R"([{"id": "000A27001A2B3C4D", "volume": ")" + volume +
                           R"(", "mounted": true}, {"id": "1a2b", "volume": ")" + volume +
                           R"(", "mount_after": 0.3}, {"id": "F", "volume": ")" + volume +
                           R"(", "mounted": false}])");
  }
  std::vector<ZetoRef> connected(DeviceLibrary& library) {
    std::vector<ZetoRef> devices;
    EXPECT_EQ(library.ZetoCopyConnected(devices), kZetoSuccess);
    return devices;
  }

  TemporaryFolder folder_;
  fs::path dir_ = folder_.path();
  ScopedEnvironment environment_;
};

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
  VirtualDeviceLibrary library(threePlayers());
  const std::vector<ZetoRef> devices = connected(library);
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
  const std::vector<ZetoRef> devices = connected(library);
  EXPECT_EQ(inChild([&] {
              auto* leaked = new DeviceLocks(dir_.string());  // never destroyed: the process ends
              return leaked->acquire(0xA27001A2B3C4DULL) == kZetoSuccess ? 0 : 1;
            }),
            0);
  EXPECT_EQ(library.ZetoAquireLock(devices[0]), kZetoSuccess);
}

TEST_F(DeviceLibraryTest, RealPlayersLockInTheMachineFolderWhateverTheEnvironment) {
  environment_.unset("XDG_RUNTIME_DIR");
  const std::string folder = DeviceLocks::machineFolder();
  EXPECT_EQ(folder, fs::is_directory("/run/lock") ? "/run/lock" : folder);
  EXPECT_EQ(DeviceLocks(folder).lockPathFor(0x1A2B), folder + "/zeto-1A2B.lock");
  environment_.set("XDG_RUNTIME_DIR", (dir_ / "runtime").string());
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

}  // namespace
}  // namespace zt::platform
