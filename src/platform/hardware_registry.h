#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/registry_entry.h"
#include "platform/registry_iterator.h"

namespace zt::platform {

// The machine's hardware registry: the tree of services from a disk's media up through its
// driver, the bus and the root, searched by the BSD name of a device file ("sdb1" for
// /dev/sdb1). Entries are handed out as references (RegistryEntry); liveReferences() counts
// those not yet given back, so a test can see that a walk releases what it passes.
class HardwareRegistry {
 public:
  virtual ~HardwareRegistry() = default;
  HardwareRegistry() = default;
  HardwareRegistry(const HardwareRegistry&) = delete;
  HardwareRegistry& operator=(const HardwareRegistry&) = delete;

  // The device file the file system holding `volumePath` is mounted from ("/dev/sdb1");
  // empty when its mount names none; none when the path's file system cannot be examined.
  virtual std::optional<std::string> mountedFromDevice(const std::string& volumePath) = 0;

  // Opens the registry for searching: 0, or an errno-style code saying why it cannot be read.
  virtual std::int32_t open() = 0;

  // The matching description of a BSD name; none for a name no device file can have (empty,
  // or with a NUL byte).
  struct BsdNameMatching {
    std::string bsdName;
  };
  static std::optional<BsdNameMatching> matchingBsdName(std::string_view bsdName);

  // The services matching the description, in registry order; none when the registry cannot
  // be searched.
  virtual std::optional<RegistryIterator> matchingServices(const BsdNameMatching& matching) = 0;
  // The entry's parent in the service plane; none at the root.
  virtual std::optional<RegistryEntry> parent(const RegistryEntry& entry) = 0;
  // Whether the entry is of the named class or derives from it.
  virtual bool conformsTo(const RegistryEntry& entry, std::string_view className) = 0;

  // References handed out (entries and iterators) and not given back yet.
  std::size_t liveReferences() const { return liveReferences_; }

 protected:
  RegistryEntry makeEntry(std::string path);
  RegistryIterator makeIterator(std::vector<std::string> paths);

 private:
  friend class RegistryEntry;
  friend class RegistryIterator;
  void retain() { ++liveReferences_; }
  void release() { --liveReferences_; }

  std::size_t liveReferences_ = 0;
};

// The registry of this machine: the virtual players' tree when $ZETO_VIRTUAL_DEVICES names a
// device file, sysfs otherwise (chosen as makeDeviceLibrary() chooses).
std::unique_ptr<HardwareRegistry> makeHardwareRegistry();

}  // namespace zt::platform
