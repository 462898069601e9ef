#pragma once

#include <chrono>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <utility>

#include "platform/Timer.h"

namespace qv::fakes {

/// Timers that are due when the test says how much time has passed. Work runs in the test's thread.
///
/// Threading: thread-safe; `advance` is for the test's thread.
class FakeTimers final : public platform::TimerService {
 public:
  using Duration = std::chrono::nanoseconds;

  std::unique_ptr<platform::TimerHandle> after(Duration delay, std::function<void()> work) override {
    return add(delay, Duration(0), std::move(work));
  }
  std::unique_ptr<platform::TimerHandle> every(Duration period, std::function<void()> work) override {
    return add(period, period, std::move(work));
  }

  /// Runs what becomes due, in order.
  void advance(Duration time) {
    std::unique_lock lock(state_->mutex);
    const Duration end = state_->now + time;
    while (!state_->due.empty() && state_->due.begin()->first <= end) {
      auto entry = state_->due.extract(state_->due.begin());
      state_->now = entry.key();
      const Entry current = entry.mapped();
      if (current.period.count() > 0) {
        entry.key() += current.period;
        state_->due.insert(std::move(entry));
      }
      lock.unlock();
      (*current.work)();
      lock.lock();
    }
    state_->now = end;
  }
  /// How many are waiting.
  [[nodiscard]] size_t pending() const {
    std::lock_guard lock(state_->mutex);
    return state_->due.size();
  }

 private:
  struct Entry {
    std::shared_ptr<const std::function<void()>> work;
    Duration period;
  };
  struct State {
    std::mutex mutex;
    Duration now{0};
    std::multimap<Duration, Entry> due;
  };
  class Handle final : public platform::TimerHandle {
   public:
    Handle(std::shared_ptr<State> state, std::shared_ptr<const std::function<void()>> work)
        : state_(std::move(state)), work_(std::move(work)) {}
    ~Handle() override {
      std::lock_guard lock(state_->mutex);
      std::erase_if(state_->due, [&](const auto& item) { return item.second.work == work_; });
    }

   private:
    const std::shared_ptr<State> state_;
    const std::shared_ptr<const std::function<void()>> work_;
  };

  std::unique_ptr<platform::TimerHandle> add(Duration delay, Duration period, std::function<void()> work) {
    const auto shared = std::make_shared<const std::function<void()>>(std::move(work));
    std::lock_guard lock(state_->mutex);
    state_->due.emplace(state_->now + delay, Entry{shared, period});
    return std::make_unique<Handle>(state_, shared);
  }

  const std::shared_ptr<State> state_ = std::make_shared<State>();
};

}  // namespace qv::fakes
