#include "tools/tessel/command_context.h"

#include <iostream>
#include <stdexcept>
#include <system_error>
#include <utility>

namespace tessel::cli {

namespace {

std::filesystem::path comparable(const std::filesystem::path& path) {
  std::error_code error;
  std::filesystem::path canonical = std::filesystem::weakly_canonical(path, error);
  return error ? path.lexically_normal() : canonical;
}

}  // namespace

void CommandContext::warnIfToolReadsAnotherStore(const std::filesystem::path& path) const {
  if (!storePath_ || storePassedToTool_) return;
  const std::filesystem::path toolStore = Store::resolvePath();
  if (comparable(toolStore) == comparable(path)) return;
  // zetosynctool takes no --store: it reads $TESSEL_STORE or the default path only.
  std::cerr << "tessel: warning: zetosynctool reads " << toolStore.string() << ", not "
            << path.string() << "; set TESSEL_STORE=" << path.string()
            << " where it runs for it to sync this store\n";
}

CommandContext::CommandContext(std::optional<std::filesystem::path> storePath, std::istream& in,
                               std::ostream& out)
    : storePath_(std::move(storePath)), in_(in), out_(out) {}

Store& CommandContext::store(StoreOpening opening) {
  if (!store_) {
    const std::filesystem::path path = storePath();
    std::error_code error;
    if (opening == StoreOpening::MustExist && !std::filesystem::exists(path, error)) {
      throw std::runtime_error("no store at " + path.string() + " (create it with tessel init)");
    }
    store_ = Store::open(path, opening);
    warnIfToolReadsAnotherStore(path);
  }
  return *store_;
}

std::filesystem::path CommandContext::storePath() const {
  return Store::resolvePath(storePath_);
}

}  // namespace tessel::cli
