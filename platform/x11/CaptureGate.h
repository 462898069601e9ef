#pragma once

#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <thread>

#include "platform/ScreenCapture.h"

namespace qv::platform {

/// The one way from capture threads to a controller's delegate: one call at a time, and none of a
/// run that was closed.
///
/// Threading: thread-safe. `close` and `setDelegate` with nothing return when no call is in
/// progress, except when called from within one.
class CaptureGate {
 public:
  void setDelegate(std::weak_ptr<ScreenCaptureControllerDelegate> delegate);
  /// Begins a run; calls of earlier ones are refused from now on.
  uint64_t open();
  void close();
  /// `call(delegate)` unless there is none. False when `run` was closed, before or meanwhile.
  template <typename Call>
  bool enter(uint64_t run, const Call& call) {
    std::unique_lock lock(mutex_);
    idle_.wait(lock, [&] { return caller_ == std::thread::id() || run != run_; });
    if (run != run_) return false;
    auto delegate = delegate_.lock();
    if (!delegate) return true;
    caller_ = std::this_thread::get_id();
    lock.unlock();
    call(*delegate);
    delegate.reset();  // perhaps the last reference: still within the call, without the lock
    lock.lock();
    caller_ = std::thread::id();
    idle_.notify_all();
    return run == run_;
  }

 private:
  void waitUntilIdle(std::unique_lock<std::mutex>& lock);

  std::mutex mutex_;
  std::condition_variable idle_;
  std::weak_ptr<ScreenCaptureControllerDelegate> delegate_;
  uint64_t run_ = 0;
  uint64_t lastRun_ = 0;
  std::thread::id caller_;  // of the call in progress
};

}  // namespace qv::platform
