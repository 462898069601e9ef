#pragma once

#include <cerrno>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/base/Value.h"

namespace qv::platform {

// Which value has which form in which signature. The signatures are those of D-Bus, one complete type for each value;
// platform/IPC.h has the table of forms. Values are taken apart into a sink, and put together by one, ValueAssembly;
// what carries the parts between the two is for whoever has a wire.

/// How deep containers may be nested, in either direction.
inline constexpr int kMaximumFormDepth = 32;

/// Takes the parts of values, in the order of the signature. Each function answers 0 or more, or a negative errno.
///
/// Threading: one thread at a time.
class FormSink {
 public:
  virtual ~FormSink() = default;
  /// `exact` is of the type's own kind: bool for b, int32_t for i, and so on.
  virtual int number(char type, const Value& exact) = 0;
  virtual int text(std::string_view text) = 0;
  virtual int bytes(std::span<const uint8_t> bytes) = 0;
  /// A valid one.
  virtual int descriptor(const SharedFileDescriptor& descriptor) = 0;
  /// `kind` is a array, r struct, e dictionary entry or v variant; `contents` the signature inside.
  virtual int open(char kind, const std::string& contents) = 0;
  virtual int close() = 0;
};

/// Takes `values` apart, one for each of `signatures`. Answers 0 or a negative errno: -EINVAL for a value that has no
/// form in its signature, -EBADF for a missing descriptor, -ELOOP for nesting too deep. What the sink has by then is of
/// no use.
int writeForms(FormSink& sink, const std::vector<std::string>& signatures, const Array& values);

/// Puts values together from their parts.
///
/// Threading: one thread at a time.
class ValueAssembly final : public FormSink {
 public:
  int number(char type, const Value& exact) override;
  int text(std::string_view text) override;
  int bytes(std::span<const uint8_t> bytes) override;
  int descriptor(const SharedFileDescriptor& descriptor) override;
  int open(char kind, const std::string& contents) override;
  int close() override;
  /// What is complete.
  [[nodiscard]] Array take() { return std::move(containers_.front().items); }

 private:
  struct Container {
    char kind = 0;
    std::string contents;
    Array items;
  };
  int add(Value value);

  std::vector<Container> containers_ = std::vector<Container>(1);  // the innermost last; the first is none
};

/// Calls `visit.template operator()<T>()` with the C++ type of a number's type (bool for b, uint8_t for y, ...), and
/// answers what it answers; -EINVAL for what is no number.
template <typename Visit>
int visitNumberType(char type, Visit&& visit) {
  switch (type) {
    case 'b':
      return visit.template operator()<bool>();
    case 'y':
      return visit.template operator()<uint8_t>();
    case 'n':
      return visit.template operator()<int16_t>();
    case 'q':
      return visit.template operator()<uint16_t>();
    case 'i':
      return visit.template operator()<int32_t>();
    case 'u':
      return visit.template operator()<uint32_t>();
    case 'x':
      return visit.template operator()<int64_t>();
    case 't':
      return visit.template operator()<uint64_t>();
    case 'd':
      return visit.template operator()<double>();
    default:
      return -EINVAL;
  }
}

}  // namespace qv::platform
