#include "platform/base/Value.h"

#include <cmath>
#include <limits>
#include <type_traits>

namespace qv::platform {
namespace {

constexpr std::string_view kFileScheme = "file://";

bool isUnreservedPathByte(unsigned char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '/' || c == '-' ||
         c == '_' || c == '.' || c == '~';
}

int hexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

int64_t integerFromDouble(double v) {
  if (std::isnan(v)) return 0;
  if (v >= 9.2233720368547748e18) return std::numeric_limits<int64_t>::max();
  if (v <= -9.2233720368547758e18) return std::numeric_limits<int64_t>::min();
  return static_cast<int64_t>(v);
}

}  // namespace

URL URL::fileURL(std::string_view path) {
  static constexpr char kHex[] = "0123456789ABCDEF";
  std::string text(kFileScheme);
  for (unsigned char c : path) {
    if (isUnreservedPathByte(c)) {
      text += static_cast<char>(c);
    } else {
      text += '%';
      text += kHex[c >> 4];
      text += kHex[c & 15];
    }
  }
  return URL(std::move(text));
}

bool URL::isFileURL() const { return absoluteString_.starts_with("file:///"); }

std::string URL::path() const {
  if (!isFileURL()) return {};
  std::string decoded;
  for (size_t i = kFileScheme.size(); i < absoluteString_.size(); ++i) {
    if (absoluteString_[i] == '%' && i + 2 < absoluteString_.size() && hexDigit(absoluteString_[i + 1]) >= 0 &&
        hexDigit(absoluteString_[i + 2]) >= 0) {
      decoded += static_cast<char>(hexDigit(absoluteString_[i + 1]) * 16 + hexDigit(absoluteString_[i + 2]));
      i += 2;
    } else {
      decoded += absoluteString_[i];
    }
  }
  // A path with an embedded NUL would name another file to the system than to us.
  return decoded.find('\0') == std::string::npos ? decoded : std::string();
}

Value::Value() = default;
Value::Value(const Value& other) = default;
Value::Value(Value&& other) noexcept = default;
Value& Value::operator=(const Value& other) = default;
Value& Value::operator=(Value&& other) noexcept = default;
Value::~Value() = default;

bool Value::isNumber() const {
  return visit([](const auto& content) { return std::is_arithmetic_v<std::decay_t<decltype(content)>>; });
}

bool Value::asBool(bool fallback) const {
  if (const auto* v = getIf<double>()) return *v != 0;
  return isNumber() ? asInteger() != 0 : fallback;
}

int64_t Value::asInteger(int64_t fallback) const {
  return visit([fallback](const auto& content) {
    using Content = std::decay_t<decltype(content)>;
    constexpr int64_t kLargest = std::numeric_limits<int64_t>::max();
    if constexpr (std::is_same_v<Content, double>) {
      return integerFromDouble(content);
    } else if constexpr (std::is_same_v<Content, uint64_t>) {
      return content > uint64_t{kLargest} ? kLargest : static_cast<int64_t>(content);
    } else if constexpr (std::is_arithmetic_v<Content>) {
      return static_cast<int64_t>(content);
    } else {
      return fallback;
    }
  });
}

double Value::asDouble(double fallback) const {
  return visit([fallback](const auto& content) {
    if constexpr (std::is_arithmetic_v<std::decay_t<decltype(content)>>) {
      return static_cast<double>(content);
    } else {
      return fallback;
    }
  });
}

std::string Value::asString(std::string fallback) const {
  const auto* v = getIf<std::string>();
  return v ? *v : fallback;
}

const Array& Value::asArray() const& {
  static const Array kEmpty;
  const auto* v = getIf<Array>();
  return v ? *v : kEmpty;
}

const Dictionary& Value::asDictionary() const& {
  static const Dictionary kEmpty;
  const auto* v = getIf<Dictionary>();
  return v ? *v : kEmpty;
}

const Data& Value::asData() const& {
  static const Data kEmpty;
  const auto* v = getIf<Data>();
  return v ? *v : kEmpty;
}

bool Value::operator==(const Value& other) const { return storage_ == other.storage_; }

const Value* find(const Dictionary& dictionary, std::string_view key) {
  const auto it = dictionary.find(key);
  return it == dictionary.end() ? nullptr : &it->second;
}

Value valueForKey(const Dictionary& dictionary, std::string_view key) {
  const Value* value = find(dictionary, key);
  return value ? *value : Value();
}

}  // namespace qv::platform
