#pragma once

#include <chrono>
#include <functional>
#include <memory>

namespace qv::platform {

/// A scheduled call; destroying it cancels the call. A call that is already running is not
/// waited for.
class TimerHandle {
 public:
  virtual ~TimerHandle() = default;
};

/// Calls back after a time. One sleeping thread serves all timers and wakes only when one is due.
///
/// Threading: thread-safe; `work` runs on the timer thread and must hand anything long to a queue.
class TimerService {
 public:
  virtual ~TimerService() = default;
  [[nodiscard]] virtual std::unique_ptr<TimerHandle> after(std::chrono::nanoseconds delay,
                                                           std::function<void()> work) = 0;
  [[nodiscard]] virtual std::unique_ptr<TimerHandle> every(std::chrono::nanoseconds period,
                                                           std::function<void()> work) = 0;
};

TimerService& systemTimers();

}  // namespace qv::platform
