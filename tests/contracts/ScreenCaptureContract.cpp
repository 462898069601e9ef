#include <algorithm>
#include <cmath>
#include <future>
#include <thread>

#include "platform/headless/HeadlessPlatform.h"
#include "platform/x11/X11Platform.h"
#include "tests/contracts/Backends.h"
#include "tests/kit/FrameRecorder.h"
#include "tests/kit/XServer.h"

namespace qv::contracts {
namespace {

using namespace platform;

/// A screen with one window that is not black.
struct ScreenStage {
  virtual ~ScreenStage() = default;
  virtual ScreenCaptureService& screen() = 0;
  virtual uint32_t window() = 0;
  /// Lets the window look otherwise.
  virtual void change(uint32_t number) = 0;
};

class HeadlessStage final : public ScreenStage {
  ScreenCaptureService& screen() override { return platform_.screenCapture(); }
  uint32_t window() override { return 17; }
  void change(uint32_t) override {}
  HeadlessPlatform platform_{{}};
};

class X11Stage final : public ScreenStage {
  ScreenCaptureService& screen() override { return platform_->screenCapture(); }
  uint32_t window() override { return window_; }
  void change(uint32_t number) override { client_.fill(window_, 0xFF00FF - number); }
  kit::XServer server_;
  kit::XClient client_{server_.display()};
  const xcb_window_t window_ = client_.show({.color = 0xFF00FF});
  const std::unique_ptr<X11Platform> platform_ = std::move(X11Platform::connect(server_.display(), {}).value());
};

bool isBlack(const PixelBuffer& image) {
  const auto bytes = image.sharedFrame()->bytes();
  for (size_t i = 0; i < bytes.size(); ++i)
    if (i % 4 != 3 && bytes[i] != 0) return false;
  return true;
}

class ScreenCaptureContract : public ContractTest<ScreenStage> {
 protected:
  void start(Size size = {320, 180}) {
    controller_ = stage_->screen().createController(size, MediaTime::make(1, 200));
    controller_->setDelegate(recorder_);
    controller_->startCapture();
  }
  void show(DisplayCloneMode mode, std::set<uint32_t> windows = {}) {
    stage_->screen().displayClone().setMirroringMode(mode);
    stage_->screen().displayClone().setCloneContexts(std::move(windows));
  }
  std::shared_ptr<kit::FrameRecorder> recorder_ = std::make_shared<kit::FrameRecorder>();
  std::unique_ptr<ScreenCaptureController> controller_;
};
INSTANTIATE_TEST_SUITE_P(, ScreenCaptureContract,
                         testing::Values(Backend<ScreenStage>{"headless", make<ScreenStage, HeadlessStage>},
                                         Backend<ScreenStage>{"x11", make<ScreenStage, X11Stage>, {"Xvfb"}}),
                         kNameOfBackend);

TEST_P(ScreenCaptureContract, ShowsWhatIsClonedAndBlackWhereNothingIs) {
  struct Case {
    DisplayCloneMode mode;
    std::set<uint32_t> windows;
    bool isBlack;
  };
  for (const auto& [mode, windows, black] : {Case{DisplayCloneMode::Off, {}, true},
                                             {DisplayCloneMode::CloneContexts, {}, true},
                                             {DisplayCloneMode::CloneContexts, {stage_->window()}, false},
                                             {DisplayCloneMode::MirrorScreen, {}, false}}) {
    recorder_ = std::make_shared<kit::FrameRecorder>();
    show(mode, windows);
    start();
    const bool wanted = black;
    EXPECT_TRUE(recorder_->waitForPicture([&](const auto& image) { return isBlack(image) == wanted; }))
        << static_cast<int>(mode) << " " << windows.size();
  }
}

TEST_P(ScreenCaptureContract, FramesHaveTheSizeAskedForAndComeAgainAtTimesThatRise) {
  show(DisplayCloneMode::MirrorScreen);
  struct Case {
    Size asked;
    uint32_t width, height;
  };
  for (const Case& c : {Case{{320.9, 180.2}, 320, 180}, {{std::nan(""), -5}, 1, 1}}) {
    recorder_ = std::make_shared<kit::FrameRecorder>();
    const MediaTime begin = systemClock().hostTime();
    start(c.asked);
    ASSERT_TRUE(recorder_->waitForFrames(4)) << "nothing changes";
    controller_->stopCapture();
    EXPECT_EQ(recorder_->last()->image()->width(), c.width);
    EXPECT_EQ(recorder_->last()->image()->height(), c.height);
    EXPECT_GE(recorder_->last()->presentationTime(), begin);
    EXPECT_LE(recorder_->last()->presentationTime(), systemClock().hostTime());
  }
}

TEST_P(ScreenCaptureContract, NothingComesAfterAStopOrTheLossOfTheDelegate) {
  show(DisplayCloneMode::MirrorScreen);
  start();
  std::atomic<bool> isInside = false;
  recorder_->setHook([&] {
    isInside = true;
    for (int i = 0; i < 1000; ++i) std::this_thread::yield();
    isInside = false;
  });
  for (uint32_t round = 0; round < 20; ++round) {
    ASSERT_TRUE(recorder_->waitForMoreFrames());
    stage_->change(2 * round);
    round % 2 == 0 ? controller_->stopCapture() : controller_->setDelegate({});
    ASSERT_FALSE(isInside);
    const int after = recorder_->frames();
    stage_->change(2 * round + 1);
    controller_->stopCapture();
    ASSERT_EQ(recorder_->frames(), after);
    controller_->setDelegate(recorder_);
    controller_->startCapture();
  }
  controller_->stopCapture();
}

TEST_P(ScreenCaptureContract, ACallbackMayStopAndStartAndDestroy) {
  show(DisplayCloneMode::CloneContexts, {stage_->window()});
  std::promise<void> destroyed;
  recorder_->setHook([&] {
    controller_->stopCapture();
    controller_->startCapture();
    recorder_->setHook([&] {
      recorder_->setHook({});
      controller_.reset();
      destroyed.set_value();
    });
  });
  start();
  ASSERT_EQ(destroyed.get_future().wait_for(kit::kNever), std::future_status::ready);
}

}  // namespace
}  // namespace qv::contracts
