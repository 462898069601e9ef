#pragma once

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <chrono>
#include <string>

#include "platform/base/FileDescriptor.h"
#include "tests/sdbus/RawCall.h"

namespace qv::platform::test {

/// A client that speaks by hand, and reads only when told to.
class RawPeer {
 public:
  explicit RawPeer(const std::string& path) : socket_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    EXPECT_EQ(::connect(socket_.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  }
  void authenticate() { send(rawHello()); }
  bool send(const std::string& bytes) {
    return ::send(socket_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
  }
  /// Sends `bytes` again and again until the other side takes nothing for as long as `patience`, or
  /// has taken `most`; answers how much it took.
  size_t flood(const std::string& bytes, size_t most, std::chrono::seconds patience) {
    const timeval bound{patience.count(), 0};
    ::setsockopt(socket_.get(), SOL_SOCKET, SO_SNDTIMEO, &bound, sizeof bound);
    size_t sent = 0;
    while (sent < most && send(bytes)) sent += bytes.size();
    return sent;
  }
  /// Reads until `text` has come; false when the connection ends first.
  bool readUntil(const std::string& text) {
    char buffer[4096];
    while (received_.find(text) == std::string::npos) {
      const ssize_t size = ::read(socket_.get(), buffer, sizeof buffer);
      if (size <= 0) return false;
      received_.append(buffer, static_cast<size_t>(size));
    }
    return true;
  }

 private:
  FileDescriptor socket_;
  std::string received_;
};

}  // namespace qv::platform::test
