#include "platform/sdbus/BusCoding.h"

#include <fcntl.h>

#include <cerrno>
#include <limits>

#include "platform/sdbus/Text.h"

namespace qv::platform::sdbus {
namespace {

constexpr size_t kCostPerValue = 64;

void addCost(const Value& value, MessageCost& cost, int depth) {
  cost.bytes += 16;
  if (depth > kMaximumDepth) return;
  if (const auto* text = value.getIf<std::string>()) cost.bytes += text->size();
  if (const auto* url = value.getIf<URL>()) cost.bytes += url->absoluteString().size();
  if (const auto* data = value.getIf<Data>()) cost.bytes += data->size();
  if (value.getIf<SharedFileDescriptor>()) ++cost.descriptors;
  for (const Value& element : value.asArray()) addCost(element, cost, depth + 1);
  for (const auto& [key, element] : value.asDictionary()) {
    cost.bytes += key.size();
    addCost(element, cost, depth + 1);
  }
}

/// The length of the complete type at the start of a valid signature.
size_t typeLength(std::string_view signature) {
  if (signature.empty()) return 0;
  if (signature[0] == 'a') return 1 + typeLength(signature.substr(1));
  if (signature[0] != '(' && signature[0] != '{') return 1;
  int open = 0;
  for (size_t i = 0; i < signature.size(); ++i) {
    if (signature[i] == '(' || signature[i] == '{') ++open;
    if ((signature[i] == ')' || signature[i] == '}') && --open == 0) return i + 1;
  }
  return signature.size();
}

std::string_view takeType(std::string_view& signature) {
  const std::string_view type = signature.substr(0, typeLength(signature));
  signature.remove_prefix(type.size());
  return type;
}

/// Writes Values into a message.
///
/// Threading: I/O thread.
class Encoder {
 public:
  explicit Encoder(sd_bus_message* message) : message_(message) {}

  int encode(std::string_view type, const Value& value, int depth) {
    if (depth > kMaximumDepth) return -ELOOP;
    switch (type[0]) {
      case 's':
        return encodeText(value);
      case 'h':
        return encodeDescriptor(value);
      case 'v':
        return encodeVariant(value, depth);
      case 'a':
        return encodeArray(type.substr(1), value, depth);
      case '(':
        return encodeStruct(type.substr(1, type.size() - 2), value, depth);
      default:
        return value.isNone() || value.isNumber() ? encodeNumber(type[0], value) : -EINVAL;
    }
  }

 private:
  template <typename Wire>
  int appendInteger(char type, const Value& value) {
    const auto* wide = value.getIf<uint64_t>();
    const int64_t number = value.asInteger();
    const bool fits =
        wide ? *wide <= static_cast<uint64_t>(std::numeric_limits<Wire>::max()) : std::in_range<Wire>(number);
    if (!fits) return -EINVAL;
    const Wire wire = wide ? static_cast<Wire>(*wide) : static_cast<Wire>(number);
    return sd_bus_message_append_basic(message_, type, &wire);
  }

  int encodeNumber(char type, const Value& value) {
    switch (type) {
      case 'b': {
        const int wire = value.asBool();
        return sd_bus_message_append_basic(message_, type, &wire);
      }
      case 'i':
        return appendInteger<int32_t>(type, value);
      case 'u':
        return appendInteger<uint32_t>(type, value);
      case 'x':
        return appendInteger<int64_t>(type, value);
      case 't':
        return appendInteger<uint64_t>(type, value);
      case 'd': {
        const double wire = value.asDouble();
        return sd_bus_message_append_basic(message_, type, &wire);
      }
      default:
        return -EINVAL;
    }
  }

  int encodeText(const Value& value) {
    const auto* text = value.getIf<std::string>();
    const auto* url = value.getIf<URL>();
    if (!text && !url && !value.isNone()) return -EINVAL;
    const std::string valid = validText(text ? *text : url ? url->absoluteString() : std::string());
    return sd_bus_message_append_basic(message_, 's', valid.c_str());
  }

  int encodeDescriptor(const Value& value) {
    const auto* descriptor = value.getIf<SharedFileDescriptor>();
    if (!descriptor || !*descriptor || !(*descriptor)->isValid()) return -EBADF;
    const int fd = (*descriptor)->get();
    return sd_bus_message_append_basic(message_, 'h', &fd);
  }

  int encodeArray(std::string_view element, const Value& value, int depth) {
    if (element == "y") {
      if (!value.isNone() && !value.getIf<Data>()) return -EINVAL;
      return sd_bus_message_append_array(message_, 'y', value.asData().data(), value.asData().size());
    }
    if (element[0] == '{') return encodeDictionary(element.substr(1, element.size() - 2), value, depth);
    if (!value.isNone() && !value.getIf<Array>()) return -EINVAL;
    int r = sd_bus_message_open_container(message_, 'a', std::string(element).c_str());
    for (const Value& item : value.asArray()) {
      if (r >= 0) r = encode(element, item, depth + 1);
    }
    return r < 0 ? r : sd_bus_message_close_container(message_);
  }

  /// Entries that are none stay out: an absent key is how none stands in a dictionary.
  int encodeDictionary(std::string_view entry, const Value& value, int depth) {
    if ((!value.isNone() && !value.getIf<Dictionary>()) || entry[0] != 's') return -EINVAL;
    const std::string contents(entry);
    int r = sd_bus_message_open_container(message_, 'a', ("{" + contents + "}").c_str());
    for (const auto& [key, item] : value.asDictionary()) {
      if (r < 0) return r;
      if (item.isNone()) continue;
      r = sd_bus_message_open_container(message_, 'e', contents.c_str());
      if (r >= 0) r = sd_bus_message_append_basic(message_, 's', validText(key).c_str());
      if (r >= 0) r = encode(entry.substr(1), item, depth + 1);
      if (r >= 0) r = sd_bus_message_close_container(message_);
    }
    return r < 0 ? r : sd_bus_message_close_container(message_);
  }

  int encodeStruct(std::string_view contents, const Value& value, int depth) {
    if (!value.isNone() && !value.getIf<Array>()) return -EINVAL;
    const Array& fields = value.asArray();
    int r = sd_bus_message_open_container(message_, 'r', std::string(contents).c_str());
    size_t index = 0;
    while (r >= 0 && !contents.empty()) {
      if (!value.isNone() && index >= fields.size()) return -EINVAL;
      r = encode(takeType(contents), value.isNone() ? Value() : fields[index], depth + 1);
      ++index;
    }
    if (r < 0) return r;
    return index < fields.size() ? -EINVAL : sd_bus_message_close_container(message_);
  }

  int encodeVariant(const Value& value, int depth) {
    const char* type = variantType(value);
    int r = sd_bus_message_open_container(message_, 'v', type);
    if (r < 0) return r;
    if (const auto* date = value.getIf<Date>()) {
      r = encode(type, Value(Array{Value(date->secondsSince1970)}), depth + 1);
    } else if (const auto* url = value.getIf<URL>()) {
      r = encode(type, Value(Array{Value(url->absoluteString())}), depth + 1);
    } else {
      r = encode(type, value, depth + 1);
    }
    return r < 0 ? r : sd_bus_message_close_container(message_);
  }

  static const char* variantType(const Value& value) {
    // In the order of Value::Storage; none becomes an empty dictionary.
    static constexpr const char* kTypes[] = {"a{sv}", "b",  "i",  "u",     "x",   "t",   "d",
                                             "s",     "ay", "av", "a{sv}", "(d)", "(s)", "h"};
    static_assert(std::size(kTypes) == std::variant_size_v<Value::Storage>);
    return kTypes[value.storage().index()];
  }

  sd_bus_message* const message_;
};

/// Reads Values from a message, within bounds.
///
/// Threading: I/O thread.
class Decoder {
 public:
  explicit Decoder(sd_bus_message* message) : message_(message) {}

  int decode(std::string_view type, Value& value, int depth) {
    if (depth > kMaximumDepth) return -ELOOP;
    if (!spend(kCostPerValue)) return -E2BIG;
    switch (type[0]) {
      case 'v':
        return decodeVariant(value, depth);
      case 'a':
        return decodeArray(type.substr(1), value, depth);
      case '(':
        return decodeStruct(type.substr(1, type.size() - 2), value, depth);
      default:
        return decodeBasic(type[0], value);
    }
  }

 private:
  bool spend(size_t bytes) {
    if (bytes > budget_) return false;
    budget_ -= bytes;
    return true;
  }

  template <typename Wire, typename Kind = Wire>
  int readNumber(char type, Value& value) {
    Wire wire{};
    const int r = sd_bus_message_read_basic(message_, type, &wire);
    if (r > 0) value = Value(static_cast<Kind>(wire));
    return r > 0 ? 0 : r < 0 ? r : -EBADMSG;
  }

  int decodeBasic(char type, Value& value) {
    switch (type) {
      case 'b':
        return readNumber<int, bool>(type, value);
      case 'y':
        return readNumber<uint8_t, uint32_t>(type, value);
      case 'n':
        return readNumber<int16_t, int32_t>(type, value);
      case 'q':
        return readNumber<uint16_t, uint32_t>(type, value);
      case 'i':
        return readNumber<int32_t>(type, value);
      case 'u':
        return readNumber<uint32_t>(type, value);
      case 'x':
        return readNumber<int64_t>(type, value);
      case 't':
        return readNumber<uint64_t>(type, value);
      case 'd':
        return readNumber<double>(type, value);
      case 's':
      case 'o':
      case 'g':
        return decodeText(type, value);
      case 'h':
        return decodeDescriptor(value);
      default:
        return -EINVAL;
    }
  }

  int decodeText(char type, Value& value) {
    const char* text = nullptr;
    const int r = sd_bus_message_read_basic(message_, type, &text);
    if (r <= 0) return r < 0 ? r : -EBADMSG;
    std::string copy(text);
    if (!spend(copy.size())) return -E2BIG;
    value = Value(std::move(copy));
    return 0;
  }

  int decodeDescriptor(Value& value) {
    int borrowed = -1;
    const int r = sd_bus_message_read_basic(message_, 'h', &borrowed);
    if (r <= 0) return r < 0 ? r : -EBADMSG;
    const int fd = ::fcntl(borrowed, F_DUPFD_CLOEXEC, 3);
    if (fd < 0) return -errno;
    value = Value(shareFileDescriptor(FileDescriptor(fd)));
    return 0;
  }

  int decodeArray(std::string_view element, Value& value, int depth) {
    if (element == "y") return decodeData(value);
    if (element[0] == '{') return decodeDictionary(element.substr(1, element.size() - 2), value, depth);
    int r = sd_bus_message_enter_container(message_, 'a', std::string(element).c_str());
    if (r <= 0) return r < 0 ? r : -EBADMSG;
    Array items;
    while ((r = sd_bus_message_at_end(message_, 0)) == 0) {
      Value item;
      if (const int failure = decode(element, item, depth + 1)) return failure;
      items.push_back(std::move(item));
    }
    if (r > 0) r = sd_bus_message_exit_container(message_);
    value = Value(std::move(items));
    return r < 0 ? r : 0;
  }

  int decodeData(Value& value) {
    const void* bytes = nullptr;
    size_t size = 0;
    const int r = sd_bus_message_read_array(message_, 'y', &bytes, &size);
    if (r < 0) return r;
    if (!spend(size)) return -E2BIG;
    const auto* first = static_cast<const uint8_t*>(bytes);
    value = size > 0 ? Value(Data(first, first + size)) : Value(Data());
    return 0;
  }

  int decodeDictionary(std::string_view entry, Value& value, int depth) {
    if (entry[0] != 's') return -EINVAL;
    const std::string contents(entry);
    int r = sd_bus_message_enter_container(message_, 'a', ("{" + contents + "}").c_str());
    if (r <= 0) return r < 0 ? r : -EBADMSG;
    Dictionary dictionary;
    while ((r = sd_bus_message_enter_container(message_, 'e', contents.c_str())) > 0) {
      Value key;
      Value item;
      if (const int failure = decode("s", key, depth + 1)) return failure;
      if (const int failure = decode(entry.substr(1), item, depth + 1)) return failure;
      dictionary.insert_or_assign(key.asString(), std::move(item));
      if ((r = sd_bus_message_exit_container(message_)) < 0) return r;
    }
    if (r == 0) r = sd_bus_message_exit_container(message_);
    value = Value(std::move(dictionary));
    return r < 0 ? r : 0;
  }

  int decodeStruct(std::string_view contents, Value& value, int depth) {
    int r = sd_bus_message_enter_container(message_, 'r', std::string(contents).c_str());
    if (r <= 0) return r < 0 ? r : -EBADMSG;
    Array fields;
    while (!contents.empty()) {
      Value field;
      if (const int failure = decode(takeType(contents), field, depth + 1)) return failure;
      fields.push_back(std::move(field));
    }
    r = sd_bus_message_exit_container(message_);
    value = Value(std::move(fields));
    return r < 0 ? r : 0;
  }

  int decodeVariant(Value& value, int depth) {
    char kind = 0;
    const char* contents = nullptr;
    int r = sd_bus_message_peek_type(message_, &kind, &contents);
    if (r <= 0 || kind != 'v') return r < 0 ? r : -EBADMSG;
    const std::string type(contents);
    r = sd_bus_message_enter_container(message_, 'v', type.c_str());
    if (r <= 0) return r < 0 ? r : -EBADMSG;
    Value inner;
    if (const int failure = decode(type, inner, depth + 1)) return failure;
    if (type == "(d)") {
      value = Value(Date{inner.asArray()[0].asDouble()});
    } else if (type == "(s)") {
      value = Value(URL(inner.asArray()[0].asString()));
    } else {
      value = std::move(inner);
    }
    r = sd_bus_message_exit_container(message_);
    return r < 0 ? r : 0;
  }

  sd_bus_message* const message_;
  size_t budget_ = kMaximumDecodedBytes;
};

}  // namespace

MessageCost costOf(const IPCArguments& values) {
  MessageCost cost;
  for (const Value& value : values) addCost(value, cost, 0);
  return cost;
}

int encodeArguments(sd_bus_message* message, const std::vector<std::string>& signatures, const IPCArguments& values) {
  if (signatures.size() != values.size()) return -EINVAL;
  Encoder encoder(message);
  for (size_t i = 0; i < values.size(); ++i) {
    const int r = encoder.encode(signatures[i], values[i], 0);
    if (r < 0) return r;
  }
  return 0;
}

int decodeArguments(sd_bus_message* message, const std::vector<std::string>& signatures, IPCArguments& values) {
  Decoder decoder(message);
  values.clear();
  for (const std::string& signature : signatures) {
    Value value;
    if (const int r = decoder.decode(signature, value, 0)) return r;
    values.push_back(std::move(value));
  }
  return 0;
}

}  // namespace qv::platform::sdbus
