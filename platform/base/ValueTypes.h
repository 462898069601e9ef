#pragma once

#include <array>
#include <cstddef>

#include "platform/base/Value.h"

namespace qv::platform {

/// A function for each type of content, to visit a value with: a type that none of them takes does not compile.
template <typename... Functions>
struct Overloaded : Functions... {
  using Functions::operator()...;
};

/// How values of one type are told from others where their type travels with them.
struct ValueType {
  char archiveTag;               ///< in a keyed archive
  const char* variantSignature;  ///< in a message, inside a variant
};

/// In the order of Value::Storage: the one place besides it that lists the types. A none stands for a descriptor in an
/// archive, and in a variant the empty dictionary stands for a none.
inline constexpr std::array kValueTypes = {
    ValueType{'n', "a{sv}"},  // none
    ValueType{'b', "b"},      // bool
    ValueType{'i', "i"},      // int32_t
    ValueType{'u', "u"},      // uint32_t
    ValueType{'x', "x"},      // int64_t
    ValueType{'t', "t"},      // uint64_t
    ValueType{'d', "d"},      // double
    ValueType{'s', "s"},      // std::string
    ValueType{'y', "ay"},     // Data
    ValueType{'a', "av"},     // Array
    ValueType{'m', "a{sv}"},  // Dictionary
    ValueType{'D', "(d)"},    // Date
    ValueType{'U', "(s)"},    // URL
    ValueType{'n', "h"},      // SharedFileDescriptor
};
static_assert(kValueTypes.size() == std::variant_size_v<Value::Storage>);

inline const ValueType& typeOf(const Value& value) { return kValueTypes[value.storage().index()]; }

/// Calls `read.template operator()<T>()`, which answers a T, for the first type with this tag. False for an unknown
/// tag.
template <size_t Index = 0, typename Read>
bool readTagged(char tag, Value& value, Read&& read) {
  if constexpr (Index == kValueTypes.size()) {
    return false;
  } else if (kValueTypes[Index].archiveTag == tag) {
    using Content = std::variant_alternative_t<Index, Value::Storage>;
    if constexpr (!std::is_same_v<Content, std::monostate>) value = Value(read.template operator()<Content>());
    return true;
  } else {
    return readTagged<Index + 1>(tag, value, read);
  }
}

}  // namespace qv::platform
