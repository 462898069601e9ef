#pragma once

#include <fcntl.h>
#include <sys/syscall.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <iterator>
#include <string>
#include <thread>
#include <vector>

#include "platform/base/FileDescriptor.h"
#include "tests/kit/Events.h"
#include "tests/security/ByHand.h"

namespace qv::security {

/// A connection to a service that sends what no library would.
class Attacker {
 public:
  explicit Attacker(const std::string& path) : socket_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    const timeval bound{kit::kNever.count(), 0};
    ::setsockopt(socket_.get(), SOL_SOCKET, SO_RCVTIMEO, &bound, sizeof bound);
    isConnected_ = connectSocket(socket_.get(), path);
  }
  [[nodiscard]] bool isConnected() const { return isConnected_; }

  /// Until the service has answered to it.
  void authenticate() {
    send(hello());
    EXPECT_TRUE(readAgreement(socket_.get()));
  }
  /// False where the service has hung up.
  bool send(const std::string& bytes, size_t descriptors = 0) {
    std::vector<char> control(CMSG_SPACE(sizeof(int) * std::max<size_t>(descriptors, 1)));
    iovec data{const_cast<char*>(bytes.data()), bytes.size()};
    msghdr header{};
    header.msg_iov = &data;
    header.msg_iovlen = 1;
    const platform::FileDescriptor any(::open("/dev/null", O_RDONLY | O_CLOEXEC));
    if (descriptors > 0) {
      header.msg_control = control.data();
      header.msg_controllen = CMSG_SPACE(sizeof(int) * descriptors);
      cmsghdr* item = CMSG_FIRSTHDR(&header);
      *item = {CMSG_LEN(sizeof(int) * descriptors), SOL_SOCKET, SCM_RIGHTS};
      const int fd = any.get();
      for (size_t i = 0; i < descriptors; ++i) std::memcpy(CMSG_DATA(item) + i * sizeof fd, &fd, sizeof fd);
    }
    return ::sendmsg(socket_.get(), &header, MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
  }
  /// Waits for the service to hang up, whatever it says before.
  [[nodiscard]] bool isDropped() { return endsWith(0); }
  /// Whether it has by now.
  [[nodiscard]] bool wasDropped() { return endsWith(MSG_DONTWAIT); }

 private:
  bool endsWith(int flags) {
    char buffer[4096];
    ssize_t size = 0;
    do {
      size = ::recv(socket_.get(), buffer, sizeof buffer, flags);
    } while (size > 0);
    return size == 0 || errno == ECONNRESET;
  }

  platform::FileDescriptor socket_;
  bool isConnected_ = false;
};

inline size_t openDescriptors() {
  const std::filesystem::directory_iterator all("/proc/self/fd");
  return static_cast<size_t>(std::distance(begin(all), end(all)));
}

constexpr uid_t kSomebody = 65534;

/// Runs something on a thread of its own as another user; only as root.
template <typename Work>
void asSomebody(const Work& work) {
  std::thread([&] {
    // The calls of the C library would change all threads of the process.
    ASSERT_EQ(::syscall(SYS_setresgid, kSomebody, kSomebody, kSomebody), 0);
    ASSERT_EQ(::syscall(SYS_setresuid, kSomebody, kSomebody, kSomebody), 0);
    work();
  }).join();
}

}  // namespace qv::security
