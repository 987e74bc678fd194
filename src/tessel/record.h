#pragma once

#include <cstdint>
#include <map>
#include <string>

#include "platform/value.h"

namespace tessel {

// A record of truth with its identifier.
struct Record {
  std::string id;
  zt::platform::Dictionary record;
  // The generation of the record's last change, as a snapshot reads it (0 otherwise): within
  // one store, the same identifier and generation always hold the same values.
  std::int64_t generation = 0;
};

// Records by identifier, in identifier order.
using RecordMap = std::map<std::string, zt::platform::Dictionary, std::less<>>;

}  // namespace tessel
