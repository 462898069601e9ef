#pragma once

#include <chrono>
#include <cmath>
#include <cstdint>
#include <mutex>

#include "platform/threads/Clock.h"

namespace qv::fakes {

/// Two clocks that stand still until the test moves them.
///
/// Threading: thread-safe.
class FakeClock final : public platform::Clock {
 public:
  /// 2026-01-01 12:00:00 UTC.
  static constexpr double kStart = 1767268800.0;

  [[nodiscard]] platform::Date now() const override {
    std::lock_guard lock(mutex_);
    return {now_};
  }
  [[nodiscard]] platform::MediaTime hostTime() const override {
    std::lock_guard lock(mutex_);
    return platform::MediaTime::make(hostNanoseconds_, platform::kHostTimescale);
  }

  /// Moves both clocks.
  void advance(std::chrono::nanoseconds time) {
    std::lock_guard lock(mutex_);
    now_ += static_cast<double>(time.count()) * 1e-9;
    hostNanoseconds_ += time.count();
  }
  void advanceSeconds(double seconds) {
    advance(std::chrono::nanoseconds(static_cast<int64_t>(std::llround(seconds * 1e9))));
  }
  /// Lets the wall clock jump; the host clock does not notice.
  void setNow(platform::Date date) {
    std::lock_guard lock(mutex_);
    now_ = date.secondsSince1970;
  }
  void setHostTime(platform::MediaTime time) {
    std::lock_guard lock(mutex_);
    hostNanoseconds_ = time.valueAt(platform::kHostTimescale);
  }

 private:
  mutable std::mutex mutex_;
  double now_ = kStart;
  int64_t hostNanoseconds_ = 1'000'000'000'000;
};

}  // namespace qv::fakes
