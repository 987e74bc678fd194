#include "tessel/filter_registry.h"

#include "tessel/coder.h"
#include "tessel/decoder.h"
#include "tessel/exception.h"
#include "tessel/opaque_filter.h"

namespace tessel {

FilterRegistry& FilterRegistry::shared() {
  static FilterRegistry registry;
  return registry;
}

void FilterRegistry::registerClass(std::string className, DecodeFunction decode) {
  decoders_.insert_or_assign(std::move(className), std::move(decode));
}

void FilterRegistry::unregisterClass(std::string_view className) {
  auto found = decoders_.find(className);
  if (found != decoders_.end()) decoders_.erase(found);
}

bool FilterRegistry::isRegistered(std::string_view className) const {
  return decoders_.find(className) != decoders_.end();
}

std::shared_ptr<Filtering> FilterRegistry::decode(const std::string& className,
                                                  const zt::platform::Data& payload) const {
  auto found = decoders_.find(className);
  if (found == decoders_.end()) return std::make_shared<OpaqueFilter>(className, payload);
  Decoder decoder(payload);
  std::shared_ptr<Filtering> filter = found->second(decoder);
  if (!filter) {
    throw Exception(TesselCodingException,
                    "the filter of class " + className + " could not be decoded");
  }
  return filter;
}

zt::platform::Data FilterRegistry::encode(const Filtering& filter) {
  Coder coder;
  filter.encode(coder);
  return coder.data();
}

}  // namespace tessel
