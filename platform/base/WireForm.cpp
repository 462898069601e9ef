#include "platform/base/WireForm.h"

#include <utility>

#include "platform/base/ValueTypes.h"

namespace qv::platform {
namespace {

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

/// What stands between the brackets of a struct or of a dictionary's entry.
std::string_view inside(std::string_view type) { return type.substr(1, type.size() - 2); }

template <typename Content>
bool isNoneOr(const Value& value) {
  return value.isNone() || value.getIf<Content>();
}

/// Dates and URLs keep their kinds in a variant, each as a struct of its own.
Value withoutKind(const Value& value) {
  if (const auto* date = value.getIf<Date>()) return Value(Array{Value(date->secondsSince1970)});
  if (const auto* url = value.getIf<URL>()) return Value(Array{Value(url->absoluteString())});
  return value;
}

Value withKind(std::string_view type, Value value) {
  if (type == "(d)") return Value(Date{value.asArray().at(0).asDouble()});
  if (type == "(s)") return Value(URL(value.asArray().at(0).asString()));
  return value;
}

/// Takes values apart.
///
/// Threading: of whoever calls.
class Disassembly {
 public:
  explicit Disassembly(FormSink& sink) : sink_(sink) {}

  int write(std::string_view type, const Value& value, int depth) {
    if (depth > kMaximumFormDepth) return -ELOOP;
    switch (type[0]) {
      case 's':
        return writeText(value);
      case 'h':
        return writeDescriptor(value);
      case 'v':
        return writeVariant(value, depth);
      case 'a':
        return writeArray(type.substr(1), value, depth);
      case '(':
        return writeStruct(inside(type), value, depth);
      default:
        return value.isNone() || value.isNumber() ? writeNumber(type[0], value) : -EINVAL;
    }
  }

 private:
  int writeNumber(char type, const Value& value) {
    return visitNumberType(type, [&]<typename Number>() {
      if constexpr (std::is_same_v<Number, bool>) {
        return sink_.number(type, Value(value.asBool()));
      } else if constexpr (std::is_same_v<Number, double>) {
        return sink_.number(type, Value(value.asDouble()));
      } else if constexpr (sizeof(Number) < sizeof(int32_t)) {
        return -EINVAL;  // no interface of ours has these
      } else {
        const auto* wide = value.getIf<uint64_t>();
        const bool fits = wide ? std::in_range<Number>(*wide) : std::in_range<Number>(value.asInteger());
        const Number number = wide ? static_cast<Number>(*wide) : static_cast<Number>(value.asInteger());
        return fits ? sink_.number(type, Value(number)) : -EINVAL;
      }
    });
  }

  int writeText(const Value& value) {
    if (const auto* text = value.getIf<std::string>()) return sink_.text(*text);
    if (const auto* url = value.getIf<URL>()) return sink_.text(url->absoluteString());
    return value.isNone() ? sink_.text({}) : -EINVAL;
  }

  int writeDescriptor(const Value& value) {
    const auto* descriptor = value.getIf<SharedFileDescriptor>();
    const bool isValid = descriptor && *descriptor && (*descriptor)->isValid();
    return isValid ? sink_.descriptor(*descriptor) : -EBADF;
  }

  int writeArray(std::string_view element, const Value& value, int depth) {
    if (element == "y") return isNoneOr<Data>(value) ? sink_.bytes(value.asData()) : -EINVAL;
    if (element[0] == '{') return writeDictionary(inside(element), value, depth);
    if (!isNoneOr<Array>(value)) return -EINVAL;
    int r = sink_.open('a', std::string(element));
    for (const Value& item : value.asArray()) {
      if (r >= 0) r = write(element, item, depth + 1);
    }
    return r < 0 ? r : sink_.close();
  }

  /// Entries that are none stay out: an absent key is how none stands in a dictionary.
  int writeDictionary(std::string_view entry, const Value& value, int depth) {
    if (!isNoneOr<Dictionary>(value) || entry[0] != 's') return -EINVAL;
    const std::string contents(entry);
    int r = sink_.open('a', "{" + contents + "}");
    for (const auto& [key, item] : value.asDictionary()) {
      if (r < 0) return r;
      if (item.isNone()) continue;
      r = sink_.open('e', contents);
      if (r >= 0) r = sink_.text(key);
      if (r >= 0) r = write(entry.substr(1), item, depth + 1);
      if (r >= 0) r = sink_.close();
    }
    return r < 0 ? r : sink_.close();
  }

  int writeStruct(std::string_view contents, const Value& value, int depth) {
    if (!isNoneOr<Array>(value)) return -EINVAL;
    const Array& fields = value.asArray();
    int r = sink_.open('r', std::string(contents));
    size_t index = 0;
    while (r >= 0 && !contents.empty()) {
      if (!value.isNone() && index >= fields.size()) return -EINVAL;
      r = write(takeType(contents), value.isNone() ? Value() : fields[index], depth + 1);
      ++index;
    }
    if (r < 0) return r;
    return index < fields.size() ? -EINVAL : sink_.close();
  }

  int writeVariant(const Value& value, int depth) {
    const char* type = typeOf(value).variantSignature;
    int r = sink_.open('v', type);
    if (r >= 0) r = write(type, withoutKind(value), depth + 1);
    return r < 0 ? r : sink_.close();
  }

  FormSink& sink_;
};

}  // namespace

int writeForms(FormSink& sink, const std::vector<std::string>& signatures, const Array& values) {
  if (signatures.size() != values.size()) return -EINVAL;
  Disassembly disassembly(sink);
  for (size_t i = 0; i < values.size(); ++i) {
    if (const int r = disassembly.write(signatures[i], values[i], 0); r < 0) return r;
  }
  return 0;
}

int ValueAssembly::add(Value value) {
  containers_.back().items.push_back(std::move(value));
  return 0;
}

int ValueAssembly::number(char, const Value& exact) { return add(exact); }
int ValueAssembly::text(std::string_view text) { return add(Value(text)); }
int ValueAssembly::bytes(std::span<const uint8_t> bytes) { return add(Value(Data(bytes.begin(), bytes.end()))); }
int ValueAssembly::descriptor(const SharedFileDescriptor& descriptor) { return add(Value(descriptor)); }

int ValueAssembly::open(char kind, const std::string& contents) {
  containers_.push_back({kind, contents, {}});
  return 0;
}

int ValueAssembly::close() {
  Container closed = std::move(containers_.back());
  containers_.pop_back();
  if (closed.kind == 'v') return add(withKind(closed.contents, std::move(closed.items.front())));
  if (closed.kind != 'a' || closed.contents[0] != '{') return add(Value(std::move(closed.items)));
  Dictionary dictionary;
  for (const Value& entry : closed.items) {
    const Array& pair = entry.asArray();
    dictionary.insert_or_assign(pair[0].asString(), pair[1]);
  }
  return add(Value(std::move(dictionary)));
}

}  // namespace qv::platform
