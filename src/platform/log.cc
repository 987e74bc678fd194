#include "platform/log.h"

#include <fcntl.h>
#include <syslog.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <string>
#include <string_view>
#include <type_traits>
#include <variant>

namespace zt::platform {
namespace {

std::atomic<bool> debugFlag{false};
thread_local std::uint64_t messagesAsked = 0;

// ---------------------------------------------------------------------------------------------
// Formatting

bool isFlag(char c) {
  return c == '-' || c == '+' || c == ' ' || c == '#' || c == '0';
}
bool isDigit(char c) {
  return c >= '0' && c <= '9';
}
// Every argument already arrives as a 64-bit value (or a double), so length modifiers only
// need to be recognised and skipped; the reconstructed conversion picks its own.
bool isLengthModifier(char c) {
  return c == 'h' || c == 'l' || c == 'q' || c == 'z' || c == 'j' || c == 't' || c == 'L';
}

// Runs snprintf for a single conversion and appends what it produced. A stack buffer covers
// nearly every conversion; wider ones are written straight into the output.
template <typename T>
void appendConversion(std::string& out, const std::string& directive, T value) {
  char buffer[128];
  const int n = std::snprintf(buffer, sizeof buffer, directive.c_str(), value);
  if (n < 0) return;  // e.g. a width that overflows int: print nothing rather than garbage
  const auto length = static_cast<std::size_t>(n);
  if (length < sizeof buffer) {
    out.append(buffer, length);
    return;
  }
  const std::size_t start = out.size();
  out.resize(start + length + 1);
  std::snprintf(out.data() + start, length + 1, directive.c_str(), value);
  out.resize(start + length);
}

void appendText(std::string& out, const std::string& prefix, const std::string& text) {
  // Without flags, width or precision the text goes in as it is, embedded NULs included.
  if (prefix.size() == 1) {
    out += text;
    return;
  }
  appendConversion(out, prefix + 's', text.c_str());
}

unsigned long long pointerBits(const void* p) {
  return static_cast<unsigned long long>(reinterpret_cast<std::uintptr_t>(p));
}

// An argument whose kind does not match its conversion is printed in its own natural form,
// keeping the flags, width and precision, so a wrong format string never reads garbage.
void appendNatural(std::string& out, const std::string& prefix, const LogArgument::Storage& arg) {
  std::visit(
      [&](const auto& v) {
        using T = std::decay_t<decltype(v)>;
        if constexpr (std::is_same_v<T, std::int64_t>) {
          appendConversion(out, prefix + "lld", static_cast<long long>(v));
        } else if constexpr (std::is_same_v<T, std::uint64_t>) {
          appendConversion(out, prefix + "llu", static_cast<unsigned long long>(v));
        } else if constexpr (std::is_same_v<T, double>) {
          appendConversion(out, prefix + 'g', v);
        } else if constexpr (std::is_same_v<T, std::string>) {
          appendText(out, prefix, v);
        } else {
          appendConversion(out, prefix + 'p', v);
        }
      },
      arg);
}

void appendInteger(std::string& out, const std::string& prefix, char letter,
                   const LogArgument::Storage& arg) {
  const bool isSigned = letter == 'd' || letter == 'i';
  std::string directive = prefix + "ll" + letter;
  // Signed and unsigned values are reinterpreted as C does, so "%u" of -1 is 2^64 - 1.
  if (const auto* s = std::get_if<std::int64_t>(&arg)) {
    if (isSigned) {
      appendConversion(out, directive, static_cast<long long>(*s));
    } else {
      appendConversion(out, directive, static_cast<unsigned long long>(*s));
    }
  } else if (const auto* u = std::get_if<std::uint64_t>(&arg)) {
    if (isSigned) {
      appendConversion(out, directive, static_cast<long long>(*u));
    } else {
      appendConversion(out, directive, static_cast<unsigned long long>(*u));
    }
  } else if (const auto* p = std::get_if<const void*>(&arg)) {
    appendConversion(out, directive, pointerBits(*p));
  } else {
    appendNatural(out, prefix, arg);
  }
}

void appendCharacter(std::string& out, const std::string& prefix, const LogArgument::Storage& arg) {
  if (const auto* s = std::get_if<std::int64_t>(&arg)) {
    appendConversion(out, prefix + 'c', static_cast<int>(*s));
  } else if (const auto* u = std::get_if<std::uint64_t>(&arg)) {
    appendConversion(out, prefix + 'c', static_cast<int>(*u));
  } else {
    appendNatural(out, prefix, arg);
  }
}

void appendReal(std::string& out, const std::string& prefix, char letter,
                const LogArgument::Storage& arg) {
  const std::string directive = prefix + letter;
  if (const auto* d = std::get_if<double>(&arg)) {
    appendConversion(out, directive, *d);
  } else if (const auto* s = std::get_if<std::int64_t>(&arg)) {
    appendConversion(out, directive, static_cast<double>(*s));
  } else if (const auto* u = std::get_if<std::uint64_t>(&arg)) {
    appendConversion(out, directive, static_cast<double>(*u));
  } else {
    appendNatural(out, prefix, arg);
  }
}

void appendPointer(std::string& out, const std::string& prefix, const LogArgument::Storage& arg) {
  const std::string directive = prefix + 'p';
  if (const auto* p = std::get_if<const void*>(&arg)) {
    appendConversion(out, directive, *p);
  } else if (const auto* s = std::get_if<std::int64_t>(&arg)) {
    appendConversion(out, directive,
                     reinterpret_cast<const void*>(static_cast<std::uintptr_t>(*s)));
  } else if (const auto* u = std::get_if<std::uint64_t>(&arg)) {
    appendConversion(out, directive,
                     reinterpret_cast<const void*>(static_cast<std::uintptr_t>(*u)));
  } else {
    appendNatural(out, prefix, arg);
  }
}

bool isConversionLetter(char c) {
  return c != '\0' && std::string_view("diuxXocs@pfFeEgGaA").find(c) != std::string_view::npos;
}

// ---------------------------------------------------------------------------------------------
// Where lines go

enum class SinkKind { kSyslog, kStandardError, kFile };

struct Sink {
  std::mutex mutex;
  bool configured = false;
  bool syslogOpened = false;
  SinkKind kind = SinkKind::kSyslog;
  int fd = -1;
};

Sink& sink() {
  static Sink* instance = new Sink;  // never destroyed: lines may be logged during exit
  return *instance;
}

// Writes all of `data` with as few write(2) calls as the kernel allows; one, in practice, so
// lines of concurrent writers to the same file never interleave.
void writeFully(int fd, std::string_view data) {
  while (!data.empty()) {
    const ssize_t n = ::write(fd, data.data(), data.size());
    if (n < 0) {
      if (errno == EINTR) continue;
      return;
    }
    data.remove_prefix(static_cast<std::size_t>(n));
  }
}

// Caller holds the sink's mutex.
void configureLocked(Sink& s) {
  if (s.fd >= 0) {
    ::close(s.fd);
    s.fd = -1;
  }
  s.configured = true;
  const char* value = std::getenv("ZETOSYNCTOOL_LOG");
  if (value == nullptr || *value == '\0') {
    s.kind = SinkKind::kSyslog;
    return;
  }
  if (std::string_view(value) == "stderr") {
    s.kind = SinkKind::kStandardError;
    return;
  }
  s.fd = ::open(value, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
  // A log file that cannot be opened must not silence the tool.
  s.kind = s.fd >= 0 ? SinkKind::kFile : SinkKind::kStandardError;
}

// Sends one line to the configured sink. `skipStandardError` is set by callers that have
// already written the line there themselves.
void emit(const std::string& message, bool skipStandardError) {
  Sink& s = sink();
  std::lock_guard lock(s.mutex);
  if (!s.configured) configureLocked(s);
  switch (s.kind) {
    case SinkKind::kSyslog:
      if (!s.syslogOpened) {
        ::openlog("zetosynctool", LOG_PID, LOG_USER);
        s.syslogOpened = true;
      }
      ::syslog(LOG_NOTICE, "%s", message.c_str());
      break;
    case SinkKind::kStandardError:
      if (!skipStandardError) writeFully(STDERR_FILENO, message + '\n');
      break;
    case SinkKind::kFile:
      writeFully(s.fd, message + '\n');
      break;
  }
}

}  // namespace

void Log::setDebugEnabled(bool enabled) {
  debugFlag.store(enabled, std::memory_order_relaxed);
}

bool Log::debugEnabled() {
  return debugFlag.load(std::memory_order_relaxed);
}

void Log::countMessage() {
  ++messagesAsked;
}

std::uint64_t Log::messageCount() {
  return messagesAsked;
}

std::string Log::format(std::string_view format, std::span<const LogArgument> args) {
  std::string out;
  out.reserve(format.size() + 16 * args.size());
  std::size_t nextArg = 0;
  std::size_t i = 0;
  while (i < format.size()) {
    const std::size_t percent = format.find('%', i);
    if (percent == std::string_view::npos) {
      out.append(format.substr(i));
      break;
    }
    out.append(format.substr(i, percent - i));

    // %[flags][width][.precision][length]conversion
    std::size_t j = percent + 1;
    while (j < format.size() && isFlag(format[j])) ++j;
    while (j < format.size() && isDigit(format[j])) ++j;
    if (j < format.size() && format[j] == '.') {
      ++j;
      while (j < format.size() && isDigit(format[j])) ++j;
    }
    const std::size_t modifiers = j;
    while (j < format.size() && isLengthModifier(format[j])) ++j;

    if (j >= format.size()) {
      // A conversion cut short by the end of the format is kept as text.
      out.append(format.substr(percent));
      break;
    }
    const char letter = format[j];
    if (letter == '%') {
      out += '%';
      i = j + 1;
      continue;
    }
    if (!isConversionLetter(letter)) {
      // Unknown conversions (and "%n") are kept as text and take no argument.
      out.append(format.substr(percent, j + 1 - percent));
      i = j + 1;
      continue;
    }
    i = j + 1;

    const std::string prefix(format.substr(percent, modifiers - percent));
    if (nextArg >= args.size()) {
      // A missing argument prints nothing, or "(null)" where text was expected.
      if (letter == 's' || letter == '@') appendText(out, prefix, "(null)");
      continue;
    }
    const LogArgument::Storage& arg = args[nextArg++].storage();
    switch (letter) {
      case 'd':
      case 'i':
      case 'u':
      case 'x':
      case 'X':
      case 'o':
        appendInteger(out, prefix, letter, arg);
        break;
      case 'c':
        appendCharacter(out, prefix, arg);
        break;
      case 'f':
      case 'F':
      case 'e':
      case 'E':
      case 'g':
      case 'G':
      case 'a':
      case 'A':
        appendReal(out, prefix, letter, arg);
        break;
      case 'p':
        appendPointer(out, prefix, arg);
        break;
      default:  // 's' and '@': text as it is, anything else in its natural form
        appendNatural(out, prefix, arg);
        break;
    }
  }
  return out;
}

void Log::configureFromEnvironment() {
  Sink& s = sink();
  std::lock_guard lock(s.mutex);
  configureLocked(s);
}

void Log::write(std::string_view format, std::initializer_list<LogArgument> args) {
  emit(Log::format(format, std::span<const LogArgument>(args.begin(), args.size())), false);
}

void Log::writeToStandardError(std::string_view format, std::initializer_list<LogArgument> args) {
  const std::string message =
      Log::format(format, std::span<const LogArgument>(args.begin(), args.size()));
  writeFully(STDERR_FILENO, message + '\n');
  emit(message, true);
}

}  // namespace zt::platform
