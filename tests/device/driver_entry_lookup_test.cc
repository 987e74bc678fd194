#include "device/driver_entry_lookup.h"

#include <gtest/gtest.h>

#include <map>
#include <optional>
#include <string>
#include <vector>

#include "device/checkpoint_data.h"
#include "device/probe_test_support.h"
#include "platform/linux/linux_hardware_registry.h"
#include "platform/linux/linux_scsi_pass_through.h"

namespace zt::device {
namespace {

namespace fs = std::filesystem;
using test_support::CapturedLog;

// A registry of named entries, each with its parent and class, and BSD names for some.
class TreeRegistry final : public platform::HardwareRegistry {
 public:
  struct Node {
    std::string parent;  // empty at the root
    std::string className;
  };

  // root <- bus <- nub <- port <- disk <- media ("disk2s3"), the nub of class `nubClass`.
  explicit TreeRegistry(const std::string& nubClass) {
    nodes = {{"root", {"", "Root"}},     {"bus", {"root", "Bus"}},
             {"nub", {"bus", nubClass}}, {"port", {"nub", "Port"}},
             {"disk", {"port", "Disk"}}, {"media", {"disk", "com_kestro_driver_ZetoNub"}}};
    bsdNames = {{"disk2s3", "media"}};
  }

  std::optional<std::string> mountedFromDevice(const std::string&) override { return std::nullopt; }
  std::int32_t open() override { return 0; }
  std::optional<platform::RegistryIterator> matchingServices(
      const BsdNameMatching& matching) override {
    std::vector<std::string> found;
    if (auto media = bsdNames.find(matching.bsdName); media != bsdNames.end())
      found.push_back(media->second);
    return makeIterator(std::move(found));
  }
  std::optional<platform::RegistryEntry> parent(const platform::RegistryEntry& entry) override {
    const std::string& parentName = nodes.at(entry.path()).parent;
    if (parentName.empty()) return std::nullopt;
    return makeEntry(parentName);
  }
  bool conformsTo(const platform::RegistryEntry& entry, std::string_view className) override {
    asked.push_back(entry.path());
    return nodes.at(entry.path()).className == className;
  }

  std::map<std::string, Node> nodes;
  std::map<std::string, std::string> bsdNames;
  std::vector<std::string> asked;
};

TEST(DriverEntryLookup, ClimbsToTheFirstConformingAncestorReleasingTheOthers) {
  CapturedLog log;
  TreeRegistry registry("com_kestro_driver_ZetoSBCNub");
  std::optional<platform::RegistryEntry> driver;
  ASSERT_TRUE(findDriverEntry(registry, "/dev/disk2s3", kZetoDriverClassNames, &driver));
  ASSERT_TRUE(driver);
  EXPECT_EQ(driver->path(), "nub");
  // The media itself is of a driver class but is never a candidate.
  EXPECT_EQ(std::count(registry.asked.begin(), registry.asked.end(), "media"), 0);
  // Only the answer is still held.
  EXPECT_EQ(registry.liveReferences(), 1u);
  driver.reset();
  EXPECT_EQ(registry.liveReferences(), 0u);
  EXPECT_EQ(log.last(), "Found the matching Hwtree object");
}

// A sysfs tree with one USB disk: a SCSI device bound to sd, its disk and a partition, and
// device nodes that are plain files.
class FakeSysfs {
 public:
  FakeSysfs() {
    const fs::path scsi = sys() / "devices/pci0000:00/usb1/1-1/host6/target6:0:0/6:0:0:0";
    fs::create_directories(scsi / "block/sdz/sdz1");
    fs::create_directories(scsi / "scsi_generic/sg9");
    fs::create_directories(sys() / "bus/scsi/drivers/sd");
    for (const fs::path& device :
         {sys() / "devices/pci0000:00", sys() / "devices/pci0000:00/usb1",
          sys() / "devices/pci0000:00/usb1/1-1", scsi.parent_path().parent_path()}) {
      test_support::writeFile(device / "uevent", "");
    }
    test_support::writeFile(scsi / "uevent", "DEVTYPE=scsi_device\n");
    test_support::writeFile(scsi / "block/sdz/uevent", "DEVTYPE=disk\n");
    test_support::writeFile(scsi / "block/sdz/sdz1/uevent", "DEVTYPE=partition\n");
    fs::create_directory_symlink(sys() / "bus/scsi", scsi / "subsystem");
    fs::create_directory_symlink(sys() / "bus/scsi/drivers/sd", scsi / "driver");
    fs::create_directories(sys() / "class/block");
    fs::create_directory_symlink(scsi / "block/sdz/sdz1", sys() / "class/block/sdz1");
    fs::create_directory_symlink(scsi / "block/sdz", sys() / "class/block/sdz");
    fs::create_directories(dev());
    test_support::writeFile(dev() / "sdz", "");
    test_support::writeFile(dev() / "sg9", "");
    scsiDevice_ = scsi;
  }

  fs::path sys() const { return folder_ / "sys"; }
  fs::path dev() const { return folder_ / "dev"; }
  fs::path scsiDevice() const { return fs::canonical(scsiDevice_); }
  void unbindDriver() { fs::remove(scsiDevice_ / "driver"); }

 private:
  zt::test_support::TemporaryFolder folder_;
  fs::path scsiDevice_;
};

TEST(DriverEntryLookup, LinuxFindsTheScsiDeviceBoundToSd) {
  FakeSysfs sysfs;
  platform::LinuxHardwareRegistry registry(sysfs.sys());
  std::optional<platform::RegistryEntry> driver;
  ASSERT_TRUE(findDriverEntry(registry, "/dev/sdz1", kZetoDriverClassNames, &driver));
  EXPECT_EQ(driver->path(), sysfs.scsiDevice().string());
  EXPECT_EQ(registry.liveReferences(), 1u);
  EXPECT_FALSE(findDriverEntry(registry, "/dev/sdy1", kZetoDriverClassNames, &driver));
  EXPECT_FALSE(findDriverEntry(registry, "/dev/mapper/sdz1", kZetoDriverClassNames, &driver));

  // The SG_IO path on nodes that are not SCSI devices: the conversation fails, cleanly.
  ASSERT_TRUE(findDriverEntry(registry, "/dev/sdz1", kZetoDriverClassNames, &driver));
  platform::LinuxScsiPassThrough passThrough(sysfs.dev());
  CapturedLog log;
  EXPECT_FALSE(readCheckpointData(passThrough, *driver));
  EXPECT_TRUE(log.has("Error in ExecuteTaskSync"));
  EXPECT_EQ(log.last(), "Error getting first checkpoint");

  // An entry without device nodes has no plug-in.
  auto disk = registry.parent(*registry.matchingServices({"sdz1"})->next());
  ASSERT_TRUE(disk);
  EXPECT_FALSE(passThrough.createPlugIn(*disk));

  // Without the sd driver nothing conforms: the walk goes past the devices folder's end.
  sysfs.unbindDriver();
  EXPECT_FALSE(findDriverEntry(registry, "/dev/sdz1", kZetoDriverClassNames, &driver));
  EXPECT_EQ(log.last(), "Error getting parent");
}

}  // namespace
}  // namespace zt::device
