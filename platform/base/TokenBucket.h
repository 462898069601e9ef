#pragma once

#include <algorithm>
#include <chrono>

namespace qv::platform {

/// How often something may be done: `burst` times at once, `rate` times a second for long.
///
/// Threading: one thread.
class TokenBucket {
 public:
  using Time = std::chrono::steady_clock::time_point;
  TokenBucket(double rate, double burst, Time now) : rate_(rate), burst_(burst), tokens_(burst), filled_(now) {}

  [[nodiscard]] bool hasToken(Time now) {
    fill(now);
    return tokens_ >= 1;
  }
  /// Also where there is none: what is owed is waited for longer.
  void take(Time now) {
    fill(now);
    tokens_ -= 1;
  }
  [[nodiscard]] std::chrono::milliseconds untilToken(Time now) {
    fill(now);
    const std::chrono::duration<double> wait(std::max(0.0, 1 - tokens_) / rate_);
    return std::chrono::ceil<std::chrono::milliseconds>(wait);
  }
  [[nodiscard]] bool isFull(Time now) {
    fill(now);
    return tokens_ >= burst_;
  }

 private:
  void fill(Time now) {
    tokens_ = std::min(burst_, tokens_ + rate_ * std::chrono::duration<double>(now - filled_).count());
    filled_ = now;
  }

  const double rate_;
  const double burst_;
  double tokens_;
  Time filled_;
};

}  // namespace qv::platform
