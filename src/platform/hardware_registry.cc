#include "platform/hardware_registry.h"

#include <string>
#include <utility>

#include "platform/linux/linux_hardware_registry.h"
#include "platform/virtual/virtual_hardware_registry.h"
#include "platform/virtual/virtual_players.h"

namespace zt::platform {

RegistryEntry::RegistryEntry(HardwareRegistry* registry, std::string path)
    : registry_(registry), path_(std::move(path)) {
  registry_->retain();
}

RegistryEntry::RegistryEntry(RegistryEntry&& other) noexcept
    : registry_(std::exchange(other.registry_, nullptr)), path_(std::move(other.path_)) {}

RegistryEntry& RegistryEntry::operator=(RegistryEntry&& other) noexcept {
  if (this != &other) {
    release();
    registry_ = std::exchange(other.registry_, nullptr);
    path_ = std::move(other.path_);
  }
  return *this;
}

RegistryEntry::~RegistryEntry() {
  release();
}

void RegistryEntry::release() {
  if (registry_) std::exchange(registry_, nullptr)->release();
}

RegistryIterator::RegistryIterator(HardwareRegistry* registry, std::vector<std::string> paths)
    : registry_(registry), paths_(std::move(paths)) {
  registry_->retain();
}

RegistryIterator::RegistryIterator(RegistryIterator&& other) noexcept
    : registry_(std::exchange(other.registry_, nullptr)),
      paths_(std::move(other.paths_)),
      position_(other.position_) {}

RegistryIterator& RegistryIterator::operator=(RegistryIterator&& other) noexcept {
  if (this != &other) {
    release();
    registry_ = std::exchange(other.registry_, nullptr);
    paths_ = std::move(other.paths_);
    position_ = other.position_;
  }
  return *this;
}

RegistryIterator::~RegistryIterator() {
  release();
}

void RegistryIterator::release() {
  if (registry_) std::exchange(registry_, nullptr)->release();
}

std::optional<RegistryEntry> RegistryIterator::next() {
  if (!registry_ || position_ >= paths_.size()) return std::nullopt;
  return RegistryEntry(registry_, paths_[position_++]);
}

std::optional<HardwareRegistry::BsdNameMatching> HardwareRegistry::matchingBsdName(
    std::string_view bsdName) {
  if (bsdName.empty() || bsdName.find('\0') != std::string_view::npos) return std::nullopt;
  return BsdNameMatching{std::string(bsdName)};
}

RegistryEntry HardwareRegistry::makeEntry(std::string path) {
  return RegistryEntry(this, std::move(path));
}

RegistryIterator HardwareRegistry::makeIterator(std::vector<std::string> paths) {
  return RegistryIterator(this, std::move(paths));
}

std::unique_ptr<HardwareRegistry> makeHardwareRegistry() {
  if (auto deviceFile = virtualDeviceFileFromEnvironment()) {
    return std::make_unique<VirtualHardwareRegistry>(loadVirtualPlayers(*deviceFile).valueOrNone());
  }
  return std::make_unique<LinuxHardwareRegistry>();
}

}  // namespace zt::platform
