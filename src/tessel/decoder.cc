#include "tessel/decoder.h"

#include "tessel/coded_tags.h"
#include "tessel/exception.h"
#include "tessel/value_codec.h"

namespace tessel {

Decoder::Decoder(const zt::platform::Data& payload) : payload_(payload) {}

zt::platform::Value Decoder::decodeValue() {
  detail::ValueReader reader{std::span<const std::uint8_t>(payload_).subspan(position_)};
  if (reader.atEnd()) throw Exception(TesselCodingException, "no more coded values");
  if (reader.byte() != detail::kCodedValue) {
    throw Exception(TesselCodingException, "the next coded item is not a value");
  }
  zt::platform::Value value = reader.value();
  position_ += reader.position();
  return value;
}

CodedElements Decoder::decodeElements() {
  detail::ValueReader reader{std::span<const std::uint8_t>(payload_).subspan(position_)};
  if (reader.atEnd()) throw Exception(TesselCodingException, "no more coded values");
  if (reader.byte() != detail::kCodedElements) {
    throw Exception(TesselCodingException, "the next coded item is not a list");
  }
  std::uint64_t count = reader.varint();
  CodedElements elements;
  for (std::uint64_t i = 0; i < count; ++i) {
    std::uint8_t tag = reader.byte();
    std::string text = reader.string();
    if (tag == detail::kCodedReference) {
      elements.emplace_back(RecordReference::fromText(std::move(text)));
    } else if (tag == detail::kCodedIdentifier) {
      elements.emplace_back(std::move(text));
    } else {
      throw Exception(TesselCodingException, "unknown element in a coded list");
    }
  }
  position_ += reader.position();
  return elements;
}

}  // namespace tessel
