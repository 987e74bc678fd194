#include "device/driver_entry_lookup.h"

#include <string>
#include <utility>

#include "platform/log.h"

namespace zt::device {

using platform::Log;

namespace {

// The form the log gives an absent class name, as printf prints a null string.
const char* nameOrNull(const std::optional<std::string_view>& name, std::string& storage) {
  if (!name) return nullptr;
  storage = std::string(*name);
  return storage.c_str();
}

bool conforms(platform::HardwareRegistry& registry, const platform::RegistryEntry& candidate,
              const DriverClassNames& classes) {
  return registry.conformsTo(candidate, classes.first) ||
         (classes.second && registry.conformsTo(candidate, *classes.second)) ||
         (classes.third && registry.conformsTo(candidate, *classes.third));
}

}  // namespace

bool findDriverEntry(platform::HardwareRegistry& registry, std::string_view devicePath,
                     const DriverClassNames& classes,
                     std::optional<platform::RegistryEntry>* entry) {
  if (entry) entry->reset();
  if (devicePath.size() < 6) {
    Log::debug("Dev file for Zeto is invalid");
    return false;
  }
  const std::string_view bsdName = devicePath.substr(5);
  Log::debug("Dev file for volume is /dev/%s - looking for corresponding Hwtree object", bsdName);

  if (std::int32_t error = registry.open(); error != 0) {
    Log::debug("Error %ul getting master port", error);
    return false;
  }
  auto matching = platform::HardwareRegistry::matchingBsdName(bsdName);
  if (!matching) {
    Log::debug("Error trying to get the dictionary matching this Zeto");
    return false;
  }
  std::optional<platform::RegistryIterator> services = registry.matchingServices(*matching);
  if (!services) {
    Log::debug("Error trying to get iterator on matching IO objects");
    return false;
  }
  // Only the first match counts.
  std::optional<platform::RegistryEntry> child = services->next();
  if (!child) {
    Log::debug("Error: No device matching our Zeto");
    return false;
  }
  Log::debug("Found a matching service for Dev file");
  std::string second;
  std::string third;
  Log::debug("Walking through service parents to find object conforming to %s/%s/%s", classes.first,
             nameOrNull(classes.second, second), nameOrNull(classes.third, third));

  std::optional<platform::RegistryEntry> parent = registry.parent(*child);
  if (!parent) return false;
  while (!conforms(registry, *parent, classes)) {
    // Dropping the child's handle releases it as the walk moves up.
    child = std::move(parent);
    parent = registry.parent(*child);
    if (!parent) {
      Log::debug("Error getting parent");
      return false;
    }
  }
  Log::debug("Found the matching Hwtree object");
  if (!entry) {
    Log::debug("Matching Hwtree object NOT FOUND!");
    return false;
  }
  *entry = std::move(parent);
  return true;
}

}  // namespace zt::device
