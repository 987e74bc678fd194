#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/value.h"

namespace tessel::detail {

// The engine's compact binary form of values and records. It is lossless: numbers keep
// their kind, dates their instant to the nanosecond and their zone's kind and parameters,
// data and URLs their kind, dictionaries their key order. Malformed input raises
// TesselCodingException, never reads out of bounds.
class ValueWriter {
 public:
  explicit ValueWriter(std::vector<std::uint8_t>& out) : out_(out) {}

  void value(const zt::platform::Value& value);
  // A record: a format byte, then the dictionary's entries.
  void record(const zt::platform::Dictionary& record);
  void varint(std::uint64_t n);
  void signedVarint(std::int64_t n);
  void string(std::string_view text);
  void byte(std::uint8_t b) { out_.push_back(b); }

 private:
  void dictionary(const zt::platform::Dictionary& dictionary);
  std::vector<std::uint8_t>& out_;
};

class ValueReader {
 public:
  explicit ValueReader(std::span<const std::uint8_t> in) : in_(in) {}

  zt::platform::Value value();
  zt::platform::Dictionary record();
  // A record without the entries whose keys `omit` answers true for; their values are read
  // past (strings and data without being copied).
  template <typename Omit>
  zt::platform::Dictionary recordWithout(const Omit& omit);
  // Reads past one value.
  void skipValue();
  std::uint64_t varint();
  std::int64_t signedVarint();
  std::string string();
  std::uint8_t byte();
  bool atEnd() const { return position_ == in_.size(); }
  std::size_t position() const { return position_; }

 private:
  std::string_view key();
  void beginRecord();
  zt::platform::Value valueAtDepth(int depth);
  zt::platform::Dictionary dictionary(int depth);
  std::span<const std::uint8_t> take(std::size_t n);
  std::size_t count();
  std::span<const std::uint8_t> in_;
  std::size_t position_ = 0;
};

template <typename Omit>
zt::platform::Dictionary ValueReader::recordWithout(const Omit& omit) {
  beginRecord();
  std::size_t n = count();
  zt::platform::Dictionary result;
  result.reserve(n);
  for (std::size_t i = 0; i < n; ++i) {
    std::string_view name = key();
    if (omit(name)) {
      skipValue();
    } else {
      std::string kept(name);
      result.set(std::move(kept), valueAtDepth(1));
    }
  }
  return result;
}

std::vector<std::uint8_t> encodeRecord(const zt::platform::Dictionary& record);
zt::platform::Dictionary decodeRecord(std::span<const std::uint8_t> bytes);
// The record without the attributes named in `omitted`.
zt::platform::Dictionary decodeRecordWithout(std::span<const std::uint8_t> bytes,
                                             const std::vector<std::string>& omitted);
// One attribute of a stored record; none when the record has no such key.
std::optional<zt::platform::Value> decodeRecordAttribute(std::span<const std::uint8_t> bytes,
                                                         std::string_view attribute);
std::vector<std::uint8_t> encodeValue(const zt::platform::Value& value);
zt::platform::Value decodeValue(std::span<const std::uint8_t> bytes);

}  // namespace tessel::detail
