#pragma once

#include <gtest/gtest.h>

#include <condition_variable>
#include <functional>
#include <mutex>

#include "platform/ScreenCapture.h"
#include "tests/kit/Events.h"

namespace qv::kit {

/// 0xRRGGBB of a pixel.
inline uint32_t colorIn(const platform::PixelBuffer& image, size_t x, size_t y) {
  const uint8_t* pixel = image.sharedFrame()->bytes().data() + y * image.sharedFrame()->layout().stride + 4 * x;
  return static_cast<uint32_t>(pixel[0] | pixel[1] << 8 | pixel[2] << 16);
}

/// Keeps the last picture and counts; a waiter is told of each.
///
/// Threading: thread-safe.
class FrameRecorder : public platform::ScreenCaptureControllerDelegate {
 public:
  /// Called with each frame, in the capture thread.
  void setHook(std::function<void()> hook) {
    std::lock_guard lock(mutex_);
    hook_ = std::move(hook);
  }
  /// Waits for a picture that satisfies `wanted`.
  bool waitForPicture(const std::function<bool(const platform::PixelBuffer&)>& wanted) {
    return wait([&] { return last_ && wanted(*last_->image()); });
  }
  bool waitForFrames(int count) {
    return wait([&] { return frames_ >= count; });
  }
  bool waitForMoreFrames(int count = 1) { return waitForFrames(frames() + count); }
  bool waitForReset(int count = 1) {
    return wait([&] { return resets_ >= count; });
  }
  int frames() { return read(frames_); }
  int failures() { return read(failures_); }
  int resets() { return read(resets_); }
  platform::SampleBufferRef last() { return read(last_); }

 private:
  void screenCaptureControllerDidReceiveSampleBuffer(platform::ScreenCaptureController&,
                                                     const platform::SampleBufferRef& sample, uint64_t flags) override {
    std::unique_lock lock(mutex_);
    EXPECT_EQ(flags, 0u);
    if (last_) {
      EXPECT_GT(sample->presentationTime(), last_->presentationTime());
    }
    last_ = sample;
    ++frames_;
    changed_.notify_all();
    const auto hook = hook_;
    lock.unlock();
    if (hook) hook();
  }
  void screenCaptureControllerDidFailWithStatus(platform::ScreenCaptureController&, int32_t) override {
    count(failures_);
  }
  void screenCaptureControllerWasPreempted(platform::ScreenCaptureController&) override { count(failures_); }
  void screenCaptureControllerMediaServicesWereReset(platform::ScreenCaptureController&) override { count(resets_); }

  template <typename T>
  T read(const T& member) {
    std::lock_guard lock(mutex_);
    return member;
  }
  void count(int& counter) {
    std::lock_guard lock(mutex_);
    ++counter;
    changed_.notify_all();
  }
  bool wait(const std::function<bool()>& condition) {
    std::unique_lock lock(mutex_);
    return changed_.wait_for(lock, kNever, condition);
  }

  std::mutex mutex_;
  std::condition_variable changed_;
  platform::SampleBufferRef last_;
  int frames_ = 0, failures_ = 0, resets_ = 0;
  std::function<void()> hook_;
};

}  // namespace qv::kit
