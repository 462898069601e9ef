#include <optional>
#include <utility>

#include "tests/fakes/FakeIPC.h"

namespace qv::fakes {

using platform::Array;
using platform::Data;
using platform::Dictionary;
using platform::SharedFileDescriptor;
using platform::URL;
using platform::Value;

namespace {

/// The length of the first complete type of a signature.
size_t completeTypeLength(std::string_view signature) {
  if (signature.empty()) return 0;
  if (signature[0] == 'a') return 1 + completeTypeLength(signature.substr(1));
  const char open = signature[0];
  const char close = open == '(' ? ')' : open == '{' ? '}' : 0;
  if (!close) return 1;
  int depth = 0;
  for (size_t i = 0; i < signature.size(); ++i) {
    if (signature[i] == open) ++depth;
    if (signature[i] == close && --depth == 0) return i + 1;
  }
  return signature.size();
}

template <typename T>
std::optional<Value> integerFor(const Value& value) {
  if (value.isNone()) return Value(T{0});
  if (!value.isNumber() || value.getIf<double>() || value.getIf<bool>()) return std::nullopt;
  const auto fit = [](auto number) {
    return std::in_range<T>(number) ? std::optional(Value(static_cast<T>(number))) : std::nullopt;
  };
  const auto* wide = value.getIf<uint64_t>();
  return wide ? fit(*wide) : fit(value.asInteger());
}

std::optional<Value> stringFor(const Value& value) {
  if (value.isNone()) return Value("");
  if (const auto* url = value.getIf<URL>()) return Value(url->absoluteString());
  return value.getIf<std::string>() ? std::optional(value) : std::nullopt;
}

std::optional<Value> structFor(const Value& value, std::string_view fields) {
  const Array* given = value.getIf<Array>();
  if (!given) return std::nullopt;
  Array result;
  for (const Value& field : *given) {
    const size_t length = completeTypeLength(fields);
    auto converted = length ? valueForSignature(field, fields.substr(0, length)) : std::nullopt;
    if (!converted) return std::nullopt;
    result.push_back(std::move(*converted));
    fields.remove_prefix(length);
  }
  return fields.empty() ? std::optional(Value(std::move(result))) : std::nullopt;
}

std::optional<Value> arrayFor(const Value& value, std::string_view element) {
  if (value.isNone()) return Value(Array());
  const Array* given = value.getIf<Array>();
  if (!given) return std::nullopt;
  Array result;
  for (const Value& item : *given) {
    auto converted = valueForSignature(item, element);
    if (!converted) return std::nullopt;
    result.push_back(std::move(*converted));
  }
  return Value(std::move(result));
}

template <typename T>
std::optional<Value> sameKind(const Value& value) {
  if (value.isNone()) return Value(T());
  return value.getIf<T>() ? std::optional(value) : std::nullopt;
}

}  // namespace

std::optional<Value> valueForSignature(const Value& value, std::string_view signature) {
  if (signature == "ay") return sameKind<Data>(value);
  if (signature == "a{sv}") return sameKind<Dictionary>(value);
  if (signature.empty()) return std::nullopt;
  switch (signature[0]) {
    case 'b':
      return sameKind<bool>(value);
    case 'i':
      return integerFor<int32_t>(value);
    case 'u':
      return integerFor<uint32_t>(value);
    case 'x':
      return integerFor<int64_t>(value);
    case 't':
      return integerFor<uint64_t>(value);
    case 'd':
      return value.isNone() ? Value(0.0) : value.getIf<double>() ? std::optional(value) : std::nullopt;
    case 's':
      return stringFor(value);
    case 'h':
      return value.getIf<SharedFileDescriptor>() ? std::optional(value) : std::nullopt;
    case 'v':
      return value;
    case 'a':
      return arrayFor(value, signature.substr(1));
    case '(':
      return structFor(value, signature.substr(1, signature.size() - 2));
    default:
      return std::nullopt;
  }
}

}  // namespace qv::fakes
