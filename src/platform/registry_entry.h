#pragma once

#include <string>

namespace zt::platform {

class HardwareRegistry;
class RegistryIterator;

// One reference to an object of the hardware registry. The reference is given back when the
// handle goes, so an entry passed over on a walk is released as soon as its handle is
// dropped; the registry counts the references still held. The registry must outlive its
// handles.
class RegistryEntry {
 public:
  RegistryEntry(RegistryEntry&& other) noexcept;
  RegistryEntry& operator=(RegistryEntry&& other) noexcept;
  RegistryEntry(const RegistryEntry&) = delete;
  RegistryEntry& operator=(const RegistryEntry&) = delete;
  ~RegistryEntry();

  // The backend's name of the entry (a sysfs folder, a path in the virtual tree): it tells
  // entries apart and lets the backend's other services find the hardware behind it.
  const std::string& path() const { return path_; }

 private:
  friend class HardwareRegistry;
  friend class RegistryIterator;
  RegistryEntry(HardwareRegistry* registry, std::string path);
  void release();

  HardwareRegistry* registry_;
  std::string path_;
};

}  // namespace zt::platform
