#pragma once

#include <string>
#include <utility>

namespace tessel {

// An opaque, stable handle on a record of truth. It stays valid while the record lives (a
// record deleted and put again under the same identifier keeps it), and it survives being
// coded into a filter's payload. Only a snapshot turns it back into an identifier.
class RecordReference {
 public:
  // Rebuilds a reference from its text(), e.g. when decoding.
  static RecordReference fromText(std::string text) { return RecordReference(std::move(text)); }

  const std::string& text() const { return text_; }
  bool operator==(const RecordReference&) const = default;
  auto operator<=>(const RecordReference&) const = default;

 private:
  explicit RecordReference(std::string text) : text_(std::move(text)) {}
  std::string text_;
};

}  // namespace tessel
