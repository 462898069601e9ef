#include "sdk/common/ValueCoding.h"

#include <concepts>
#include <type_traits>

#include "platform/base/ValueTypes.h"
#include "protocol/QVBroadcastConfiguration.h"

namespace qv::sdk {

using platform::Array;

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
  return value.visit(platform::Overloaded{
      [](std::monostate) { return quorvel::Value{}; },
      [](const platform::SharedFileDescriptor&) { return quorvel::Value{}; },
      [](std::unsigned_integral auto number) { return quorvel::Value{platform::Value(number).asInteger()}; },
      [](std::signed_integral auto number) { return quorvel::Value{int64_t{number}}; },
      [](const platform::URL& url) { return quorvel::Value{url.absoluteString()}; },
      [](const platform::Date& date) { return quorvel::Value{date.secondsSince1970}; },
      [](const platform::Dictionary& dictionary) { return quorvel::Value{fromWire(dictionary)}; },
      [](const Array& array) {
        quorvel::Value::Array items;
        for (const platform::Value& item : array) items.push_back(fromWire(item));
        return quorvel::Value{std::move(items)};
      },
      [](bool flag) { return quorvel::Value{flag}; },
      [](double number) { return quorvel::Value{number}; },
      [](const std::string& text) { return quorvel::Value{text}; },
      [](const platform::Data& bytes) { return quorvel::Value{bytes}; },
  });
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
