#pragma once

#include <cstddef>

#include "platform/value.h"
#include "tessel/coder.h"

namespace tessel {

// Reads back what a Coder wrote, in the same order. Reading past the end, or reading an item
// as another kind than it was written, raises TesselCodingException.
class Decoder {
 public:
  explicit Decoder(const zt::platform::Data& payload);

  zt::platform::Value decodeValue();
  CodedElements decodeElements();
  bool atEnd() const { return position_ == payload_.size(); }

 private:
  const zt::platform::Data& payload_;
  std::size_t position_ = 0;
};

}  // namespace tessel
