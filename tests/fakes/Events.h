#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <condition_variable>
#include <deque>
#include <mutex>
#include <utility>

namespace qv::platform::test {

/// How long a test waits before it says that something never came; far beyond any slow machine.
inline constexpr std::chrono::seconds kNever{60};

/// Events in the order in which they came, from any thread.
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
    if (!changed_.wait_for(lock, kNever, [this] { return !events_.empty(); })) {
      ADD_FAILURE() << "no event came";
      return Event();
    }
    Event event = std::move(events_.front());
    events_.pop_front();
    return event;
  }
  bool isEmpty() const {
    std::lock_guard lock(mutex_);
    return events_.empty();
  }
  size_t count() const {
    std::lock_guard lock(mutex_);
    return events_.size();
  }

 private:
  mutable std::mutex mutex_;
  std::condition_variable changed_;
  std::deque<Event> events_;
};

}  // namespace qv::platform::test
