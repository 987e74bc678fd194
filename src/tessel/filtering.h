#pragma once

#include <memory>
#include <string>
#include <vector>

#include "platform/value.h"

namespace tessel {

class Coder;

// A filter stored with a client. The engine does not know the concrete classes: it asks
// them, record by record, whether a record goes to the client, and stores them coded under
// their class name (see FilterRegistry).
class Filtering {
 public:
  virtual ~Filtering() = default;

  // The name under which the class is registered and stored.
  virtual std::string className() const = 0;
  // The entities whose records this filter judges; records of other entities pass.
  virtual std::vector<std::string> supportedEntityNames() const = 0;
  virtual bool shouldApplyRecord(const zt::platform::Dictionary& record,
                                 const std::string& identifier) const = 0;
  virtual bool isEqual(const Filtering& other) const = 0;
  virtual void encode(Coder& coder) const = 0;
  virtual std::string description() const = 0;
};

// A client's filters in order. Shared, so that a list can be rebuilt keeping some of the
// very same filter objects.
using FilterList = std::vector<std::shared_ptr<Filtering>>;

}  // namespace tessel
