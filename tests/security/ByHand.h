#pragma once

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <string>

namespace qv::security {

/// What a client does that connects without a library.
inline sockaddr_un addressOf(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  return address;
}
inline bool connectSocket(int socket, const std::string& path) {
  const sockaddr_un address = addressOf(path);
  return ::connect(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
}
/// The authentication as the user that this process is now, up to its end.
inline std::string hello() {
  std::string digits;
  for (const char digit : std::to_string(::getuid())) digits += {'3', digit};
  using namespace std::string_literals;
  return "\0AUTH EXTERNAL "s + digits + "\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n";
}
/// Reads the answer to it; false where there is none.
inline bool readAgreement(int socket) {
  std::string answer;
  char byte = 0;
  while (!answer.ends_with("AGREE_UNIX_FD\r\n") && ::read(socket, &byte, 1) == 1) answer += byte;
  return answer.ends_with("AGREE_UNIX_FD\r\n");
}

}  // namespace qv::security
