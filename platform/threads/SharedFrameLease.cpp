#include "platform/threads/SharedFrameLease.h"

#include <sys/epoll.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <deque>
#include <mutex>
#include <thread>

#include "platform/threads/Log.h"
#include "platform/threads/RareLog.h"

namespace qv::platform {
namespace {

struct Lease {
  uint64_t number = 0;  ///< of its issue: descriptors are used again
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
    Lease oldest;  // let go of without the lock
    std::lock_guard lock(mutex_);
    epoll_event event{};
    event.events = EPOLLRDHUP;
    event.data.u64 = ++last_;
    if (::epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, end.get(), &event) != 0) return Error::posix(errno, "epoll_ctl");
    leases_.push_back({last_, std::move(end), std::move(frame)});
    if (leases_.size() <= kMaximumSharedFrameLeases) return std::nullopt;
    oldest = std::move(leases_.front());
    leases_.pop_front();
    if (const auto number = givenUp_.count()) {
      QV_LOG_ERROR(logs::kPlatform, "%llu frames were taken from who does not give them back",
                   static_cast<unsigned long long>(*number));
    }
    return std::nullopt;
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
      for (int i = 0; i < ready; ++i) end(events[static_cast<size_t>(i)].data.u64);
    }
  }

  void end(uint64_t number) {
    Lease ended;
    std::lock_guard lock(mutex_);
    const auto it =
        std::find_if(leases_.begin(), leases_.end(), [&](const Lease& lease) { return lease.number == number; });
    if (it == leases_.end()) return;
    ended = std::move(*it);
    leases_.erase(it);
  }

  FileDescriptor epoll_;
  RareLog givenUp_;
  std::mutex mutex_;
  uint64_t last_ = 0;
  std::deque<Lease> leases_;  ///< the oldest first; few
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
