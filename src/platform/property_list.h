#pragma once

#include <cstdint>
#include <span>

#include "platform/result.h"
#include "platform/value.h"

namespace zt::platform {

// Parses a property list document, XML or binary, into values: dictionaries keep the
// document's key order, booleans and integers become numbers, dates are in GMT.
Result<Value> parsePropertyList(std::span<const std::uint8_t> document);

}  // namespace zt::platform
