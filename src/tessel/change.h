#pragma once

#include <optional>
#include <string>

#include "platform/value.h"

namespace tessel {

enum class ChangeType { Add = 1, Modify = 2, Delete = 3 };

// Whether an enumerator hands out the changed records or only what changed.
enum class ChangeRecords { Decoded, Omitted };

// One change that a session offers its client.
struct Change {
  ChangeType type;
  std::string recordIdentifier;
  std::string entityName;
  // The record as truth holds it; none for a delete.
  std::optional<zt::platform::Dictionary> record;
};

}  // namespace tessel
