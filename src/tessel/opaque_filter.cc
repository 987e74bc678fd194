#include "tessel/opaque_filter.h"

#include "tessel/coder.h"

namespace tessel {

OpaqueFilter::OpaqueFilter(std::string className, zt::platform::Data payload)
    : className_(std::move(className)), payload_(std::move(payload)) {}

bool OpaqueFilter::isEqual(const Filtering& other) const {
  const auto* opaque = dynamic_cast<const OpaqueFilter*>(&other);
  return opaque && opaque->className_ == className_ && opaque->payload_ == payload_;
}

void OpaqueFilter::encode(Coder& coder) const {
  coder.encodeRaw(payload_);
}

std::string OpaqueFilter::description() const {
  return "<" + className_ + ": " + std::to_string(payload_.size()) + " bytes, not decoded>";
}

}  // namespace tessel
