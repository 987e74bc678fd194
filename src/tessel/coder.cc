#include "tessel/coder.h"

#include "tessel/coded_tags.h"
#include "tessel/value_codec.h"

namespace tessel {

Coder::Coder() = default;

void Coder::encodeValue(const zt::platform::Value& value) {
  detail::ValueWriter writer(data_);
  writer.byte(detail::kCodedValue);
  writer.value(value);
}

void Coder::encodeElements(const CodedElements& elements) {
  detail::ValueWriter writer(data_);
  writer.byte(detail::kCodedElements);
  writer.varint(elements.size());
  for (const CodedElement& element : elements) {
    if (const auto* reference = std::get_if<RecordReference>(&element)) {
      writer.byte(detail::kCodedReference);
      writer.string(reference->text());
    } else {
      writer.byte(detail::kCodedIdentifier);
      writer.string(std::get<std::string>(element));
    }
  }
}

void Coder::encodeRaw(const zt::platform::Data& payload) {
  data_.insert(data_.end(), payload.begin(), payload.end());
}

}  // namespace tessel
