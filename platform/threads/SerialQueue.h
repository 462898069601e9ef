#pragma once

#include <condition_variable>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <utility>

#include "platform/threads/Executor.h"

namespace qv::platform {

/// Runs work items one at a time, in the order in which they were queued.
///
/// A queue either stands on an executor of its own choice, or targets another serial queue: then
/// its items run as items of the target, in one common order, and `isOnQueue` holds for both.
/// Items that are queued when the queue object is destroyed still run (the queue's state is
/// shared with them); use the weak form of `async` for work that must not outlive its owner.
///
/// Threading: thread-safe.
class SerialQueue {
 public:
  explicit SerialQueue(std::string label, Executor& executor = globalQueue());
  SerialQueue(std::string label, SerialQueue& target);
  SerialQueue(const SerialQueue&) = delete;
  SerialQueue& operator=(const SerialQueue&) = delete;

  [[nodiscard]] const std::string& label() const;
  /// Queues `work` and returns.
  void async(std::function<void()> work);
  /// Queues work that is dropped, without running, when `owner` is gone by then; while it runs,
  /// the owner is kept alive and handed to it.
  template <typename T, typename Work>
  void async(std::weak_ptr<T> owner, Work work) {
    async([owner = std::move(owner), work = std::move(work)]() mutable {
      if (auto strong = owner.lock()) work(*strong);
    });
  }
  /// Runs `work` after everything queued before it and waits for it; it runs in the calling
  /// thread when the queue is idle. Aborts when called on the queue itself: that would wait for ever.
  void sync(const std::function<void()>& work);
  template <typename T>
  T syncResult(const std::function<T()>& work) {
    T result{};
    sync([&] { result = work(); });
    return result;
  }

  /// Whether the calling thread is running an item of this queue, or of one that targets it.
  [[nodiscard]] bool isOnQueue() const;
  /// Aborts unless `isOnQueue`.
  void assertOnQueue() const;

 private:
  struct State;
  std::shared_ptr<State> state_;
};

}  // namespace qv::platform
