#include "platform/linux/dbus_payload.h"

#include <cstdint>
#include <limits>
#include <string>

namespace zt::platform::dbus {
namespace {

// Marshalling stops at the first failing call; its code travels up as this exception and
// is turned back into a return value at the entry points.
struct BusFailure {
  int code;
};

void check(int result) {
  if (result < 0) throw BusFailure{result};
}

void appendString(sd_bus_message* m, std::string_view text) {
  const std::string copy(text);
  check(sd_bus_message_append_basic(m, 's', copy.c_str()));
}

void appendVariant(sd_bus_message* m, const Value& value);

void appendDictionary(sd_bus_message* m, const Dictionary& dictionary) {
  check(sd_bus_message_open_container(m, 'a', "{sv}"));
  for (const auto& [key, value] : dictionary) {
    check(sd_bus_message_open_container(m, 'e', "sv"));
    appendString(m, key);
    appendVariant(m, value);
    check(sd_bus_message_close_container(m));
  }
  check(sd_bus_message_close_container(m));
}

bool allStrings(const Array& array) {
  for (const Value& element : array)
    if (element.kind() != Value::Kind::String) return false;
  return true;
}

void appendVariant(sd_bus_message* m, const Value& value) {
  switch (value.kind()) {
    case Value::Kind::String:
      check(sd_bus_message_open_container(m, 'v', "s"));
      appendString(m, *value.asString());
      break;
    case Value::Kind::Number: {
      const Number& number = *value.asNumber();
      if (number.kind() == Number::Kind::Boolean) {
        const int b = number.boolValue() ? 1 : 0;
        check(sd_bus_message_open_container(m, 'v', "b"));
        check(sd_bus_message_append_basic(m, 'b', &b));
      } else if (number.kind() == Number::Kind::Real) {
        const double d = number.doubleValue();
        check(sd_bus_message_open_container(m, 'v', "d"));
        check(sd_bus_message_append_basic(m, 'd', &d));
      } else {
        const std::int64_t x = number.int64Value();
        if (x >= std::numeric_limits<std::int32_t>::min() &&
            x <= std::numeric_limits<std::int32_t>::max()) {
          const auto i = static_cast<std::int32_t>(x);
          check(sd_bus_message_open_container(m, 'v', "i"));
          check(sd_bus_message_append_basic(m, 'i', &i));
        } else {
          check(sd_bus_message_open_container(m, 'v', "x"));
          check(sd_bus_message_append_basic(m, 'x', &x));
        }
      }
      break;
    }
    case Value::Kind::Array: {
      const Array& array = *value.asArray();
      if (allStrings(array)) {
        check(sd_bus_message_open_container(m, 'v', "as"));
        check(sd_bus_message_open_container(m, 'a', "s"));
        for (const Value& element : array) appendString(m, *element.asString());
      } else {
        check(sd_bus_message_open_container(m, 'v', "av"));
        check(sd_bus_message_open_container(m, 'a', "v"));
        for (const Value& element : array) appendVariant(m, element);
      }
      check(sd_bus_message_close_container(m));
      break;
    }
    case Value::Kind::Dictionary:
      check(sd_bus_message_open_container(m, 'v', "a{sv}"));
      appendDictionary(m, *value.asDictionary());
      break;
    case Value::Kind::Data: {
      const Data& data = *value.asData();
      check(sd_bus_message_open_container(m, 'v', "ay"));
      check(sd_bus_message_append_array(m, 'y', data.data(), data.size()));
      break;
    }
    case Value::Kind::Date:
    case Value::Kind::Url:
      check(sd_bus_message_open_container(m, 'v', "s"));
      appendString(m, value.description());
      break;
  }
  check(sd_bus_message_close_container(m));
}

// ---------------------------------------------------------------------------------------------
// Reading

template <typename T>
T readBasic(sd_bus_message* m, char type) {
  T result{};
  check(sd_bus_message_read_basic(m, type, &result));
  return result;
}

Value readNext(sd_bus_message* m);

// Reads the elements of an open array or structure until its end.
Array readElements(sd_bus_message* m) {
  Array elements;
  while (true) {
    const int atEnd = sd_bus_message_at_end(m, 0);
    check(atEnd);
    if (atEnd > 0) return elements;
    elements.push_back(readNext(m));
  }
}

Dictionary readDictionaryEntries(sd_bus_message* m, const char* entrySignature) {
  Dictionary dictionary;
  while (true) {
    const int entered = sd_bus_message_enter_container(m, 'e', entrySignature);
    check(entered);
    if (entered == 0) return dictionary;
    Value key = readNext(m);
    Value value = readNext(m);
    check(sd_bus_message_exit_container(m));
    dictionary.set(key.asString() ? *key.asString() : key.description(), std::move(value));
  }
}

Value readNext(sd_bus_message* m) {
  char type = 0;
  const char* contents = nullptr;
  const int peeked = sd_bus_message_peek_type(m, &type, &contents);
  check(peeked);
  if (peeked == 0) throw BusFailure{-EBADMSG};
  switch (type) {
    case 's':
    case 'o':
    case 'g':
      return Value(std::string(readBasic<const char*>(m, type)));
    case 'b':
      return Value::boolean(readBasic<int>(m, 'b') != 0);
    case 'y':
      return Value::integer(readBasic<std::uint8_t>(m, 'y'));
    case 'n':
      return Value::integer(readBasic<std::int16_t>(m, 'n'));
    case 'q':
      return Value::integer(readBasic<std::uint16_t>(m, 'q'));
    case 'i':
      return Value::integer(readBasic<std::int32_t>(m, 'i'));
    case 'u':
      return Value::integer(readBasic<std::uint32_t>(m, 'u'));
    case 'h':
      return Value::integer(readBasic<int>(m, 'h'));
    case 'x':
      return Value::integer(readBasic<std::int64_t>(m, 'x'));
    case 't':
      return Value::integer(static_cast<std::int64_t>(readBasic<std::uint64_t>(m, 't')));
    case 'd':
      return Value::real(readBasic<double>(m, 'd'));
    case 'v': {
      check(sd_bus_message_enter_container(m, 'v', contents));
      Value inner = readNext(m);
      check(sd_bus_message_exit_container(m));
      return inner;
    }
    case 'a': {
      const std::string signature(contents);
      if (signature == "y") {
        const void* bytes = nullptr;
        std::size_t size = 0;
        check(sd_bus_message_read_array(m, 'y', &bytes, &size));
        const auto* begin = static_cast<const std::uint8_t*>(bytes);
        return Value(Data(begin, begin + size));
      }
      check(sd_bus_message_enter_container(m, 'a', contents));
      Value result =
          signature.front() == '{'
              ? Value(readDictionaryEntries(m, signature.substr(1, signature.size() - 2).c_str()))
              : Value(readElements(m));
      check(sd_bus_message_exit_container(m));
      return result;
    }
    case 'r': {
      check(sd_bus_message_enter_container(m, 'r', contents));
      Array fields = readElements(m);
      check(sd_bus_message_exit_container(m));
      return Value(std::move(fields));
    }
    default:
      throw BusFailure{-EBADMSG};
  }
}

}  // namespace

int appendNotification(sd_bus_message* message, std::string_view name, std::string_view sender,
                       const Dictionary& userInfo) {
  try {
    appendString(message, name);
    appendString(message, sender);
    appendDictionary(message, userInfo);
    return 0;
  } catch (const BusFailure& failure) {
    return failure.code;
  }
}

std::optional<Notification> readNotification(sd_bus_message* message) {
  if (!sd_bus_message_has_signature(message, "ssa{sv}")) return std::nullopt;
  try {
    Notification notification;
    notification.name = readBasic<const char*>(message, 's');
    notification.sender = readBasic<const char*>(message, 's');
    Value payload = readNext(message);
    if (payload.asDictionary() == nullptr) return std::nullopt;
    notification.userInfo = std::move(*payload.asDictionary());
    return notification;
  } catch (const BusFailure&) {
    return std::nullopt;
  }
}

}  // namespace zt::platform::dbus
