#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <vector>

#include "platform/registry_entry.h"

namespace zt::platform {

class HardwareRegistry;

// The services matching a description, taken one at a time; holds one reference of its own
// until it goes.
class RegistryIterator {
 public:
  RegistryIterator(RegistryIterator&& other) noexcept;
  RegistryIterator& operator=(RegistryIterator&& other) noexcept;
  RegistryIterator(const RegistryIterator&) = delete;
  RegistryIterator& operator=(const RegistryIterator&) = delete;
  ~RegistryIterator();

  // The next service, with a reference of its own; none after the last.
  std::optional<RegistryEntry> next();

 private:
  friend class HardwareRegistry;
  RegistryIterator(HardwareRegistry* registry, std::vector<std::string> paths);
  void release();

  HardwareRegistry* registry_;
  std::vector<std::string> paths_;
  std::size_t position_ = 0;
};

}  // namespace zt::platform
