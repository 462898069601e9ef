#include "sdk/common/ValueCoding.h"

#include <type_traits>

#include "protocol/QVBroadcastConfiguration.h"

namespace qv::sdk {

using platform::Array;
using platform::Data;

platform::Value toWire(const quorvel::Value& value) {
  return std::visit(
      [](const auto& content) -> platform::Value {
        using Content = std::decay_t<decltype(content)>;
        if constexpr (std::is_same_v<Content, std::monostate>) {
          return {};
        } else if constexpr (std::is_same_v<Content, quorvel::Value::Array>) {
          Array items;
          for (const quorvel::Value& item : content) items.push_back(toWire(item));
          return items;
        } else if constexpr (std::is_same_v<Content, quorvel::Dictionary>) {
          return toWire(content);
        } else {
          return content;
        }
      },
      value.content);
}

platform::Dictionary toWire(const quorvel::Dictionary& dictionary) {
  platform::Dictionary result;
  for (const auto& [key, value] : dictionary) result.emplace(key, toWire(value));
  return result;
}

quorvel::Value fromWire(const platform::Value& value) {
  if (const auto* flag = value.getIf<bool>()) return {*flag};
  if (const auto* number = value.getIf<double>()) return {*number};
  if (value.isNumber()) return {value.asInteger()};
  if (const auto* text = value.getIf<std::string>()) return {*text};
  if (const auto* url = value.getIf<platform::URL>()) return {url->absoluteString()};
  if (const auto* date = value.getIf<platform::Date>()) return {date->secondsSince1970};
  if (const auto* bytes = value.getIf<Data>()) return {*bytes};
  if (const auto* dictionary = value.getIf<platform::Dictionary>()) return {fromWire(*dictionary)};
  if (const auto* array = value.getIf<Array>()) {
    quorvel::Value::Array items;
    for (const platform::Value& item : *array) items.push_back(fromWire(item));
    return {std::move(items)};
  }
  return {};
}

quorvel::Dictionary fromWire(const platform::Dictionary& dictionary) {
  quorvel::Dictionary result;
  for (const auto& [key, value] : dictionary) {
    if (!value.getIf<platform::SharedFileDescriptor>()) result.emplace(key, fromWire(value));
  }
  return result;
}

platform::Data archive(const quorvel::BroadcastConfiguration& configuration) {
  return QVBroadcastConfiguration{configuration.clipDuration, toWire(configuration.videoCompressionProperties)}
      .encode();
}

}  // namespace qv::sdk
