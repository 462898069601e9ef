#pragma once

#include <gtest/gtest.h>

#include <deque>
#include <functional>
#include <mutex>
#include <utility>

#include "platform/threads/Executor.h"

namespace qv::fakes {

/// Keeps work until the test runs it. Queues that stand on it run in the test's own thread, so
/// nothing in a test has to wait. Work that is left over at the end fails the test.
///
/// Threading: `post` is thread-safe; the rest is for the test's thread.
class ManualExecutor final : public platform::Executor {
 public:
  ~ManualExecutor() override { EXPECT_EQ(pending(), 0u) << "work was left over"; }

  void post(std::function<void()> work) override {
    std::lock_guard lock(mutex_);
    work_.push_back(std::move(work));
  }
  /// Runs the oldest piece; false when there is none.
  bool runOne() {
    std::function<void()> work;
    {
      std::lock_guard lock(mutex_);
      if (work_.empty()) return false;
      work = std::move(work_.front());
      work_.pop_front();
    }
    work();
    return true;
  }
  /// Runs everything, what it brings about included.
  void runUntilIdle() {
    while (runOne()) {
    }
  }
  [[nodiscard]] size_t pending() const {
    std::lock_guard lock(mutex_);
    return work_.size();
  }

 private:
  mutable std::mutex mutex_;
  std::deque<std::function<void()>> work_;
};

}  // namespace qv::fakes
