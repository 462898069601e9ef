#include "platform/threads/SharedFrameLease.h"

#include <sys/epoll.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <deque>
#include <mutex>

#include "platform/threads/EventLoop.h"
#include "platform/threads/Log.h"
#include "platform/threads/RareLog.h"

namespace qv::platform {
namespace {

struct Lease {
  uint64_t number = 0;  ///< of its issue: descriptors are used again
  FileDescriptor end;
  SharedFrameRef frame;
  EventLoop::Watch watch;  // last: it ends before the descriptor is closed
};

/// Never destroyed: a lease may end at any time. A loop of its own, for what lets go of a frame may be slow.
///
/// Threading: thread-safe. Frames are let go of without the lock.
class LeaseWatcher {
 public:
  std::optional<Error> add(FileDescriptor end, SharedFrameRef frame) {
    Lease oldest;
    std::lock_guard lock(mutex_);
    const uint64_t number = ++last_;
    auto watch = loop_.watch(end.get(), EPOLLRDHUP, [this, number](uint32_t) { this->end(number); });
    if (!watch) return Error::posix(ENOMEM, "lease");
    leases_.push_back({number, std::move(end), std::move(frame), std::move(watch)});
    if (leases_.size() <= kMaximumSharedFrameLeases) return std::nullopt;
    oldest = std::move(leases_.front());
    leases_.pop_front();
    if (const auto times = givenUp_.count()) {
      QV_LOG_ERROR(logs::kPlatform, "%llu frames were taken from who does not give them back",
                   static_cast<unsigned long long>(*times));
    }
    return std::nullopt;
  }

  size_t count() {
    std::lock_guard lock(mutex_);
    return leases_.size();
  }

 private:
  void end(uint64_t number) {
    Lease ended;
    std::lock_guard lock(mutex_);
    const auto it = std::ranges::find(leases_, number, &Lease::number);
    if (it == leases_.end()) return;
    ended = std::move(*it);
    leases_.erase(it);
  }

  RareLog givenUp_;
  std::mutex mutex_;
  uint64_t last_ = 0;
  std::deque<Lease> leases_;  ///< the oldest first; few
  EventLoop loop_;
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
