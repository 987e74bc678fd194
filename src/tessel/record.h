#pragma once

#include <map>
#include <string>

#include "platform/value.h"

namespace tessel {

// A record of truth with its identifier.
struct Record {
  std::string id;
  zt::platform::Dictionary record;
};

// Records by identifier, in identifier order.
using RecordMap = std::map<std::string, zt::platform::Dictionary, std::less<>>;

}  // namespace tessel
