#pragma once

#include <condition_variable>
#include <mutex>

#include "platform/threads/PacedClock.h"

namespace qv::kit {

/// A clock for one paced thread at a time, that stands still until the test moves it.
///
/// Threading: thread-safe; the test moves it, and ends the thread, on one thread.
class FakePacedClock final : public platform::PacedClock {
 public:
  [[nodiscard]] TimePoint now() const override {
    std::lock_guard lock(mutex_);
    return now_;
  }
  [[nodiscard]] uint64_t hostTime() const { return static_cast<uint64_t>(now().time_since_epoch().count()); }
  /// Moves it, and does not wait for what is due.
  void pass(std::chrono::nanoseconds time) {
    std::unique_lock lock(mutex_);
    now_ += time;
    if (waiting_ == nullptr) return;
    std::mutex& threads = *threads_;
    std::condition_variable& waiting = *waiting_;
    lock.unlock();
    std::lock_guard held(threads);
    waiting.notify_all();
  }
  /// Returns when the thread has done what is due at a moment, and waits for a later one.
  void settle() {
    std::unique_lock lock(mutex_);
    settled_.wait(lock, [this] { return waiting_ != nullptr && until_ > now_; });
  }
  /// Moves it step by step, and the thread follows.
  void advance(std::chrono::nanoseconds step, int count = 1) {
    for (settle(); count > 0; --count) {
      pass(step);
      settle();
    }
  }

  void waitUntil(TimePoint moment, std::unique_lock<std::mutex>& lock, std::condition_variable& changed,
                 const std::function<bool()>& isOver) override {
    setWaiter(moment, lock.mutex(), &changed);
    changed.wait(lock, [&] { return isOver() || now() >= moment; });
    setWaiter({}, nullptr, nullptr);
  }

 private:
  void setWaiter(TimePoint until, std::mutex* threads, std::condition_variable* waiting) {
    std::lock_guard lock(mutex_);
    until_ = until;
    threads_ = threads;
    waiting_ = waiting;
    settled_.notify_all();
  }

  mutable std::mutex mutex_;
  std::condition_variable settled_;
  TimePoint now_{std::chrono::hours(10)};
  TimePoint until_;
  std::mutex* threads_ = nullptr;
  std::condition_variable* waiting_ = nullptr;  ///< of the thread that waits
};

}  // namespace qv::kit
