#include "platform/value.h"

#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <limits>

namespace zt::platform {

std::int64_t Number::int64Value() const {
  if (kind_ != Kind::Real) return integer_;
  if (std::isnan(real_)) return 0;
  if (real_ >= 9.2233720368547758e18) return std::numeric_limits<std::int64_t>::max();
  if (real_ <= -9.2233720368547758e18) return std::numeric_limits<std::int64_t>::min();
  return static_cast<std::int64_t>(real_);
}

std::int32_t Number::int32Value() const {
  return static_cast<std::int32_t>(static_cast<std::uint32_t>(int64Value()));
}

double Number::doubleValue() const {
  return kind_ == Kind::Real ? real_ : static_cast<double>(integer_);
}

bool Number::boolValue() const {
  return kind_ == Kind::Real ? real_ != 0.0 : integer_ != 0;
}

bool Number::operator==(const Number& other) const {
  if (kind_ != other.kind_) return false;
  return kind_ == Kind::Real ? real_ == other.real_ : integer_ == other.integer_;
}

std::string Number::description() const {
  if (kind_ != Kind::Real) return std::to_string(integer_);
  char text[32];
  std::snprintf(text, sizeof text, "%.17g", real_);
  // Prefer the shortest text that reads back to the same value.
  for (int precision = 1; precision < 17; ++precision) {
    char shorter[32];
    std::snprintf(shorter, sizeof shorter, "%.*g", precision, real_);
    if (std::strtod(shorter, nullptr) == real_) return shorter;
  }
  return text;
}

Dictionary::Dictionary(std::initializer_list<std::pair<std::string_view, Value>> entries) {
  entries_.reserve(entries.size());
  for (const auto& [key, value] : entries) set(key, value);
}

const Value* Dictionary::find(std::string_view key) const {
  for (const Entry& e : entries_) {
    if (e.first == key) return &e.second;
  }
  return nullptr;
}

Value* Dictionary::find(std::string_view key) {
  for (Entry& e : entries_) {
    if (e.first == key) return &e.second;
  }
  return nullptr;
}

void Dictionary::set(std::string_view key, Value value) {
  if (Value* existing = find(key)) {
    *existing = std::move(value);
    return;
  }
  entries_.emplace_back(std::string(key), std::move(value));
}

bool Dictionary::erase(std::string_view key) {
  for (auto it = entries_.begin(); it != entries_.end(); ++it) {
    if (it->first == key) {
      entries_.erase(it);
      return true;
    }
  }
  return false;
}

std::vector<std::string> stringsIn(const Array& list) {
  std::vector<std::string> strings;
  strings.reserve(list.size());
  for (const Value& element : list) {
    if (const std::string* text = element.asString()) strings.push_back(*text);
  }
  return strings;
}

std::vector<std::string> stringsIn(const Value* list) {
  const Array* array = list ? list->asArray() : nullptr;
  return array ? stringsIn(*array) : std::vector<std::string>();
}

bool Dictionary::operator==(const Dictionary& other) const {
  return entries_ == other.entries_;
}

namespace {

void describe(const Value& value, std::string& out);

void describeData(const Data& data, std::string& out) {
  static const char digits[] = "0123456789abcdef";
  out += '<';
  for (std::size_t i = 0; i < data.size(); ++i) {
    if (i > 0 && i % 4 == 0) out += ' ';
    out += digits[data[i] >> 4];
    out += digits[data[i] & 0xf];
  }
  out += '>';
}

void describe(const Value& value, std::string& out) {
  switch (value.kind()) {
    case Value::Kind::String:
      out += *value.asString();
      break;
    case Value::Kind::Number:
      out += value.asNumber()->description();
      break;
    case Value::Kind::Date:
      out += value.asDate()->description();
      break;
    case Value::Kind::Url:
      out += value.asUrl()->text;
      break;
    case Value::Kind::Data:
      describeData(*value.asData(), out);
      break;
    case Value::Kind::Array: {
      out += '(';
      bool first = true;
      for (const Value& element : *value.asArray()) {
        if (!first) out += ", ";
        first = false;
        describe(element, out);
      }
      out += ')';
      break;
    }
    case Value::Kind::Dictionary: {
      out += '{';
      bool first = true;
      for (const auto& [key, element] : *value.asDictionary()) {
        out += first ? "" : " ";
        first = false;
        out += key;
        out += " = ";
        describe(element, out);
        out += ';';
      }
      out += '}';
      break;
    }
  }
}

}  // namespace

std::string Value::description() const {
  std::string out;
  describe(*this, out);
  return out;
}

std::string_view Value::typeName() const {
  static constexpr std::string_view names[] = {"string", "number", "date",      "url",
                                               "data",   "array",  "dictionary"};
  return names[v_.index()];
}

}  // namespace zt::platform
