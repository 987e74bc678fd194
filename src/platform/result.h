#pragma once

#include <optional>
#include <string>
#include <utility>
#include <variant>

namespace zt::platform {

// Why an operation failed, in words a log line can print.
struct Error {
  std::string description;
};

// What an operation that can fail answers: its value, or the description of the failure.
// Operations that answer nothing on success use Result<void>.
template <typename T>
class [[nodiscard]] Result {
 public:
  Result(T value) : outcome_(std::in_place_index<0>, std::move(value)) {}
  Result(Error error) : outcome_(std::in_place_index<1>, std::move(error)) {}

  bool ok() const { return outcome_.index() == 0; }
  explicit operator bool() const { return ok(); }

  // The value; only when ok().
  const T& value() const& { return std::get<0>(outcome_); }
  T& value() & { return std::get<0>(outcome_); }
  T&& value() && { return std::get<0>(std::move(outcome_)); }
  const T& operator*() const& { return value(); }
  T& operator*() & { return value(); }
  const T* operator->() const { return &value(); }
  T* operator->() { return &value(); }

  // The description of the failure; only when not ok().
  const std::string& error() const { return std::get<1>(outcome_).description; }

  // The value, or none when the operation failed, for callers that do not report why.
  std::optional<T> valueOrNone() && {
    if (!ok()) return std::nullopt;
    return std::move(*this).value();
  }

 private:
  std::variant<T, Error> outcome_;
};

template <>
class [[nodiscard]] Result<void> {
 public:
  Result() = default;
  Result(Error error) : error_(std::move(error.description)) {}

  bool ok() const { return !error_; }
  explicit operator bool() const { return ok(); }
  // The description of the failure; only when not ok().
  const std::string& error() const { return *error_; }

 private:
  std::optional<std::string> error_;
};

}  // namespace zt::platform
