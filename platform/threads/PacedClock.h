#pragma once

#include <chrono>
#include <condition_variable>
#include <functional>
#include <mutex>

namespace qv::platform {

/// The time by which paced threads go: it can be read, and waited for.
///
/// Threading: thread-safe.
class PacedClock {
 public:
  /// On CLOCK_MONOTONIC.
  using TimePoint = std::chrono::steady_clock::time_point;

  virtual ~PacedClock() = default;
  [[nodiscard]] virtual TimePoint now() const = 0;
  /// Returns at `moment`, or once `isOver` holds. That is asked under `lock`, which is held at the call and at the
  /// return, and again whenever `changed` is notified.
  virtual void waitUntil(TimePoint moment, std::unique_lock<std::mutex>& lock, std::condition_variable& changed,
                         const std::function<bool()>& isOver) = 0;
};

/// The machine's own.
PacedClock& monotonicClock();

}  // namespace qv::platform
