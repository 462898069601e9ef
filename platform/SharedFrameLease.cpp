#include "platform/SharedFrameLease.h"

#include <sys/epoll.h>
#include <sys/socket.h>

#include <array>
#include <cerrno>
#include <map>
#include <mutex>
#include <thread>

namespace qv::platform {
namespace {

struct Lease {
  FileDescriptor end;
  SharedFrameRef frame;
};

/// Never destroyed: its thread is detached and a lease may end at any time.
class LeaseWatcher {
 public:
  LeaseWatcher() : epoll_(::epoll_create1(EPOLL_CLOEXEC)) {
    std::thread([this] { run(); }).detach();
  }

  std::optional<Error> add(FileDescriptor end, SharedFrameRef frame) {
    const int fd = end.get();
    std::lock_guard lock(mutex_);
    leases_.emplace(fd, Lease{std::move(end), std::move(frame)});
    epoll_event event{};
    event.events = EPOLLRDHUP;
    event.data.fd = fd;
    if (::epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, fd, &event) == 0) return std::nullopt;
    const int failure = errno;
    leases_.erase(fd);
    return Error::posix(failure, "epoll_ctl");
  }

  size_t count() {
    std::lock_guard lock(mutex_);
    return leases_.size();
  }

 private:
  void run() {
    std::array<epoll_event, 16> events{};
    for (;;) {
      const int ready = ::epoll_wait(epoll_.get(), events.data(), static_cast<int>(events.size()), -1);
      for (int i = 0; i < ready; ++i) end(events[static_cast<size_t>(i)].data.fd);
    }
  }

  void end(int fd) {
    Lease ended;
    std::lock_guard lock(mutex_);
    if (const auto it = leases_.find(fd); it != leases_.end()) {
      ended = std::move(it->second);
      leases_.erase(it);
    }
  }

  FileDescriptor epoll_;
  std::mutex mutex_;
  std::map<int, Lease> leases_;
};

LeaseWatcher& watcher() {
  static LeaseWatcher* const instance = new LeaseWatcher;
  return *instance;
}

}  // namespace

Result<FileDescriptor> issueSharedFrameLease(SharedFrameRef frame) {
  std::array<int, 2> ends{};
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()) != 0) return Error::posix(errno, "socketpair");
  FileDescriptor ours(ends[0]);
  FileDescriptor theirs(ends[1]);
  if (auto error = watcher().add(std::move(ours), std::move(frame))) return *error;
  return theirs;
}

size_t outstandingSharedFrameLeases() { return watcher().count(); }

}  // namespace qv::platform
