#pragma once

#include <string>
#include <vector>

#include "platform/Extensions.h"
#include "platform/IPC.h"
#include "platform/base/Geometry.h"
#include "protocol/QVSharedFrameObject.h"

namespace qv {

/// How a C++ type stands among the arguments of a call: its signature, its value, and back. Where a value is of another
/// type, which only a peer that breaks the interface sends, `from` answers the empty one.
///
/// Threading: stateless.
template <typename T>
struct WireType;

/// A type that values have themselves.
template <typename T>
struct OwnWireType {
  static platform::Value to(const T& content) { return platform::Value(content); }
  static T from(const platform::Value& value) {
    const T* content = value.getIf<T>();
    return content ? *content : T();
  }
};

template <>
struct WireType<bool> : OwnWireType<bool> {
  static constexpr const char kSignature[] = "b";
};
template <>
struct WireType<int32_t> : OwnWireType<int32_t> {
  static constexpr const char kSignature[] = "i";
};
template <>
struct WireType<uint32_t> : OwnWireType<uint32_t> {
  static constexpr const char kSignature[] = "u";
};
template <>
struct WireType<int64_t> : OwnWireType<int64_t> {
  static constexpr const char kSignature[] = "x";
};
template <>
struct WireType<uint64_t> : OwnWireType<uint64_t> {
  static constexpr const char kSignature[] = "t";
};
template <>
struct WireType<double> : OwnWireType<double> {
  static constexpr const char kSignature[] = "d";
};
template <>
struct WireType<std::string> : OwnWireType<std::string> {
  static constexpr const char kSignature[] = "s";
};
template <>
struct WireType<platform::Data> : OwnWireType<platform::Data> {
  static constexpr const char kSignature[] = "ay";
};
template <>
struct WireType<platform::Dictionary> : OwnWireType<platform::Dictionary> {
  static constexpr const char kSignature[] = "a{sv}";
};
template <>
struct WireType<platform::SharedFileDescriptor> : OwnWireType<platform::SharedFileDescriptor> {
  static constexpr const char kSignature[] = "h";
};

template <>
struct WireType<platform::URL> {
  static constexpr const char kSignature[] = "s";
  static platform::Value to(const platform::URL& url) { return platform::Value(url.absoluteString()); }
  static platform::URL from(const platform::Value& value) { return platform::URL(value.asString()); }
};

template <>
struct WireType<platform::Size> {
  static constexpr const char kSignature[] = "(dd)";
  static platform::Value to(const platform::Size& size) { return platform::Array{size.width, size.height}; }
  static platform::Size from(const platform::Value& value) {
    const platform::Array& sides = value.asArray();
    return sides.size() == 2 ? platform::Size{sides[0].asDouble(), sides[1].asDouble()} : platform::Size{};
  }
};

template <>
struct WireType<std::vector<uint32_t>> {
  static constexpr const char kSignature[] = "au";
  static platform::Value to(const std::vector<uint32_t>& numbers) {
    return platform::Array(numbers.begin(), numbers.end());
  }
  static std::vector<uint32_t> from(const platform::Value& value) {
    std::vector<uint32_t> numbers;
    for (const platform::Value& number : value.asArray()) numbers.push_back(static_cast<uint32_t>(number.asInteger()));
    return numbers;
  }
};

/// None is the empty array.
template <>
struct WireType<platform::ListenerEndpoint> {
  static constexpr const char kSignature[] = "ah";
  static platform::Value to(const platform::ListenerEndpoint& endpoint) {
    return endpoint.rendezvous() ? platform::Array{endpoint.rendezvous()} : platform::Array{};
  }
  static platform::ListenerEndpoint from(const platform::Value& value) {
    for (const platform::Value& handle : value.asArray()) {
      if (const auto* descriptor = handle.getIf<platform::SharedFileDescriptor>()) {
        return platform::ListenerEndpoint(*descriptor);
      }
    }
    return {};
  }
};

template <>
struct WireType<QVSharedFrameObject> {
  static constexpr const char kSignature[] = "(hhuuuu)";
  static platform::Value to(const QVSharedFrameObject& frame) { return frame.encodeForIPC(); }
  static QVSharedFrameObject from(const platform::Value& value) { return QVSharedFrameObject::decodeFromIPC(value); }
};

}  // namespace qv
