#include <gtest/gtest.h>

#include <condition_variable>
#include <mutex>
#include <thread>
#include <vector>

#include "platform/headless/HeadlessPlatform.h"
#include "platform/headless/TestSignal.h"
#include "platform/threads/Clock.h"

namespace qv::platform {
namespace {

struct Frame {
  std::optional<uint32_t> number;
  bool isFlash;
  uint64_t hostTime;
};

/// Reads each frame, optionally keeps it, and does in the callback what a test asks for.
class FrameRecorder final : public ScreenCaptureControllerDelegate {
 public:
  void screenCaptureControllerDidReceiveSampleBuffer(ScreenCaptureController&, const SampleBufferRef& sample,
                                                     uint64_t) override {
    const auto& frame = *sample->image()->sharedFrame();
    const auto& layout = frame.layout();
    const testsignal::Picture picture{frame.bytes(), layout.width, layout.height, layout.stride};
    std::unique_lock lock(mutex_);
    frames_.push_back({testsignal::decodeFrameNumber(picture), testsignal::decodeFlash(picture),
                       static_cast<uint64_t>(sample->presentationTime().value)});
    if (keepsSamples) kept_.push_back(sample);
    lock.unlock();
    if (onFrame) onFrame();
    changed_.notify_all();
  }
  void screenCaptureControllerDidFailWithStatus(ScreenCaptureController&, int32_t) override { ADD_FAILURE(); }
  void screenCaptureControllerWasPreempted(ScreenCaptureController&) override { ADD_FAILURE(); }
  void screenCaptureControllerMediaServicesWereReset(ScreenCaptureController&) override { ADD_FAILURE(); }

  std::vector<Frame> waitForFrames(size_t count) {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [&] { return frames_.size() >= count; });
    return frames_;
  }
  size_t count() {
    std::lock_guard lock(mutex_);
    return frames_.size();
  }
  void release() {
    std::lock_guard lock(mutex_);
    kept_.clear();
  }

  bool keepsSamples = false;
  std::function<void()> onFrame;

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  std::vector<Frame> frames_;
  std::vector<SampleBufferRef> kept_;
};

class HeadlessScreenTest : public testing::Test {
 protected:
  std::unique_ptr<ScreenCaptureController> mirror(MediaTime interval) {
    platform_.screenCapture().displayClone().setMirroringMode(DisplayCloneMode::MirrorScreen);
    auto controller = platform_.screenCapture().createController({320, 180}, interval);
    controller->setDelegate(recorder_);
    return controller;
  }
  HeadlessPlatform platform_{{}};
  std::shared_ptr<FrameRecorder> recorder_ = std::make_shared<FrameRecorder>();
};

TEST_F(HeadlessScreenTest, FramesAreNumberedOnTheGridAndFlashWithTheSecond) {
  const auto controller = mirror(MediaTime::make(1, 60));
  const MediaTime begin = systemClock().hostTime();
  controller->startCapture();
  recorder_->waitForFrames(40);
  controller->stopCapture();
  const size_t stopped = recorder_->count();
  controller->startCapture();
  const auto frames = recorder_->waitForFrames(stopped + 40);
  controller->stopCapture();
  EXPECT_GE(frames[0].hostTime, static_cast<uint64_t>(begin.value));
  for (size_t i = 0; i < frames.size(); ++i) {
    EXPECT_EQ(frames[i].number, i) << "numbers go on after the second start";
    EXPECT_EQ(frames[i].isFlash, testsignal::isFlashTime(frames[i].hostTime));
    if (i == 0 || i == stopped) continue;
    EXPECT_GE(frames[i].hostTime - frames[i - 1].hostTime, 16'666'665u);
    EXPECT_LT(frames[i].hostTime * 60 % 1'000'000'000, 60u) << "on a multiple of 1/60 s";
  }
}

TEST_F(HeadlessScreenTest, SkipsTicksWhileAllFramesAreHeld) {
  recorder_->keepsSamples = true;
  const auto controller = mirror(MediaTime::make(1, 200));
  controller->startCapture();
  recorder_->waitForFrames(8);
  recorder_->release();
  const auto frames = recorder_->waitForFrames(12);
  controller->stopCapture();
  for (size_t i = 0; i < frames.size(); ++i) EXPECT_EQ(frames[i].number, i) << "only delivered frames count";
}

TEST_F(HeadlessScreenTest, StopFromACallbackEndsTheFrames) {
  const auto controller = mirror(MediaTime::make(1, 500));
  recorder_->onFrame = [&] {
    if (recorder_->count() == 3) controller->stopCapture();
  };
  controller->startCapture();
  recorder_->waitForFrames(3);
  controller->stopCapture();
  EXPECT_EQ(recorder_->count(), 3u);
}

TEST_F(HeadlessScreenTest, StopAndLosingTheDelegateWaitForACallback) {
  const auto controller = mirror(MediaTime::make(1, 500));
  std::atomic<bool> inside = false;
  recorder_->onFrame = [&] {
    inside = true;
    for (int i = 0; i < 1000; ++i) std::this_thread::yield();
    inside = false;
  };
  for (int round = 1; round <= 20; ++round) {
    const size_t before = recorder_->count();
    controller->setDelegate(recorder_);
    controller->startCapture();
    recorder_->waitForFrames(before + 2);
    if (round % 2 == 0) {
      controller->stopCapture();
    } else {
      controller->setDelegate({});
    }
    ASSERT_FALSE(inside);
    const size_t after = recorder_->count();
    controller->stopCapture();
    EXPECT_EQ(recorder_->count(), after);
  }
}

TEST_F(HeadlessScreenTest, ShowsContextsAndIsBlackWithoutAny) {
  auto& clone = platform_.screenCapture().displayClone();
  const auto capture = [&] {
    auto recorder = std::make_shared<FrameRecorder>();
    const auto controller = platform_.screenCapture().createController({320.9, 180.2}, MediaTime::make(1, 30));
    controller->setDelegate(recorder);
    controller->startCapture();
    const auto frames = recorder->waitForFrames(1);
    controller->stopCapture();
    return frames[0].number.has_value();
  };
  EXPECT_FALSE(capture());
  clone.setMirroringMode(DisplayCloneMode::CloneContexts);
  EXPECT_FALSE(capture());
  clone.setCloneContexts({17});
  EXPECT_TRUE(capture());
}

}  // namespace
}  // namespace qv::platform
