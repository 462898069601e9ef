#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <condition_variable>
#include <deque>
#include <mutex>
#include <utility>
#include <vector>

namespace qv::kit {

/// How long a test waits before it says that something never came; far beyond any slow machine.
inline constexpr std::chrono::seconds kNever{60};

/// Events of any thread, in their order, for a test that waits for them.
///
/// Threading: thread-safe.
template <typename Event>
class Events {
 public:
  void add(Event event) {
    std::lock_guard lock(mutex_);
    events_.push_back(std::move(event));
    changed_.notify_all();
  }
  /// Takes the next one; a failure and an empty one when none comes.
  Event next() {
    std::unique_lock lock(mutex_);
    if (!await(lock, [this] { return !events_.empty(); })) return Event();
    Event event = std::move(events_.front());
    events_.pop_front();
    return event;
  }
  /// Takes events up to one for which `isWanted` holds, and returns that.
  template <typename Wanted>
  Event nextWhere(const Wanted& isWanted) {
    while (true) {
      Event event = next();
      if (isWanted(event) || testing::Test::HasFailure()) return event;
    }
  }
  [[nodiscard]] bool isEmpty() const { return count() == 0; }
  [[nodiscard]] size_t count() const {
    std::lock_guard lock(mutex_);
    return events_.size();
  }
  void clear() {
    std::lock_guard lock(mutex_);
    events_.clear();
  }

 private:
  template <typename Condition>
  bool await(std::unique_lock<std::mutex>& lock, const Condition& condition) {
    const bool came = changed_.wait_for(lock, kNever, condition);
    EXPECT_TRUE(came) << "no event came";
    return came;
  }

  mutable std::mutex mutex_;
  std::condition_variable changed_;
  std::deque<Event> events_;
};

}  // namespace qv::kit
