#pragma once

#include <cstdint>
#include <initializer_list>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "platform/calendar_date.h"

namespace zt::platform {

// A number as records carry it: an integer, a real or a boolean.
class Number {
 public:
  enum class Kind { Integer, Real, Boolean };

  static Number integer(std::int64_t value) { return Number(Kind::Integer, value, 0.0); }
  static Number real(double value) { return Number(Kind::Real, 0, value); }
  static Number boolean(bool value) { return Number(Kind::Boolean, value ? 1 : 0, 0.0); }

  Kind kind() const { return kind_; }
  std::int64_t int64Value() const;
  // The value as a 32-bit signed integer: reals are truncated towards zero, larger integers
  // keep their low 32 bits, as a C conversion would.
  std::int32_t int32Value() const;
  double doubleValue() const;
  bool boolValue() const;

  bool operator==(const Number& other) const;
  // "42", "2.5", "1"/"0" for booleans.
  std::string description() const;

 private:
  Number(Kind kind, std::int64_t integer, double real)
      : kind_(kind), integer_(integer), real_(real) {}
  Kind kind_;
  std::int64_t integer_;
  double real_;
};

struct Url {
  std::string text;
  bool operator==(const Url&) const = default;
};

using Data = std::vector<std::uint8_t>;

class Value;
using Array = std::vector<Value>;

// A dictionary that keeps its keys in insertion order; replacing a value keeps the key's
// place. Records are small, so lookups are a linear scan over contiguous entries.
class Dictionary {
 public:
  using Entry = std::pair<std::string, Value>;
  using const_iterator = std::vector<Entry>::const_iterator;

  Dictionary() = default;
  // Keys may be given as any text (schema names are string views).
  Dictionary(std::initializer_list<std::pair<std::string_view, Value>> entries);

  const Value* find(std::string_view key) const;
  Value* find(std::string_view key);
  bool contains(std::string_view key) const;
  // The value of a key when it is of the asked kind; null when the key is missing or holds
  // another kind. Defined after Value.
  const std::string* stringAt(std::string_view key) const;
  const Number* numberAt(std::string_view key) const;
  const CalendarDate* dateAt(std::string_view key) const;
  const Data* dataAt(std::string_view key) const;
  const Array* arrayAt(std::string_view key) const;
  const Dictionary* dictionaryAt(std::string_view key) const;
  // Replaces the value of an existing key in place, or appends the key at the end.
  void set(std::string_view key, Value value);
  bool erase(std::string_view key);

  // Defined after Value, which must be complete first.
  std::size_t size() const;
  bool empty() const;
  const_iterator begin() const;
  const_iterator end() const;
  void reserve(std::size_t n);

  // Key order is part of a record, so it is part of equality.
  bool operator==(const Dictionary& other) const;

 private:
  template <typename T>
  const T* kindAt(std::string_view key, const T* (Value::*as)() const) const;

  std::vector<Entry> entries_;
};

// One value of a record: string (UTF-8), number, calendar date, URL, data, array or
// dictionary. Accessors answer a pointer that is null when the value is of another kind.
class Value {
 public:
  enum class Kind { String, Number, Date, Url, Data, Array, Dictionary };

  Value(std::string s) : v_(std::move(s)) {}
  Value(std::string_view s) : v_(std::string(s)) {}
  Value(const char* s) : v_(std::string(s)) {}
  Value(Number n) : v_(n) {}
  Value(CalendarDate d) : v_(std::move(d)) {}
  Value(Url u) : v_(std::move(u)) {}
  Value(Data d) : v_(std::move(d)) {}
  Value(Array a) : v_(std::move(a)) {}
  Value(Dictionary d) : v_(std::move(d)) {}

  static Value integer(std::int64_t v) { return Value(Number::integer(v)); }
  static Value real(double v) { return Value(Number::real(v)); }
  static Value boolean(bool v) { return Value(Number::boolean(v)); }

  Kind kind() const { return static_cast<Kind>(v_.index()); }

  const std::string* asString() const { return std::get_if<std::string>(&v_); }
  const Number* asNumber() const { return std::get_if<Number>(&v_); }
  const CalendarDate* asDate() const { return std::get_if<CalendarDate>(&v_); }
  CalendarDate* asDate() { return std::get_if<CalendarDate>(&v_); }
  const Url* asUrl() const { return std::get_if<Url>(&v_); }
  const Data* asData() const { return std::get_if<Data>(&v_); }
  const Array* asArray() const { return std::get_if<Array>(&v_); }
  Array* asArray() { return std::get_if<Array>(&v_); }
  const Dictionary* asDictionary() const { return std::get_if<Dictionary>(&v_); }
  Dictionary* asDictionary() { return std::get_if<Dictionary>(&v_); }

  bool operator==(const Value& other) const { return v_ == other.v_; }

  // The readable text that log lines print for "%@": strings as they are, numbers in
  // decimal, dates as "2007-03-15 12:30:00 +0100", URLs as their text, data as
  // "<0a1b2c ...>", arrays as "(a, b)", dictionaries as "{key = value; ...}".
  std::string description() const;
  // The kind's name, for messages: "string", "number", "date", "url", "data", "array",
  // "dictionary".
  std::string_view typeName() const;

 private:
  // The order of the alternatives is the order of Kind.
  std::variant<std::string, Number, CalendarDate, Url, Data, Array, Dictionary> v_;
};

// The strings of a list value, such as the identifiers a relationship holds, in order;
// elements of another kind are skipped, and anything but a list holds none.
std::vector<std::string> stringsIn(const Array& list);
std::vector<std::string> stringsIn(const Value* list);

inline bool Dictionary::contains(std::string_view key) const {
  return find(key) != nullptr;
}
template <typename T>
const T* Dictionary::kindAt(std::string_view key, const T* (Value::*as)() const) const {
  const Value* value = find(key);
  return value ? (value->*as)() : nullptr;
}
inline const std::string* Dictionary::stringAt(std::string_view key) const {
  return kindAt(key, &Value::asString);
}
inline const Number* Dictionary::numberAt(std::string_view key) const {
  return kindAt(key, &Value::asNumber);
}
inline const CalendarDate* Dictionary::dateAt(std::string_view key) const {
  return kindAt(key, &Value::asDate);
}
inline const Data* Dictionary::dataAt(std::string_view key) const {
  return kindAt(key, &Value::asData);
}
inline const Array* Dictionary::arrayAt(std::string_view key) const {
  return kindAt(key, &Value::asArray);
}
inline const Dictionary* Dictionary::dictionaryAt(std::string_view key) const {
  return kindAt(key, &Value::asDictionary);
}
inline std::size_t Dictionary::size() const {
  return entries_.size();
}
inline bool Dictionary::empty() const {
  return entries_.empty();
}
inline Dictionary::const_iterator Dictionary::begin() const {
  return entries_.begin();
}
inline Dictionary::const_iterator Dictionary::end() const {
  return entries_.end();
}
inline void Dictionary::reserve(std::size_t n) {
  entries_.reserve(n);
}

}  // namespace zt::platform
