#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "platform/base/FileDescriptor.h"

namespace qv::platform {

class Value;
/// Keys are ordered, so that the same dictionary always has the same encoding.
using Dictionary = std::map<std::string, Value, std::less<>>;
using Array = std::vector<Value>;
using Data = std::vector<uint8_t>;

/// A point in wall-clock time, in seconds since 1970-01-01 00:00 UTC.
struct Date {
  double secondsSince1970 = 0;
  auto operator<=>(const Date&) const = default;
};

/// A location. `absoluteString` is what crosses IPC ("file:///..." with percent encoding).
class URL {
 public:
  URL() = default;
  explicit URL(std::string absoluteString) : absoluteString_(std::move(absoluteString)) {}
  static URL fileURL(std::string_view path);

  [[nodiscard]] const std::string& absoluteString() const { return absoluteString_; }
  [[nodiscard]] bool isEmpty() const { return absoluteString_.empty(); }
  [[nodiscard]] bool isFileURL() const;
  /// The decoded path of a file URL; empty for any other.
  [[nodiscard]] std::string path() const;
  bool operator==(const URL&) const = default;

 private:
  std::string absoluteString_;
};

/// One value of a dictionary or message: nothing, a number, a text, bytes, a container, a date,
/// a URL, or a descriptor on its way to another process.
///
/// Numbers remember their kind, because it is their type on the wire; the `as...` readers convert
/// between kinds and answer the default where there is no such reading.
///
/// Threading: a value.
class Value {
 public:
  using Storage = std::variant<std::monostate, bool, int32_t, uint32_t, int64_t, uint64_t, double, std::string, Data,
                               Array, Dictionary, Date, URL, SharedFileDescriptor>;

  // Out of line: what a variant of so many kinds needs is compiled once, not in each source.
  Value();
  Value(const Value& other);
  Value(Value&& other) noexcept;
  Value& operator=(const Value& other);
  Value& operator=(Value&& other) noexcept;
  ~Value();

  Value(bool v) : storage_(v) {}
  Value(int32_t v) : storage_(v) {}
  Value(uint32_t v) : storage_(v) {}
  Value(int64_t v) : storage_(v) {}
  Value(uint64_t v) : storage_(v) {}
  Value(double v) : storage_(v) {}
  Value(std::string v) : storage_(std::move(v)) {}
  Value(std::string_view v) : storage_(std::string(v)) {}
  Value(const char* v) : storage_(std::string(v)) {}
  Value(Data v) : storage_(std::move(v)) {}
  Value(Array v) : storage_(std::move(v)) {}
  Value(Dictionary v) : storage_(std::move(v)) {}
  Value(Date v) : storage_(v) {}
  Value(URL v) : storage_(std::move(v)) {}
  Value(SharedFileDescriptor v) : storage_(std::move(v)) {}

  [[nodiscard]] bool isNone() const { return std::holds_alternative<std::monostate>(storage_); }
  [[nodiscard]] bool isNumber() const;
  template <typename T>
  [[nodiscard]] const T* getIf() const {
    return std::get_if<T>(&storage_);
  }
  [[nodiscard]] const Storage& storage() const { return storage_; }
  /// Calls `visitor` with the content; see Overloaded (ValueTypes.h).
  template <typename Visitor>
  decltype(auto) visit(Visitor&& visitor) const {
    return std::visit(std::forward<Visitor>(visitor), storage_);
  }

  [[nodiscard]] bool asBool(bool fallback = false) const;
  /// Doubles truncate toward zero; what does not fit saturates; texts are not numbers.
  [[nodiscard]] int64_t asInteger(int64_t fallback = 0) const;
  [[nodiscard]] double asDouble(double fallback = 0) const;
  [[nodiscard]] std::string asString(std::string fallback = {}) const;
  /// Empty containers where the value is of another kind.
  [[nodiscard]] const Array& asArray() const&;
  [[nodiscard]] const Dictionary& asDictionary() const&;
  [[nodiscard]] const Data& asData() const&;
  /// Of a temporary, by value: nothing dangles.
  [[nodiscard]] Array asArray() && { return std::as_const(*this).asArray(); }
  [[nodiscard]] Dictionary asDictionary() && { return std::as_const(*this).asDictionary(); }
  [[nodiscard]] Data asData() && { return std::as_const(*this).asData(); }

  /// Equal kind and content; descriptors are equal only where they are the same object.
  bool operator==(const Value& other) const;

 private:
  Storage storage_;
};

/// The entry under `key`, or nothing.
const Value* find(const Dictionary& dictionary, std::string_view key);
/// A copy of the entry under `key`, or a none value.
Value valueForKey(const Dictionary& dictionary, std::string_view key);

}  // namespace qv::platform
