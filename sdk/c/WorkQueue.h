#pragma once

#include <deque>
#include <functional>
#include <memory>
#include <mutex>

#include "platform/base/FileDescriptor.h"
#include "sdk/c/quorvel/quorvel.h"

namespace qv::c {

/// Work that waits until the application's main loop runs it, with a descriptor that tells of it.
///
/// Threading: thread-safe; `run` and `wait` by one thread at a time.
class WorkQueue {
 public:
  using Work = std::function<void()>;

  /// Nothing where there is no descriptor left.
  static std::shared_ptr<WorkQueue> create();
  void post(Work work);
  /// Throws away what waits and what is still posted: work may hold whoever posts it, and that the queue.
  void close();
  size_t run();
  size_t wait(int milliseconds);
  [[nodiscard]] int descriptor() const { return wake_.get(); }

 private:
  explicit WorkQueue(platform::FileDescriptor wake) : wake_(std::move(wake)) {}

  const platform::FileDescriptor wake_;  // an eventfd; readable while something waits
  std::mutex mutex_;
  std::deque<Work> waiting_;
  bool isClosed_ = false;
};

}  // namespace qv::c

/// The application's hold on a queue; the recorders that post to it have holds of their own.
///
/// Threading: as the queue's.
struct quorvel_queue {
  std::shared_ptr<qv::c::WorkQueue> work;
};
