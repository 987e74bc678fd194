#pragma once

#include <cstdint>

namespace tessel::detail {

// Item tags of a filter's coded payload. Part of the stored form: never renumber.
enum CodedTag : std::uint8_t {
  kCodedValue = 0x56,     // a value in the engine's binary form
  kCodedElements = 0x45,  // a list of references and identifiers
  kCodedReference = 0x52,
  kCodedIdentifier = 0x53,
};

}  // namespace tessel::detail
