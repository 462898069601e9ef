#include "platform/threads/PacedClock.h"

namespace qv::platform {
namespace {

/// Threading: thread-safe.
class MonotonicClock final : public PacedClock {
 public:
  TimePoint now() const override { return std::chrono::steady_clock::now(); }
  void waitUntil(TimePoint moment, std::unique_lock<std::mutex>& lock, std::condition_variable& changed,
                 const std::function<bool()>& isOver) override {
    changed.wait_until(lock, moment, isOver);
  }
};

}  // namespace

PacedClock& monotonicClock() {
  static MonotonicClock clock;
  return clock;
}

}  // namespace qv::platform
