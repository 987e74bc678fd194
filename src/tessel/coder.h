#pragma once

#include <string>
#include <variant>
#include <vector>

#include "platform/value.h"
#include "tessel/record_reference.h"

namespace tessel {

// An element of a coded reference list: a record reference or a record identifier. The
// coding keeps which one it was.
using CodedElement = std::variant<RecordReference, std::string>;
using CodedElements = std::vector<CodedElement>;

// Sequential coding of a filter's state: values are written one after the other without
// keys and read back in the same order by a Decoder.
class Coder {
 public:
  Coder();

  void encodeValue(const zt::platform::Value& value);
  void encodeElements(const CodedElements& elements);
  // Appends an already coded payload as it is: filters that only carry bytes (OpaqueFilter)
  // write them back unchanged.
  void encodeRaw(const zt::platform::Data& payload);

  // The payload written so far.
  const zt::platform::Data& data() const { return data_; }

 private:
  zt::platform::Data data_;
};

}  // namespace tessel
