#pragma once

#include <string>
#include <string_view>

namespace tessel::importers {

// The 64-bit FNV-1a hash of `text` as 16 lower-case hex digits: small, the same across
// builds and machines, and well spread for short texts, so identifiers made from it stay the
// same from one import to the next.
std::string stableHash(std::string_view text);

}  // namespace tessel::importers
