#pragma once

// What the importers' malformed-input tables compare with their golden files.

#include <gtest/gtest.h>

#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "importers/import_error.h"
#include "importers/import_warnings.h"
#include "support/files.h"

namespace tessel::importers {

using ImportPaths = std::vector<std::filesystem::path>;

// For every file of `folder`, read after `good`: with OnFault::Refuse (`strict`), the fault that
// refused it; with OnFault::Skip (`lenient`, which answers what it kept), what was kept or why it
// was refused all the same, and each warning.
inline std::string malformedReport(
    const std::filesystem::path& folder, const std::filesystem::path& good,
    const std::function<void(const ImportPaths&)>& strict,
    const std::function<std::string(const ImportPaths&, ImportWarnings&)>& lenient) {
  const auto line = [](std::optional<std::size_t> number) {
    return "line " + std::to_string(number.value_or(0)) + ": ";
  };
  std::string faults;
  for (const std::string& name : zt::test_support::namesIn(folder)) {
    const ImportPaths paths = {good, folder / name};
    try {
      strict(paths);
      faults += name + ": accepted\n";
    } catch (const ImportError& e) {
      EXPECT_EQ(e.source(), (folder / name).string());
      faults += name + ": " + line(e.line()) + e.reason() + "\n";
    }
    ImportWarnings warnings(OnFault::Skip);
    try {
      faults += "  kept " + lenient(paths, warnings) + "\n";
    } catch (const ImportError& e) {
      faults += "  refused: " + line(e.line()) + e.reason() + "\n";
    }
    for (const ImportWarning& warning : warnings.all()) {
      EXPECT_EQ(warning.source, (folder / name).string());
      faults += "  warning: " + line(warning.line) + warning.message + "\n";
    }
  }
  return faults;
}

}  // namespace tessel::importers
