#pragma once

#include <filesystem>
#include <iosfwd>
#include <memory>
#include <optional>

#include "tessel/store.h"

namespace tessel::cli {

// What every command shares: where the store is, and its standard input and output. The store is
// opened on first use, so that `--help` and usage errors never touch it.
class CommandContext {
 public:
  CommandContext(std::optional<std::filesystem::path> storePath, std::istream& in,
                 std::ostream& out);

  // Every command but `init` wants an existing store: a mistyped --store path should fail
  // rather than quietly create an empty store elsewhere.
  Store& store(StoreOpening opening = StoreOpening::MustExist);
  std::filesystem::path storePath() const;
  // The command runs zetosynctool itself and tells it which store to read: --store then
  // names the store the tool reads, and warrants no warning.
  void passStoreToTool() { storePassedToTool_ = true; }
  std::istream& in() const { return in_; }
  std::ostream& out() const { return out_; }

 private:
  // On standard error, when --store names a store that zetosynctool will not read.
  void warnIfToolReadsAnotherStore(const std::filesystem::path& path) const;

  std::optional<std::filesystem::path> storePath_;
  std::istream& in_;
  std::ostream& out_;
  std::unique_ptr<Store> store_;
  bool storePassedToTool_ = false;
};

}  // namespace tessel::cli
