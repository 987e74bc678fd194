#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <vector>

#include "platform/virtual/virtual_scsi_pass_through.h"

namespace zt::test_support {

// What a test changes to make a virtual player misbehave; given to the pass-through with
// setFaults(). Header only, so the fuzz targets use it too.
struct ScsiFaults final : platform::VirtualScsiFaults {
  std::set<platform::VirtualScsiStep> failingSteps;
  // INQUIRY for these page codes fails.
  std::set<std::uint8_t> failingPages;
  // These pages answer with these payloads instead of the document's.
  std::map<std::uint8_t, std::vector<std::uint8_t>> pages;

  bool stepFails(platform::VirtualScsiStep step) const override {
    return failingSteps.contains(step);
  }
  bool pageFails(std::uint8_t page) const override { return failingPages.contains(page); }
  std::optional<std::vector<std::uint8_t>> injectedPage(std::uint8_t page) const override {
    const auto found = pages.find(page);
    if (found == pages.end()) return std::nullopt;
    return found->second;
  }
};

}  // namespace zt::test_support
