#pragma once

#include <functional>
#include <memory>
#include <thread>

#include "platform/threads/PacedClock.h"

namespace qv::platform {

/// A thread that runs a function again and again, each time at the moment that the function named.
///
/// Moments are those of a clock, so a run that took long does not delay the later ones. After the
/// stop `finish` runs once, on the thread, and both functions are let go.
///
/// Threading: thread-safe. `stop` and the destructor return when the thread has run its last
/// function, unless they are called on the thread itself: then that happens once the function in
/// progress has returned, so functions hold what they use by shared ownership.
class PacedThread {
 public:
  using TimePoint = PacedClock::TimePoint;

  /// `step` runs at once, and then whenever it asked for; `finish` may be empty. `clock` must outlive the thread.
  PacedThread(std::function<TimePoint()> step, std::function<void()> finish, PacedClock& clock = monotonicClock());
  ~PacedThread();
  PacedThread(const PacedThread&) = delete;
  PacedThread& operator=(const PacedThread&) = delete;

  void stop();
  [[nodiscard]] bool isCurrent() const { return thread_.get_id() == std::this_thread::get_id(); }

 private:
  struct State;
  std::shared_ptr<State> state_;
  std::thread thread_;
};

}  // namespace qv::platform
