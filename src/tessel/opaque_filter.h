#pragma once

#include <string>
#include <vector>

#include "platform/value.h"
#include "tessel/filtering.h"

namespace tessel {

// A stored filter whose class this process does not know. It keeps the class name and the
// payload byte for byte so that writing the filter list back changes nothing, and it lets
// every record through, since nothing here can judge for it.
class OpaqueFilter : public Filtering {
 public:
  OpaqueFilter(std::string className, zt::platform::Data payload);

  const zt::platform::Data& payload() const { return payload_; }

  std::string className() const override { return className_; }
  std::vector<std::string> supportedEntityNames() const override { return {}; }
  bool shouldApplyRecord(const zt::platform::Dictionary&, const std::string&) const override {
    return true;
  }
  bool isEqual(const Filtering& other) const override;
  void encode(Coder& coder) const override;
  std::string description() const override;

 private:
  std::string className_;
  zt::platform::Data payload_;
};

}  // namespace tessel
