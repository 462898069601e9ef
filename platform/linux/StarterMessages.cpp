#include "platform/linux/StarterMessages.h"

#include <sys/socket.h>
#include <sys/time.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <string>
#include <string_view>
#include <utility>

#include "platform/linux/Json.h"

namespace qv::platform::starter {
namespace {

constexpr size_t kMaximumBytes = 16384;
constexpr size_t kMaximumDescriptors = 2;

union Control {
  cmsghdr header;
  char bytes[CMSG_SPACE(kMaximumDescriptors * sizeof(int))];
};

/// Owned from here on, whatever the message is worth.
std::vector<SharedFileDescriptor> takeDescriptors(msghdr& header) {
  std::vector<SharedFileDescriptor> descriptors;
  for (cmsghdr* part = CMSG_FIRSTHDR(&header); part != nullptr; part = CMSG_NXTHDR(&header, part)) {
    if (part->cmsg_level != SOL_SOCKET || part->cmsg_type != SCM_RIGHTS) continue;
    for (size_t at = 0; CMSG_LEN(at + sizeof(int)) <= part->cmsg_len; at += sizeof(int)) {
      int descriptor = -1;
      std::memcpy(&descriptor, CMSG_DATA(part) + at, sizeof descriptor);
      descriptors.push_back(shareFileDescriptor(FileDescriptor(descriptor)));
    }
  }
  return descriptors;
}

void addDescriptors(msghdr& header, Control& control, const std::vector<SharedFileDescriptor>& descriptors) {
  if (descriptors.empty()) return;
  header.msg_control = control.bytes;
  header.msg_controllen = CMSG_SPACE(descriptors.size() * sizeof(int));
  cmsghdr* const part = CMSG_FIRSTHDR(&header);
  part->cmsg_level = SOL_SOCKET;
  part->cmsg_type = SCM_RIGHTS;
  part->cmsg_len = CMSG_LEN(descriptors.size() * sizeof(int));
  for (size_t i = 0; i < descriptors.size(); ++i) {
    const int descriptor = descriptors[i]->get();
    std::memcpy(CMSG_DATA(part) + i * sizeof descriptor, &descriptor, sizeof descriptor);
  }
}

}  // namespace

std::optional<Error> send(const FileDescriptor& socket, const Message& message) {
  if (message.descriptors.size() > kMaximumDescriptors) return Error::posix(EINVAL, "descriptors");
  std::string text = serializeJSON(Value(message.content));
  iovec content{text.data(), text.size()};
  Control control{};
  msghdr header{};
  header.msg_iov = &content;
  header.msg_iovlen = 1;
  addDescriptors(header, control, message.descriptors);
  if (::sendmsg(socket.get(), &header, MSG_NOSIGNAL | MSG_DONTWAIT) >= 0) return std::nullopt;
  return Error::posix(errno, "the service that starts extensions");
}

Result<Message> receive(const FileDescriptor& socket) {
  std::array<char, kMaximumBytes> text;
  iovec content{text.data(), text.size()};
  Control control{};
  msghdr header{};
  header.msg_iov = &content;
  header.msg_iovlen = 1;
  header.msg_control = control.bytes;
  header.msg_controllen = sizeof control.bytes;
  ssize_t size = 0;
  do {
    size = ::recvmsg(socket.get(), &header, MSG_CMSG_CLOEXEC);
  } while (size < 0 && errno == EINTR);
  if (size < 0) return Error::posix(errno == EAGAIN ? ETIMEDOUT : errno, "the service that starts extensions");
  Message message{.content = {}, .descriptors = takeDescriptors(header)};
  if (size == 0) return Error::posix(ECONNRESET, "the service that starts extensions");
  const bool isWhole = (header.msg_flags & (MSG_TRUNC | MSG_CTRUNC)) == 0;
  auto read = isWhole ? parseJSON(std::string_view(text.data(), static_cast<size_t>(size)))
                      : Result<Value>(Error::posix(EBADMSG, "too long"));
  if (!read) return read.error();
  message.content = read->asDictionary();
  return message;
}

void limitWaiting(const FileDescriptor& socket, std::chrono::seconds limit) {
  const timeval time{limit.count(), 0};
  (void)::setsockopt(socket.get(), SOL_SOCKET, SO_RCVTIMEO, &time, sizeof time);
  (void)::setsockopt(socket.get(), SOL_SOCKET, SO_SNDTIMEO, &time, sizeof time);
}

}  // namespace qv::platform::starter
