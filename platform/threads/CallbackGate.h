#pragma once

#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <thread>
#include <utility>

namespace qv::platform {

/// The one way to somebody who may go: calls go through it one at a time, none begins once it is closed, and whoever
/// closes it knows that none is running any more.
///
/// It is open from the beginning. `open` begins another time, in which the calls of those before are refused, so that a
/// thread that winds down cannot meet its successor's. A call may make another one through the same gate.
///
/// Threading: thread-safe. `close` and `awaitIdle` return when no call is in progress, except in the thread of that
/// call.
class CallbackGate {
 public:
  using Time = uint64_t;

  /// Answers the time that begins.
  Time open();
  void close() { close(kAnyTime); }
  /// Ends that time; one that has begun since goes on.
  void close(Time time);
  /// Waits for a call in progress; the next may begin at once. Whoever has taken away what calls use is sure after it.
  void awaitIdle();
  /// `call()`, after the one that another thread is in. False when that time was over before, or is over after it.
  template <typename Call>
  bool enter(Time time, const Call& call) {
    if (!begin(time)) return false;
    call();
    return leave(time);
  }
  /// The same whatever time it is.
  template <typename Call>
  bool enter(const Call& call) {
    return enter(kAnyTime, call);
  }

 private:
  static constexpr Time kAnyTime = 0;
  bool begin(Time time);
  bool leave(Time time);
  [[nodiscard]] bool isOver(Time time) const { return !isOpen_ || (time != kAnyTime && time != lastTime_); }
  [[nodiscard]] bool isMine() const { return depth_ == 0 || caller_ == std::this_thread::get_id(); }

  std::mutex mutex_;
  std::condition_variable changed_;
  Time lastTime_ = kAnyTime;
  bool isOpen_ = true;
  std::thread::id caller_;  // of the calls in progress
  int depth_ = 0;           // how many they are, within each other
};

/// A gate to a delegate, who is held only while a call is in progress, and may be exchanged.
///
/// Threading: thread-safe. `setDelegate` with nothing returns when no call is in progress, except in the thread of that
/// call.
template <typename Delegate>
class DelegateGate {
 public:
  void setDelegate(std::weak_ptr<Delegate> delegate) {
    const bool isRemoved = delegate.expired();
    {
      std::lock_guard lock(mutex_);
      delegate_ = std::move(delegate);
    }
    if (isRemoved) gate_.awaitIdle();
  }
  CallbackGate::Time open() { return gate_.open(); }
  void close(CallbackGate::Time time) { gate_.close(time); }
  void awaitIdle() { gate_.awaitIdle(); }
  /// `call(delegate)`, unless there is none. False as with CallbackGate.
  template <typename Call>
  bool enter(CallbackGate::Time time, const Call& call) {
    return gate_.enter(time, [&] {
      if (const auto delegate = current()) call(*delegate);
    });
  }

 private:
  std::shared_ptr<Delegate> current() {
    std::lock_guard lock(mutex_);
    return delegate_.lock();
  }

  CallbackGate gate_;
  std::mutex mutex_;
  std::weak_ptr<Delegate> delegate_;
};

}  // namespace qv::platform
