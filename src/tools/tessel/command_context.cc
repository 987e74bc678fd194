#include "tools/tessel/command_context.h"

#include <stdexcept>
#include <system_error>
#include <utility>

namespace tessel::cli {

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
  }
  return *store_;
}

std::filesystem::path CommandContext::storePath() const {
  return Store::resolvePath(storePath_);
}

}  // namespace tessel::cli
