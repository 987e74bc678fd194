#include "platform/property_list.h"

#include <plist/plist.h>

#include <chrono>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <memory>
#include <optional>

#include "platform/time_zone.h"

namespace zt::platform {
namespace {

// Property list dates count seconds from 2001-01-01 00:00:00 GMT.
constexpr std::chrono::sys_seconds kReferenceDate{std::chrono::seconds(978307200)};

struct PlistFree {
  void operator()(plist_t node) const { plist_free(node); }
};
using PlistPtr = std::unique_ptr<void, PlistFree>;

// libplist hands out texts the caller frees with free().
struct CFree {
  void operator()(char* text) const { std::free(text); }
};
using CText = std::unique_ptr<char, CFree>;

std::optional<Value> convert(plist_t node) {
  switch (plist_get_node_type(node)) {
    case PLIST_BOOLEAN: {
      std::uint8_t flag = 0;
      plist_get_bool_val(node, &flag);
      return Value::boolean(flag != 0);
    }
    case PLIST_UINT: {
      // Negative integers are kept in two's complement.
      std::uint64_t number = 0;
      plist_get_uint_val(node, &number);
      return Value::integer(static_cast<std::int64_t>(number));
    }
    case PLIST_UID: {
      std::uint64_t number = 0;
      plist_get_uid_val(node, &number);
      return Value::integer(static_cast<std::int64_t>(number));
    }
    case PLIST_REAL: {
      double number = 0;
      plist_get_real_val(node, &number);
      return Value::real(number);
    }
    case PLIST_STRING: {
      // plist_get_string_val asserts that a string holds no NUL byte, and a device's
      // document may hold one. libplist keeps such a string's text only up to the NUL (the
      // rest of its length is zeros), so the text ends there, as keys do.
      std::uint64_t length = 0;
      const char* text = plist_get_string_ptr(node, &length);
      return Value(text ? std::string(text, ::strnlen(text, length)) : std::string());
    }
    case PLIST_DATA: {
      std::uint64_t length = 0;
      const auto* bytes = reinterpret_cast<const std::uint8_t*>(plist_get_data_ptr(node, &length));
      return Value(bytes ? Data(bytes, bytes + length) : Data());
    }
    case PLIST_DATE: {
      std::int32_t seconds = 0;
      std::int32_t microseconds = 0;
      plist_get_date_val(node, &seconds, &microseconds);
      std::chrono::sys_seconds instant = kReferenceDate + std::chrono::seconds(seconds);
      if (microseconds < 0) {
        instant -= std::chrono::seconds(1);
        microseconds += 1000000;
      }
      return Value(
          CalendarDate(instant, TimeZone::gmt(), static_cast<std::uint32_t>(microseconds) * 1000U));
    }
    case PLIST_ARRAY: {
      Array items;
      std::uint32_t size = plist_array_get_size(node);
      items.reserve(size);
      for (std::uint32_t i = 0; i < size; ++i) {
        auto item = convert(plist_array_get_item(node, i));
        if (!item) return std::nullopt;
        items.push_back(std::move(*item));
      }
      return Value(std::move(items));
    }
    case PLIST_DICT: {
      Dictionary entries;
      plist_dict_iter iterator = nullptr;
      plist_dict_new_iter(node, &iterator);
      std::unique_ptr<void, decltype(&std::free)> iteratorOwner(iterator, &std::free);
      while (true) {
        char* rawKey = nullptr;
        plist_t item = nullptr;
        plist_dict_next_item(node, iterator, &rawKey, &item);
        CText key(rawKey);
        if (!item) break;
        auto value = convert(item);
        if (!value) return std::nullopt;
        entries.set(key ? key.get() : "", std::move(*value));
      }
      return Value(std::move(entries));
    }
    default:
      // Keys only occur inside dictionaries; the rest have no value of ours.
      return std::nullopt;
  }
}

}  // namespace

Result<Value> parsePropertyList(std::span<const std::uint8_t> document) {
  if (document.empty()) return Error{"The property list is empty"};
  if (document.size() > std::numeric_limits<std::uint32_t>::max()) {
    return Error{"The property list is too large"};
  }
  plist_t raw = nullptr;
  plist_from_memory(reinterpret_cast<const char*>(document.data()),
                    static_cast<std::uint32_t>(document.size()), &raw);
  PlistPtr root(raw);
  if (!root) return Error{"The data is not a well-formed property list"};
  auto value = convert(root.get());
  if (!value) return Error{"The property list holds a value of an unsupported type"};
  return std::move(*value);
}

}  // namespace zt::platform
