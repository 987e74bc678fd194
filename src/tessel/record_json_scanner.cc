#include "tessel/record_json_scanner.h"

#include <charconv>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <system_error>

#include "platform/base64.h"
#include "platform/utf8.h"
#include "tessel/record_json_values.h"
#include "tessel/schema.h"

namespace tessel::typed_json {

using zt::platform::Array;
using zt::platform::Dictionary;
using zt::platform::TimeZone;
using zt::platform::Url;
using zt::platform::Value;

namespace {

// Deeper lines are rare enough to leave to the thorough reader, which also bounds the depth.
constexpr int kMaxDepth = 32;
// Larger objects go to the thorough reader too, which keeps the check for repeated keys short.
constexpr std::size_t kMaxMembers = 64;
// Integers of up to 18 digits fit in 64 signed bits whatever their digits.
constexpr std::size_t kMaxIntegerDigits = 18;

bool isSpace(char c) {
  return c == ' ' || c == '\t' || c == '\n' || c == '\r';
}

bool isDigit(char c) {
  return c >= '0' && c <= '9';
}

}  // namespace

// One pass over one line (RFC 8259 grammar). Every member answers false when the text leaves
// the common form; the caller then gives the line to the thorough reader.
class RecordLineScanner::Pass {
 public:
  Pass(RecordLineScanner& scanner, std::string_view line)
      : scanner_(scanner), p_(line.data()), end_(line.data() + line.size()) {}

  std::optional<Record> line() {
    skipSpace();
    if (!take('{')) return std::nullopt;
    std::optional<std::string> id;
    std::optional<Value> record;
    skipSpace();
    if (take('}')) return std::nullopt;
    do {
      skipSpace();
      std::string_view key;
      if (!plainKey(key)) return std::nullopt;
      skipSpace();
      if (!take(':')) return std::nullopt;
      skipSpace();
      if (key == "id" && !id) {
        std::string text;
        if (!string(text) || text.empty()) return std::nullopt;
        id = std::move(text);
      } else if (key == "record" && !record) {
        // A record is a plain object: no key of its own starts with `$`.
        if (p_ == end_ || *p_ != '{') return std::nullopt;
        record = object(0, Typed::Refused);
        if (!record) return std::nullopt;
      } else {
        return std::nullopt;
      }
      skipSpace();
    } while (take(','));
    if (!take('}')) return std::nullopt;
    skipSpace();
    if (p_ != end_ || !id || !record) return std::nullopt;
    Dictionary* dictionary = record->asDictionary();
    const Value* entity = dictionary->find(TesselRecordEntityNameKey);
    if (entity == nullptr || entity->asString() == nullptr || entity->asString()->empty()) {
      return std::nullopt;
    }
    return Record{std::move(*id), std::move(*dictionary)};
  }

 private:
  enum class Typed { Allowed, Refused };

  void skipSpace() {
    while (p_ != end_ && isSpace(*p_)) ++p_;
  }

  bool take(char c) {
    if (p_ == end_ || *p_ != c) return false;
    ++p_;
    return true;
  }

  // A string without escapes, as a view of the line.
  bool plainKey(std::string_view& key) {
    if (!take('"')) return false;
    const char* start = p_;
    while (p_ != end_) {
      const auto c = static_cast<unsigned char>(*p_);
      if (c == '"') {
        key = std::string_view(start, static_cast<std::size_t>(p_ - start));
        ++p_;
        return true;
      }
      if (c == '\\' || c < 0x20) return false;
      if (!character()) return false;
    }
    return false;
  }

  // Steps over one character of a string: an ASCII byte or a whole UTF-8 sequence.
  bool character() {
    if (static_cast<unsigned char>(*p_) < 0x80) {
      ++p_;
      return true;
    }
    const std::size_t length = zt::platform::utf8::sequenceLength(
        std::string_view(p_, static_cast<std::size_t>(end_ - p_)), 0);
    if (length == 0) return false;
    p_ += length;
    return true;
  }

  // A string with the two-character escapes; `\u` escapes are left to the thorough reader.
  bool string(std::string& out) {
    if (!take('"')) return false;
    const char* run = p_;
    while (p_ != end_) {
      const auto c = static_cast<unsigned char>(*p_);
      if (c == '"') {
        out.append(run, p_);
        ++p_;
        return true;
      }
      if (c == '\\') {
        out.append(run, p_);
        if (++p_ == end_) return false;
        switch (*p_) {
          case '"':
          case '\\':
          case '/':
            out += *p_;
            break;
          case 'b':
            out += '\b';
            break;
          case 'f':
            out += '\f';
            break;
          case 'n':
            out += '\n';
            break;
          case 'r':
            out += '\r';
            break;
          case 't':
            out += '\t';
            break;
          default:
            return false;
        }
        run = ++p_;
        continue;
      }
      if (c < 0x20) return false;
      if (!character()) return false;
    }
    return false;
  }

  std::optional<Value> value(int depth) {
    if (p_ == end_) return std::nullopt;
    switch (*p_) {
      case '"': {
        std::string text;
        if (!string(text)) return std::nullopt;
        return Value(std::move(text));
      }
      case '{':
        return object(depth + 1, Typed::Allowed);
      case '[':
        return array(depth + 1);
      case 't':
        if (!literal("true")) return std::nullopt;
        return Value::boolean(true);
      case 'f':
        if (!literal("false")) return std::nullopt;
        return Value::boolean(false);
      default:
        return number();
    }
  }

  bool literal(std::string_view word) {
    if (static_cast<std::size_t>(end_ - p_) < word.size()) return false;
    if (std::string_view(p_, word.size()) != word) return false;
    p_ += word.size();
    return true;
  }

  // -?(0|[1-9][0-9]*)(\.[0-9]+)?([eE][+-]?[0-9]+)?: integers as integers, the rest as reals.
  std::optional<Value> number() {
    const char* start = p_;
    const bool negative = take('-');
    if (p_ == end_ || !isDigit(*p_)) return std::nullopt;
    if (!take('0')) {
      while (p_ != end_ && isDigit(*p_)) ++p_;
    }
    const std::size_t digits = static_cast<std::size_t>(p_ - start) - (negative ? 1 : 0);
    bool real = false;
    if (take('.')) {
      if (!digitsFollow()) return std::nullopt;
      real = true;
    }
    if (take('e') || take('E')) {
      if (!take('+')) take('-');
      if (!digitsFollow()) return std::nullopt;
      real = true;
    }
    if (!real) {
      if (digits > kMaxIntegerDigits) return std::nullopt;
      std::int64_t magnitude = 0;
      for (const char* d = start + (negative ? 1 : 0); d != p_; ++d) {
        magnitude = magnitude * 10 + (*d - '0');
      }
      return Value::integer(negative ? -magnitude : magnitude);
    }
    // Correctly rounded, as the thorough reader's strtod; out of range is its fault to name.
    double number = 0;
    const std::from_chars_result read = std::from_chars(start, p_, number);
    if (read.ec != std::errc() || read.ptr != p_ || !std::isfinite(number)) return std::nullopt;
    return Value::real(number);
  }

  bool digitsFollow() {
    if (p_ == end_ || !isDigit(*p_)) return false;
    while (p_ != end_ && isDigit(*p_)) ++p_;
    return true;
  }

  std::optional<Value> array(int depth) {
    if (depth > kMaxDepth) return std::nullopt;
    ++p_;  // [
    std::vector<Value>& elements = scanner_.elements_;
    const std::size_t first = elements.size();
    skipSpace();
    if (!take(']')) {
      do {
        skipSpace();
        std::optional<Value> element = value(depth);
        if (!element) return unwind(first);
        elements.push_back(std::move(*element));
        skipSpace();
      } while (take(','));
      if (!take(']')) return unwind(first);
    }
    Array out;
    out.reserve(elements.size() - first);
    for (std::size_t i = first; i < elements.size(); ++i) out.push_back(std::move(elements[i]));
    elements.erase(elements.begin() + static_cast<std::ptrdiff_t>(first), elements.end());
    return Value(std::move(out));
  }

  std::optional<Value> unwind(std::size_t firstElement) {
    auto& elements = scanner_.elements_;
    elements.erase(elements.begin() + static_cast<std::ptrdiff_t>(firstElement), elements.end());
    return std::nullopt;
  }

  std::optional<Value> object(int depth, Typed typed) {
    if (depth > kMaxDepth) return std::nullopt;
    ++p_;  // {
    auto& members = scanner_.members_;
    const std::size_t first = members.size();
    const auto fail = [&]() -> std::optional<Value> {
      members.erase(members.begin() + static_cast<std::ptrdiff_t>(first), members.end());
      return std::nullopt;
    };
    bool dollar = false;
    skipSpace();
    if (!take('}')) {
      do {
        skipSpace();
        std::string_view key;
        if (!plainKey(key)) return fail();
        if (members.size() - first >= kMaxMembers) return fail();
        for (std::size_t i = first; i < members.size(); ++i) {
          if (members[i].first == key) return fail();
        }
        if (!key.empty() && key.front() == '$') {
          if (typed == Typed::Refused) return fail();
          dollar = true;
        }
        skipSpace();
        if (!take(':')) return fail();
        skipSpace();
        std::optional<Value> member = value(depth);
        if (!member) return fail();
        members.emplace_back(key, std::move(*member));
        skipSpace();
      } while (take(','));
      if (!take('}')) return fail();
    }
    std::optional<Value> out;
    if (dollar) {
      out = typedValue(first);
    } else {
      Dictionary dictionary;
      dictionary.reserve(members.size() - first);
      for (std::size_t i = first; i < members.size(); ++i) {
        dictionary.set(members[i].first, std::move(members[i].second));
      }
      out = Value(std::move(dictionary));
    }
    members.erase(members.begin() + static_cast<std::ptrdiff_t>(first), members.end());
    return out;
  }

  // {"$url": text}, {"$data": base64} and {"$date": text, "tz": zone name}, whose members
  // start at `first`; unnamed zones are left to the thorough reader.
  std::optional<Value> typedValue(std::size_t first) {
    auto& members = scanner_.members_;
    const std::size_t count = members.size() - first;
    const auto text = [&](std::string_view key) -> const std::string* {
      for (std::size_t i = first; i < members.size(); ++i) {
        if (members[i].first == key) return members[i].second.asString();
      }
      return nullptr;
    };
    if (count == 1) {
      if (const std::string* url = text("$url")) return Value(Url{*url});
      if (const std::string* data = text("$data")) {
        auto bytes = zt::platform::base64::decode(*data, zt::platform::base64::Form::Canonical);
        if (!bytes) return std::nullopt;
        return Value(std::move(*bytes));
      }
      return std::nullopt;
    }
    if (count != 2) return std::nullopt;
    const std::string* wallClock = text("$date");
    const std::string* zoneName = text("tz");
    if (wallClock == nullptr || zoneName == nullptr) return std::nullopt;
    std::optional<TimeZone> zone = zoneNamed(*zoneName);
    if (!zone) return std::nullopt;
    return dateValue(*wallClock, std::move(*zone));
  }

  RecordLineScanner& scanner_;
  const char* p_;
  const char* end_;
};

std::optional<Record> RecordLineScanner::scan(std::string_view line) {
  Pass pass(*this, line);
  std::optional<Record> out = pass.line();
  members_.clear();
  elements_.clear();
  return out;
}

}  // namespace tessel::typed_json
