#pragma once

#include <sys/socket.h>

#include <cstring>
#include <string_view>
#include <vector>

namespace qv::kit {

/// Sends bytes and, with them, copies of descriptors in one message; answers as ::sendmsg.
inline ssize_t sendMessage(int socket, std::string_view bytes, const std::vector<int>& descriptors = {},
                           int flags = MSG_NOSIGNAL) {
  iovec data{const_cast<char*>(bytes.data()), bytes.size()};
  msghdr header{};
  header.msg_iov = &data;
  header.msg_iovlen = 1;
  const size_t size = sizeof(int) * descriptors.size();
  std::vector<char> control(CMSG_SPACE(size));
  if (size > 0) {
    header.msg_control = control.data();
    header.msg_controllen = control.size();
    cmsghdr* item = CMSG_FIRSTHDR(&header);
    *item = {CMSG_LEN(size), SOL_SOCKET, SCM_RIGHTS};
    std::memcpy(CMSG_DATA(item), descriptors.data(), size);
  }
  return ::sendmsg(socket, &header, flags);
}

}  // namespace qv::kit
