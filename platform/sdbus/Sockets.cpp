#include "platform/sdbus/Sockets.h"

#include <fcntl.h>
#include <grp.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/file.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <systemd/sd-daemon.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstring>
#include <vector>

#ifndef SO_PEERPIDFD
#define SO_PEERPIDFD 77  // Linux 6.5
#endif

namespace qv::platform::sdbus {
namespace {

constexpr mode_t kOwnerAndGroup = 0660;

std::optional<sockaddr_un> addressOf(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.empty() || path.size() >= sizeof address.sun_path) return std::nullopt;
  std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
  return address;
}

const sockaddr* asAddress(const sockaddr_un& address) { return reinterpret_cast<const sockaddr*>(&address); }

/// Held by the one process that serves a name; the kernel lets go of it when that process dies.
Result<FileDescriptor> lockService(const std::string& path) {
  const std::string lockPath = path + ".lock";
  FileDescriptor lock(::open(lockPath.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
  if (!lock.isValid()) return Error::posix(errno, lockPath);
  if (::flock(lock.get(), LOCK_EX | LOCK_NB) == 0) return lock;
  return Error::posix(errno == EWOULDBLOCK ? EADDRINUSE : errno, path);
}

/// -1, which changes nothing, for the empty name.
Result<gid_t> groupNamed(const std::string& name) {
  if (name.empty()) return static_cast<gid_t>(-1);
  gid_t number = 0;
  const char* const end = name.data() + name.size();
  if (const auto read = std::from_chars(name.data(), end, number); read.ec == std::errc() && read.ptr == end) {
    return number;
  }
  group entry{};
  group* found = nullptr;
  std::vector<char> texts(size_t{64} << 10);
  const int r = ::getgrnam_r(name.c_str(), &entry, texts.data(), texts.size(), &found);
  if (found == nullptr) return Error::posix(r != 0 ? r : ENOENT, "group " + name);
  return entry.gr_gid;
}

bool removeStaleSocket(const std::string& path) {
  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0) return errno == ENOENT;
  if (S_ISSOCK(status.st_mode)) return ::unlink(path.c_str()) == 0;
  errno = EEXIST;
  return false;
}

int integerOption(int socket, int option) {
  int value = -1;
  socklen_t size = sizeof value;
  return ::getsockopt(socket, SOL_SOCKET, option, &value, &size) == 0 ? value : -1;
}

/// Whether this is an end of a stream pair, as `connectThrough` sends it: connected, and to no
/// named socket, so that nobody makes us talk to some other service.
bool isStreamPairEnd(int fd) {
  const auto isUnnamed = [fd](auto nameOf) {
    sockaddr_un address{};
    socklen_t size = sizeof address;
    return nameOf(fd, reinterpret_cast<sockaddr*>(&address), &size) == 0 && size == sizeof address.sun_family &&
           address.sun_family == AF_UNIX;
  };
  return integerOption(fd, SO_TYPE) == SOCK_STREAM && isUnnamed(::getpeername) && isUnnamed(::getsockname);
}

/// A message of one byte with room for the descriptors that it carries.
struct DescriptorMessage {
  char byte = 'c';
  iovec data{&byte, 1};
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int) * 4)] = {};
  msghdr header{};
  DescriptorMessage() {
    header.msg_iov = &data;
    header.msg_iovlen = 1;
    header.msg_control = control;
    header.msg_controllen = sizeof control;
  }
};

ssize_t sendDescriptor(int socket, int fd) {
  DescriptorMessage message;
  message.header.msg_controllen = CMSG_SPACE(sizeof(int));
  cmsghdr* item = CMSG_FIRSTHDR(&message.header);
  item->cmsg_level = SOL_SOCKET;
  item->cmsg_type = SCM_RIGHTS;
  item->cmsg_len = CMSG_LEN(sizeof(int));
  std::memcpy(CMSG_DATA(item), &fd, sizeof fd);
  return ::sendmsg(socket, &message.header, MSG_DONTWAIT | MSG_NOSIGNAL);
}

}  // namespace

std::string socketPath(const std::string& directory, const std::string& serviceName) {
  return directory + "/" + serviceName;
}

Result<NamedSocket> listenAt(const std::string& path, const std::string& group) {
  const auto address = addressOf(path);
  if (!address) return Error::posix(ENAMETOOLONG, path);
  auto members = groupNamed(group);
  if (!members) return members.error();
  auto lock = lockService(path);
  if (!lock) return lock.error();
  FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!socket.isValid()) return Error::posix(errno, path);
  if (!removeStaleSocket(path) || ::bind(socket.get(), asAddress(*address), sizeof *address) != 0 ||
      ::lchown(path.c_str(), static_cast<uid_t>(-1), *members) != 0 || ::chmod(path.c_str(), kOwnerAndGroup) != 0 ||
      ::listen(socket.get(), SOMAXCONN) != 0) {
    return Error::posix(errno, path);
  }
  return NamedSocket{std::move(socket), std::move(*lock)};
}

std::optional<FileDescriptor> adoptActivatedSocket(const std::string& path) {
  const int count = sd_listen_fds(0);
  for (int fd = SD_LISTEN_FDS_START; fd < SD_LISTEN_FDS_START + count; ++fd) {
    if (sd_is_socket_unix(fd, SOCK_STREAM, true, path.c_str(), 0) <= 0) continue;
    // A copy: the listener may be ended and opened again.
    FileDescriptor copy(::fcntl(fd, F_DUPFD_CLOEXEC, 3));
    if (!copy.isValid() || ::fcntl(copy.get(), F_SETFL, O_NONBLOCK) != 0) return std::nullopt;
    return copy;
  }
  return std::nullopt;
}

Result<FileDescriptor> connectTo(const std::string& path) {
  const auto address = addressOf(path);
  if (!address) return Error::posix(ENAMETOOLONG, path);
  FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (!socket.isValid()) return Error::posix(errno, path);
  const timeval timeout{kConnectPatience.count(), 0};
  ::setsockopt(socket.get(), SOL_SOCKET, SO_SNDTIMEO, &timeout, sizeof timeout);
  int r = 0;
  do {
    r = ::connect(socket.get(), asAddress(*address), sizeof *address);
  } while (r != 0 && errno == EINTR);
  if (r != 0) return Error::posix(errno, path);
  return socket;
}

Result<std::pair<FileDescriptor, FileDescriptor>> createRendezvous() {
  int ends[2];
  if (::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) != 0) return Error::posix(errno, "rendezvous");
  return std::pair{FileDescriptor(ends[0]), FileDescriptor(ends[1])};
}

Result<FileDescriptor> connectThrough(int rendezvous, std::chrono::milliseconds patience) {
  if (integerOption(rendezvous, SO_DOMAIN) != AF_UNIX || integerOption(rendezvous, SO_TYPE) != SOCK_SEQPACKET) {
    return Error::posix(ENOTSOCK, "endpoint");
  }
  int ends[2];
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) return Error::posix(errno, "endpoint");
  FileDescriptor ours(ends[0]);
  const FileDescriptor theirs(ends[1]);
  while (sendDescriptor(rendezvous, theirs.get()) < 0) {
    if (errno != EAGAIN) return Error::posix(errno, "endpoint");
    pollfd room{rendezvous, POLLOUT, 0};
    if (::poll(&room, 1, static_cast<int>(patience.count())) == 0) return Error::posix(ETIMEDOUT, "endpoint");
  }
  return ours;
}

std::optional<FileDescriptor> acceptFrom(int rendezvous) {
  DescriptorMessage message;
  const ssize_t size = ::recvmsg(rendezvous, &message.header, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
  if (size < 0) return std::nullopt;
  FileDescriptor first;
  size_t count = 0;
  for (cmsghdr* item = CMSG_FIRSTHDR(&message.header); item; item = CMSG_NXTHDR(&message.header, item)) {
    if (item->cmsg_level != SOL_SOCKET || item->cmsg_type != SCM_RIGHTS) continue;
    for (size_t at = CMSG_LEN(0); at + sizeof(int) <= item->cmsg_len; at += sizeof(int)) {
      int fd = -1;
      std::memcpy(&fd, reinterpret_cast<const char*>(item) + at, sizeof fd);
      FileDescriptor received(fd);
      if (count++ == 0) first = std::move(received);
    }
  }
  if (count != 1 || !isStreamPairEnd(first.get())) return FileDescriptor();
  return first;
}

SharedFileDescriptor openPeerProcess(int socket, pid_t pid) {
  FileDescriptor opened(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)));
  pollfd hangUp{socket, 0, 0};
  const bool isOpen = ::poll(&hangUp, 1, 0) == 0;
  return opened.isValid() && isOpen ? shareFileDescriptor(std::move(opened)) : nullptr;
}

IPCPeer peerOf(int socket) {
  IPCPeer peer;
  ucred credentials{};
  socklen_t size = sizeof credentials;
  if (::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &size) != 0) {
    peer.userIdentifier = static_cast<uid_t>(-1);
    return peer;
  }
  peer.processIdentifier = credentials.pid;
  peer.userIdentifier = credentials.uid;
  FileDescriptor pinned(integerOption(socket, SO_PEERPIDFD));
  peer.processHandle =
      pinned.isValid() ? shareFileDescriptor(std::move(pinned)) : openPeerProcess(socket, credentials.pid);
  return peer;
}

uid_t userOf(int socket) {
  ucred credentials{};
  socklen_t size = sizeof credentials;
  const bool isTold = ::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &size) == 0;
  return isTold ? credentials.uid : static_cast<uid_t>(-1);
}

void askForSenders(int socket) {
  const int on = 1;
  ::setsockopt(socket, SOL_SOCKET, SO_PASSCRED, &on, sizeof on);
}

void raiseDescriptorLimit() {
  constexpr rlim_t kEnough = 65536;
  rlimit limit{};
  if (::getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
  const rlim_t wanted = std::min(limit.rlim_max, kEnough);
  if (limit.rlim_cur < wanted) {
    limit.rlim_cur = wanted;
    ::setrlimit(RLIMIT_NOFILE, &limit);
  }
  // A place far up in the kernel's table of descriptors, taken for a moment, makes it as large. The table doubles
  // otherwise at 64, 128, 256 and so on, and holds up a process of several threads for 10 to 30 ms each time.
  constexpr rlim_t kTableSize = 4096;
  const FileDescriptor any(::eventfd(0, EFD_CLOEXEC));
  FileDescriptor(::fcntl(any.get(), F_DUPFD_CLOEXEC, static_cast<int>(std::min(limit.rlim_cur, kTableSize)) - 1));
}

}  // namespace qv::platform::sdbus
