#pragma once

#include <unistd.h>

#include <cstdint>
#include <string>

namespace qv::platform::test {

/// A D-Bus method call in bytes, for peers that no library would make.
inline std::string rawCall(const std::string& interface, const std::string& member, const std::string& signature,
                           const std::string& body, uint8_t flags = 0,
                           const std::string& path = "/com/tarnwick/quorveld", uint32_t unixFDs = 0) {
  const auto number = [](uint32_t value) { return std::string(reinterpret_cast<const char*>(&value), 4); };
  std::string fields;
  const auto field = [&](char code, char type, const std::string& value) {
    while (fields.size() % 8 != 0) fields += '\0';
    fields += code;
    fields += std::string{'\1', type, '\0'};
    if (type == 'u') {
      fields += value;
    } else {
      fields += type == 'g' ? std::string(1, static_cast<char>(value.size())) : number(uint32_t(value.size()));
      fields += value + '\0';
    }
  };
  field(1, 'o', path);
  field(2, 's', interface);
  field(3, 's', member);
  if (!signature.empty()) field(8, 'g', signature);
  if (unixFDs > 0) field(9, 'u', number(unixFDs));
  std::string message = std::string{'l', '\1', static_cast<char>(flags), '\1'} + number(uint32_t(body.size())) +
                        number(1) + number(uint32_t(fields.size())) + fields;
  while (message.size() % 8 != 0) message += '\0';
  return message + body;
}

/// How a client of this user begins.
inline std::string rawHello() {
  using namespace std::string_literals;
  std::string uid;
  for (const char digit : std::to_string(::getuid())) uid += {'3', digit};
  return "\0AUTH EXTERNAL "s + uid + "\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n";
}

/// The reply with one variant to the first call of a peer.
inline std::string rawReply(const std::string& body) {
  using namespace std::string_literals;
  return "l\2\1\1"s + static_cast<char>(body.size()) + "\0\0\0\1\0\0\0\17\0\0\0\5\1u\0\1\0\0\0\10\1g\0\1v\0\0"s + body;
}

}  // namespace qv::platform::test
