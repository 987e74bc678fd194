#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <variant>

#include "platform/value.h"

namespace zt::platform {

// Parses a property list document, XML or binary, into values: dictionaries keep the
// document's key order, booleans and integers become numbers, dates are in GMT. On failure,
// the reason as text.
std::variant<Value, std::string> parsePropertyList(std::span<const std::uint8_t> document);

}  // namespace zt::platform
