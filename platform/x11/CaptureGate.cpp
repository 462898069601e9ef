#include "platform/x11/CaptureGate.h"

namespace qv::platform {

void CaptureGate::setDelegate(std::weak_ptr<ScreenCaptureControllerDelegate> delegate) {
  std::unique_lock lock(mutex_);
  delegate_ = std::move(delegate);
  if (delegate_.expired()) waitUntilIdle(lock);
}

uint64_t CaptureGate::open() {
  std::lock_guard lock(mutex_);
  return run_ = ++lastRun_;
}

void CaptureGate::close() {
  std::unique_lock lock(mutex_);
  run_ = 0;
  idle_.notify_all();
  waitUntilIdle(lock);
}

void CaptureGate::waitUntilIdle(std::unique_lock<std::mutex>& lock) {
  idle_.wait(lock, [&] { return caller_ == std::thread::id() || caller_ == std::this_thread::get_id(); });
}

}  // namespace qv::platform
