#include "local/buscodec/BusCodec.h"

#include "local/buscodec/BusHandles.h"
#include "local/buscodec/CarriedRecord.h"
#include "platform/codec/PropertyList.h"

#include <cerrno>
#include <new>

namespace kvr {
namespace {

/// The one property of a record that is always sent as an unsigned integer.
constexpr std::string_view kUnsignedProperty = "deviceType";

// ---- writing; every function returns a negative errno on failure

class Writer {
 public:
  explicit Writer(sd_bus_message* message) : message_(message) {}

  int basic(char type, const void* value) { return sd_bus_message_append_basic(message_, type, value); }

  int dictionary(const Value::Dictionary& dictionary, int level) {
    return container('a', "{sv}", [&] {
      for (const auto& [key, value] : dictionary) {
        const int r = container('e', "sv", [&, &name = key, &tree = value] {
          const int written = basic('s', name.c_str());
          return written < 0
                     ? written
                     : variant(tree, level + 1, level < kBusRecordLevels && name == kUnsignedProperty);
        });
        if (r < 0) return r;
      }
      return 0;
    });
  }

  int dictionaries(const Value::Array& records) {
    return container('a', "a{sv}", [&] {
      for (const Value& record : records) {
        if (const int r = dictionary(record.dictionary(), 0); r < 0) return r;
      }
      return 0;
    });
  }

 private:
  template <class Content>
  int container(char type, const char* contents, const Content& content) {
    int r = sd_bus_message_open_container(message_, type, contents);
    if (r >= 0) r = content();
    return r < 0 ? r : sd_bus_message_close_container(message_);
  }

  int variant(const Value& tree, int level, bool isUnsigned) {
    switch (tree.kind()) {
      case Value::Kind::Null:
        return -EINVAL;
      case Value::Kind::Bool: {
        const int value = tree.boolean();
        return variant('b', &value);
      }
      case Value::Kind::Int: {
        const std::int64_t value = tree.integer();
        return variant(isUnsigned && value >= 0 ? 't' : 'x', &value);
      }
      case Value::Kind::UInt: {
        const std::uint64_t value = tree.unsignedInteger();
        return variant('t', &value);
      }
      case Value::Kind::Real: {
        const double value = tree.real();
        return variant('d', &value);
      }
      case Value::Kind::String:
        return variant('s', tree.string().c_str());
      case Value::Kind::Date:
        return container('v', "(d)", [&] {
          return container('r', "d", [&] {
            const double seconds = tree.date().secondsSince1970;
            return basic('d', &seconds);
          });
        });
      case Value::Kind::Data:
        return container('v', "ay", [&] {
          return sd_bus_message_append_array(message_, 'y', tree.data().data(), tree.data().size());
        });
      case Value::Kind::Array:
        return container('v', "av", [&] { return array(tree.array()); });
      case Value::Kind::Dictionary:
        return container('v', "a{sv}", [&] { return dictionary(tree.dictionary(), level); });
    }
    return -EINVAL;
  }

  int variant(char type, const void* value) {
    const char signature[] = {type, 0};
    return container('v', signature, [&] { return basic(type, value); });
  }

  int array(const Value::Array& elements) {
    return container('a', "v", [&] {
      for (const Value& element : elements) {
        if (const int r = variant(element, kBusRecordLevels, false); r < 0) return r;
      }
      return 0;
    });
  }

  sd_bus_message* const message_;
};

// ---- reading

class Reader {
 public:
  explicit Reader(sd_bus_message* message) : message_(message) {}

  int basic(std::string_view type, Value& value) {
    switch (type[0]) {
      case 's':
      case 'o':
      case 'g':
        return number<const char*>(type[0], value);
      case 'b': {
        int flag = 0;
        const int r = sd_bus_message_read_basic(message_, 'b', &flag);
        value = Value(flag != 0);
        return r;
      }
      case 'y':
        return number<std::uint8_t>('y', value);
      case 'n':
        return number<std::int16_t>('n', value);
      case 'q':
        return number<std::uint16_t>('q', value);
      case 'i':
        return number<std::int32_t>('i', value);
      case 'u':
        return number<std::uint32_t>('u', value);
      case 'x':
        return number<std::int64_t>('x', value);
      case 't':
        return number<std::uint64_t>('t', value);
      case 'd':
        return number<double>('d', value);
      default:
        return sd_bus_message_skip(message_, std::string(type).c_str());
    }
  }

  /// `containers` is the number of containers around the dictionary; from `level` kBusRecordLevels on, it is
  /// a plain tree.
  int dictionary(int containers, int level, Value& value) {
    Value::Dictionary result;
    const int r = each('a', "{sv}", [&] {
      return each('e', "sv", [&] {
        const char* key = nullptr;
        if (const int read = sd_bus_message_read_basic(message_, 's', &key); read <= 0) return read;
        Value& entry = result[key];
        entry = Value();
        return variant(containers + 3, level, entry);
      });
    });
    value = Value(std::move(result));
    return r;
  }

  int dictionaries(Value& value) {
    Value::Array result;
    const int r = each('a', "a{sv}", [&] { return dictionary(1, 0, result.emplace_back()); });
    value = Value(std::move(result));
    return r;
  }

 private:
  template <class T>
  int number(char type, Value& value) {
    T content{};
    const int r = sd_bus_message_read_basic(message_, type, &content);
    if (r > 0) value = Value(content);
    return r;
  }

  /// Enters a container and reads its contents: the single value, or every element of an array.
  template <class Content>
  int each(char type, const char* contents, const Content& content) {
    int r = sd_bus_message_enter_container(message_, type, contents);
    if (r <= 0) return r;
    if (type == 'a') {
      while ((r = sd_bus_message_at_end(message_, 0)) == 0) {
        if ((r = content()) <= 0) break;
      }
      if (r <= 0) return r < 0 ? r : -EBADMSG;
    } else if ((r = content()) <= 0) {
      return r < 0 ? r : -EBADMSG;
    }
    return sd_bus_message_exit_container(message_);
  }

  int variant(int containers, int level, Value& value) {
    if (containers > kMaximumBusContainers) return -ELOOP;
    char type = 0;
    const char* contents = nullptr;
    const int r = sd_bus_message_peek_type(message_, &type, &contents);
    if (r <= 0 || type != 'v') return r < 0 ? r : -EBADMSG;
    return each('v', contents, [&] { return tree(contents, containers, level, value); });
  }

  int tree(std::string_view type, int containers, int level, Value& value) {
    if (type == "a{sv}") return dictionary(containers, level + 1, value);
    if (type == "av") return array(containers, value);
    if (type == "ay") return data(level, value);
    if (type == "(d)") {
      double seconds = 0;
      const int r = each('r', "d", [&] { return sd_bus_message_read_basic(message_, 'd', &seconds); });
      value = Value(Date{seconds});
      return r;
    }
    if (type.size() == 1) return basic(type, value);
    return sd_bus_message_skip(message_, std::string(type).c_str());
  }

  int array(int containers, Value& value) {
    Value::Array result;
    const int r =
        each('a', "v", [&] { return variant(containers + 2, kBusRecordLevels, result.emplace_back()); });
    value = Value(std::move(result));
    return r;
  }

  /// Reads data. Directly under a key of a record, unpacks a tree that was packed into it.
  int data(int level, Value& value) {
    const void* bytes = nullptr;
    std::size_t size = 0;
    const int r = sd_bus_message_read_array(message_, 'y', &bytes, &size);
    if (r < 0) return r;
    const auto* first = static_cast<const std::uint8_t*>(bytes);
    const std::string_view text{reinterpret_cast<const char*>(first), size};
    if (level < kBusRecordLevels && text.starts_with(kBinaryPropertyListStart)) {
      if (Result<Value> unpacked = readPropertyList(text)) {
        value = *std::move(unpacked);
        return 1;
      }
    }
    value = Value(Value::Bytes(first, first + size));
    return 1;
  }

  sd_bus_message* const message_;
};

std::optional<Error> kindError(std::string_view type) {
  return Error{"bus", EINVAL, "the value is not of type " + std::string(type)};
}

std::optional<Error> sizeError() { return Error{"bus", EMSGSIZE, "the value is too large for the bus"}; }

std::optional<Error> appendRecords(sd_bus_message* message, bool isList, const Value& value) {
  const Value::Array given = isList ? (value.isArray() ? value.array() : Value::Array{})
                                    : Value::Array{value.isNull() ? Value(Value::Dictionary{}) : value};
  Value::Array records;
  std::size_t size = 8;
  for (const Value& record : given) {
    if (!record.isDictionary()) return kindError("a{sv}");
    Result<Value> carried = carriedRecord(record, isList ? 1 : 0);
    if (!carried) return carried.error();
    size = endOnBus(size, carried->dictionary());
    if (size > kMaximumBusValueSize) return sizeError();
    records.push_back(*std::move(carried));
  }
  Writer writer(message);
  const int r = isList ? writer.dictionaries(records) : writer.dictionary(records.front().dictionary(), 0);
  if (r < 0) return busError(r, "a record cannot be written");
  return std::nullopt;
}

std::optional<Error> appendBasic(sd_bus_message* message, char type, const Value& value) {
  Writer writer(message);
  int r = 0;
  if (type == 's') {
    if (!value.isNull() && !value.isString()) return kindError("s");
    const std::string text = value.isNull() ? std::string() : value.string();
    if (!busCanCarryText(text)) return Error{"bus", EINVAL, "the text cannot be carried"};
    if (text.size() > kMaximumBusValueSize) return sizeError();
    r = writer.basic('s', text.c_str());
  } else if (type == 'b') {
    if (!value.isNull() && !value.isBool()) return kindError("b");
    const int flag = value.isBool() && value.boolean();
    r = writer.basic('b', &flag);
  } else if (type == 't') {
    const bool isWhole =
        value.kind() == Value::Kind::UInt || (value.kind() == Value::Kind::Int && value.integer() >= 0);
    if (!value.isNull() && !isWhole) return kindError("t");
    const std::uint64_t number = value.isNull() ? 0
                                 : value.kind() == Value::Kind::UInt
                                     ? value.unsignedInteger()
                                     : static_cast<std::uint64_t>(value.integer());
    r = writer.basic('t', &number);
  } else {
    if (!value.isNull() && !value.isNumber()) return kindError("d");
    const double number = value.asDouble();
    r = writer.basic('d', &number);
  }
  if (r < 0) return busError(r, "a value cannot be written");
  return std::nullopt;
}

}  // namespace

std::optional<Error> appendBusValue(sd_bus_message* message, std::string_view type, const Value& value) {
  if (type == "a{sv}" || type == "aa{sv}") {
    const bool isList = type == "aa{sv}";
    if (isList && !value.isArray() && !value.isNull()) return kindError(type);
    return appendRecords(message, isList, value);
  }
  if (type == "s" || type == "b" || type == "t" || type == "d") return appendBasic(message, type[0], value);
  return Error{"bus", EINVAL, "no value has the type " + std::string(type)};
}

Result<Value> readBusValue(sd_bus_message* message, std::string_view type) {
  try {
    Reader reader(message);
    Value value;
    int r = -EINVAL;
    if (type == "a{sv}") {
      r = reader.dictionary(0, 0, value);
    } else if (type == "aa{sv}") {
      r = reader.dictionaries(value);
    } else if (type.size() == 1) {
      r = reader.basic(type, value);
    }
    if (r < 0) return busError(r, "a value of type " + std::string(type) + " cannot be read");
    if (r == 0) return Error{"bus", ENODATA, "a value of type " + std::string(type) + " is missing"};
    return value;
  } catch (const std::bad_alloc&) {
    return Error{"bus", ENOMEM, "a value does not fit the memory"};
  }
}

}  // namespace kvr
