#pragma once

#include <functional>
#include <memory>

namespace qv::platform {

/// Runs work somewhere: the process's threads, or by hand in a test.
///
/// Threading: thread-safe.
class Executor {
 public:
  virtual ~Executor() = default;
  /// Queues `work`; never runs it inside the call. Work of one executor may run in parallel.
  virtual void post(std::function<void()> work) = 0;
};

/// The process-wide concurrent queue: threads are made as work needs them (64 at most), and end
/// when there was none for them for two seconds.
Executor& globalQueue();
/// The same for work that nobody waits for, such as removing files; its threads yield the
/// processor to all others.
Executor& globalBackgroundQueue();

}  // namespace qv::platform
