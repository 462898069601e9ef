#pragma once

#include <string_view>
#include <tuple>
#include <type_traits>
#include <utility>

#include "protocol/WireTypes.h"

namespace qv {

// One description of each operation, as a type: its name, its arguments, its reply. The interface that is put on the
// wire, the arguments of a call that is made, and what is read of one that was received all come from it. Such a type
// has
//   kMember      the operation's name
//   members      for the arguments, and `arguments()`, which names them in their order; or NoArguments as its base
//   kReply       the values of its reply, e.g. "s movieURL, a{sv} error"; none in a one-way operation
//   kIsMedia     true in an operation that is dropped first when the peer does not keep up; otherwise none

/// One argument: its name, and the member of the call that holds it.
template <typename Call, typename T>
struct Argument {
  using Type = T;
  const char* name;
  T Call::*member;
};

struct NoArguments {
  static constexpr std::tuple<> arguments() { return {}; }
};

template <typename T>
concept DescribedCall = requires {
  T::kMember;
  T::arguments();
};

template <DescribedCall Call>
platform::IPCArguments argumentsOf(const Call& call) {
  return std::apply(
      [&](auto... argument) {
        return platform::IPCArguments{WireType<typename decltype(argument)::Type>::to(call.*argument.member)...};
      },
      Call::arguments());
}

/// What is missing or of another type stays empty.
template <DescribedCall Call>
Call callOf(const platform::IPCArguments& arguments) {
  Call call{};
  size_t index = 0;
  const auto read = [&](auto argument) {
    if (index >= arguments.size()) return;
    call.*argument.member = WireType<typename decltype(argument)::Type>::from(arguments[index++]);
  };
  std::apply([&](auto... argument) { (read(argument), ...); }, Call::arguments());
  return call;
}

/// A call on its way.
///
/// Threading: a value.
struct OutgoingCall {
  template <DescribedCall Call>
  OutgoingCall(const Call& call) : member(Call::kMember), arguments(argumentsOf(call)) {}

  const char* member;
  platform::IPCArguments arguments;
};

/// Fills in signatures and names from a list such as "s movieURL, a{sv} error".
void describeReply(platform::IPCOperation& operation, std::string_view list);

template <DescribedCall Call>
platform::IPCOperation operationOf() {
  platform::IPCOperation operation;
  operation.member = Call::kMember;
  const auto add = [&](auto argument) {
    operation.arguments.emplace_back(WireType<typename decltype(argument)::Type>::kSignature);
    operation.argumentNames.emplace_back(argument.name);
  };
  std::apply([&](auto... argument) { (add(argument), ...); }, Call::arguments());
  if constexpr (requires { Call::kReply; }) describeReply(operation, Call::kReply);
  if constexpr (requires { Call::kIsMedia; }) operation.isMedia = Call::kIsMedia;
  return operation;
}

/// All operations of an interface.
///
/// Threading: stateless.
template <DescribedCall... Calls>
struct CallList {
  template <typename Call>
  static constexpr bool contains = (std::is_same_v<Call, Calls> || ...);

  static platform::IPCInterface interface(const char* name) { return {name, {operationOf<Calls>()...}}; }

  /// Hands a received call to the function that takes its type; one for each must be there. False for a member of
  /// another interface.
  template <typename Visitor>
  static bool dispatch(std::string_view member, const platform::IPCArguments& arguments, Visitor&& visitor) {
    return ((member == Calls::kMember && (visitor(callOf<Calls>(arguments)), true)) || ...);
  }
};

}  // namespace qv
