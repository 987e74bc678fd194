#pragma once

#include <functional>
#include <map>
#include <memory>
#include <string>
#include <string_view>

#include "platform/value.h"
#include "tessel/filtering.h"

namespace tessel {

class Decoder;

// Maps filter class names to the functions that decode them. Clients decode their stored
// filters through the process-wide registry; a class that is not registered becomes an
// OpaqueFilter.
class FilterRegistry {
 public:
  using DecodeFunction = std::function<std::shared_ptr<Filtering>(Decoder&)>;

  static FilterRegistry& shared();

  // Replaces an earlier registration of the same name.
  void registerClass(std::string className, DecodeFunction decode);
  void unregisterClass(std::string_view className);
  bool isRegistered(std::string_view className) const;

  // The filter coded in `payload`: an instance of the registered class, or an OpaqueFilter.
  // A registered decoder that fails raises TesselCodingException.
  std::shared_ptr<Filtering> decode(const std::string& className,
                                    const zt::platform::Data& payload) const;
  // The payload of a filter (an OpaqueFilter answers its kept bytes).
  static zt::platform::Data encode(const Filtering& filter);

 private:
  std::map<std::string, DecodeFunction, std::less<>> decoders_;
};

}  // namespace tessel
