#pragma once

#include <chrono>
#include <functional>
#include <list>
#include <memory>
#include <mutex>
#include <optional>
#include <utility>

#include "platform/threads/Timer.h"

namespace qv::fakes {

/// Timers that are due when the test says so. Their work runs in the test's thread.
///
/// Threading: thread-safe. Must outlive its handles.
class ManualTimers final : public platform::TimerService {
 public:
  std::unique_ptr<platform::TimerHandle> after(std::chrono::nanoseconds delay, std::function<void()> work) override {
    return add(delay, std::nullopt, std::move(work));
  }
  std::unique_ptr<platform::TimerHandle> every(std::chrono::nanoseconds period, std::function<void()> work) override {
    return add(period, period, std::move(work));
  }

  /// How long until the earliest timer; nothing when there is none.
  [[nodiscard]] std::optional<std::chrono::nanoseconds> untilNext() const {
    std::lock_guard lock(mutex_);
    std::optional<std::chrono::nanoseconds> next;
    for (const auto& entry : entries_) {
      if (!next || entry->due - now_ < *next) next = entry->due - now_;
    }
    return next;
  }
  /// How many are waiting.
  [[nodiscard]] size_t pending() const {
    std::lock_guard lock(mutex_);
    return entries_.size();
  }
  /// Runs what is due within `time`, each at its time, and lets the rest of the time pass.
  void advance(std::chrono::nanoseconds time) {
    const auto end = now_ + time;
    while (const auto work = takeDue(end)) (*work)();
    std::lock_guard lock(mutex_);
    now_ = end;
  }

 private:
  struct Entry {
    std::chrono::nanoseconds due;
    std::optional<std::chrono::nanoseconds> period;
    std::function<void()> work;
  };
  using Entries = std::list<std::shared_ptr<Entry>>;
  struct Handle final : platform::TimerHandle {
    Handle(ManualTimers& owner, std::shared_ptr<Entry> held) : timers(owner), entry(std::move(held)) {}
    ~Handle() override {
      std::lock_guard lock(timers.mutex_);
      timers.entries_.remove(entry);
    }
    ManualTimers& timers;
    std::shared_ptr<Entry> entry;
  };

  std::unique_ptr<platform::TimerHandle> add(std::chrono::nanoseconds delay,
                                             std::optional<std::chrono::nanoseconds> period,
                                             std::function<void()> work) {
    std::lock_guard lock(mutex_);
    auto entry = std::make_shared<Entry>(Entry{now_ + delay, period, std::move(work)});
    entries_.push_back(entry);
    return std::make_unique<Handle>(*this, std::move(entry));
  }
  std::optional<std::function<void()>> takeDue(std::chrono::nanoseconds end) {
    std::lock_guard lock(mutex_);
    std::shared_ptr<Entry> first;
    for (const auto& entry : entries_) {
      if (entry->due <= end && (!first || entry->due < first->due)) first = entry;
    }
    if (!first) return std::nullopt;
    now_ = std::max(now_, first->due);
    if (first->period) {
      first->due += *first->period;
    } else {
      entries_.remove(first);
    }
    return first->work;
  }

  mutable std::mutex mutex_;
  std::chrono::nanoseconds now_{0};
  Entries entries_;
};

}  // namespace qv::fakes
