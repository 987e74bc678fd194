#pragma once

#include <concepts>
#include <cstdint>
#include <initializer_list>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <variant>

namespace zt::platform {

// One argument of a log line. Integers, reals, texts, pointers, and any object that has a
// `description()` (records' values, dates, time zones) for "%@".
class LogArgument {
 public:
  template <std::signed_integral T>
  LogArgument(T v) : v_(static_cast<std::int64_t>(v)) {}
  template <std::unsigned_integral T>
  requires(!std::same_as<T, bool>) LogArgument(T v) : v_(static_cast<std::uint64_t>(v)) {}
  LogArgument(bool v) : v_(static_cast<std::int64_t>(v ? 1 : 0)) {}
  LogArgument(double v) : v_(v) {}
  LogArgument(const char* s) : v_(std::string(s ? s : "(null)")) {}
  LogArgument(std::string_view s) : v_(std::string(s)) {}
  LogArgument(const std::string& s) : v_(s) {}
  LogArgument(const void* p) : v_(p) {}
  template <typename T>
  requires requires(const T& t) {
    { t.description() } -> std::convertible_to<std::string>;
  }
  LogArgument(const T& object) : v_(std::string(object.description())) {}

  using Storage = std::variant<std::int64_t, std::uint64_t, double, std::string, const void*>;
  const Storage& storage() const { return v_; }

 private:
  Storage v_;
};

// The process-wide log. Every line is one message, formatted from a printf-style format
// string kept letter for letter, plus "%@" for an object's description. A conversion ends at
// its conversion letter, so "%ul" prints the number followed by a literal "l", while "%lu",
// "%llX" and "%02lx" take their length modifiers.
//
// Lines go to syslog (ident "zetosynctool") unless $ZETOSYNCTOOL_LOG says "stderr" or names
// a file, in which case each line is written there exactly as formatted, without a prefix.
class Log {
 public:
  // The debug-logging flag: debug() lines are written only while it is on.
  static void setDebugEnabled(bool enabled);
  static bool debugEnabled();

  template <typename... Args>
  static void debug(std::string_view format, const Args&... args) {
    countMessage();
    if (debugEnabled()) write(format, {LogArgument(args)...});
  }
  // Lines that are written whether or not debug logging is on.
  template <typename... Args>
  static void always(std::string_view format, const Args&... args) {
    countMessage();
    write(format, {LogArgument(args)...});
  }
  // Written to the standard error stream, and to the log as an always-written line.
  template <typename... Args>
  static void standardError(std::string_view format, const Args&... args) {
    countMessage();
    writeToStandardError(format, {LogArgument(args)...});
  }

  static std::string format(std::string_view format, std::span<const LogArgument> args);
  static std::string format(std::string_view fmt, std::initializer_list<LogArgument> args) {
    return format(fmt, std::span<const LogArgument>(args.begin(), args.size()));
  }

  // How many lines this thread has asked for so far, debug lines included whether or not
  // they were written: a step that asked for none logs the same with debug logging on or
  // off, so what it made may be reused without its lines.
  static std::uint64_t messageCount();

  // Reads $ZETOSYNCTOOL_LOG again (it is read once, at the first line, otherwise).
  static void configureFromEnvironment();

 private:
  static void countMessage();
  static void write(std::string_view format, std::initializer_list<LogArgument> args);
  static void writeToStandardError(std::string_view format,
                                   std::initializer_list<LogArgument> args);
};

}  // namespace zt::platform
