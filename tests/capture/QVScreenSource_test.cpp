#include "capture/QVScreenSource.h"

#include "tests/fakes/FakeDevice.h"

namespace qv {
namespace {

using platform::DisplayCloneMode;
using platform::ScreenCaptureController;

constexpr platform::Size kSize{1280, 720};

ScreenRequest windows(std::set<uint32_t> contextIDs) { return {DisplayCloneMode::CloneContexts, contextIDs, kSize}; }

struct Viewer final : platform::ScreenCaptureControllerDelegate {
  void screenCaptureControllerDidReceiveSampleBuffer(ScreenCaptureController&, const platform::SampleBufferRef&,
                                                     uint64_t) override {
    ++frames;
  }
  void screenCaptureControllerDidFailWithStatus(ScreenCaptureController&, int32_t) override {}
  void screenCaptureControllerWasPreempted(ScreenCaptureController&) override {}
  void screenCaptureControllerMediaServicesWereReset(ScreenCaptureController&) override {}
  int frames = 0;
};

class ScreenSourceTest : public testing::Test {
 protected:
  void expectShown(const std::set<uint32_t>& contexts) {
    EXPECT_EQ(device_.screen.mode, DisplayCloneMode::CloneContexts);
    EXPECT_EQ(device_.screen.contexts, contexts);
  }
  fakes::FakeDevice device_;
  QVScreenSource source_{device_.screen};
  std::shared_ptr<Viewer> a_ = std::make_shared<Viewer>(), b_ = std::make_shared<Viewer>();
};

TEST_F(ScreenSourceTest, CapturesFromItsOneStartToItsEnd) {
  auto lease = source_.lease({DisplayCloneMode::MirrorScreen, {}, kSize, 30}, a_);
  EXPECT_EQ(device_.screen.mode, DisplayCloneMode::MirrorScreen);
  auto& controller = device_.screen.last();
  EXPECT_EQ(controller.interval, platform::MediaTime::make(1, 30));
  controller.sendAt(1);
  EXPECT_EQ(a_->frames, 0);
  lease->startCapture();
  controller.sendAt(2);
  EXPECT_EQ(a_->frames, 1);

  controller.stopCapture();  // as a failure does
  lease->startCapture();
  EXPECT_FALSE(controller.running);
  lease.reset();
  EXPECT_TRUE(controller.delegate.expired());
  EXPECT_EQ(device_.screen.mode, DisplayCloneMode::Off);
}

TEST_F(ScreenSourceTest, LeaseThatEndsAfterItsSuccessorBeganLeavesTheScreenToIt) {
  auto a = source_.lease(windows({1}), a_);
  a->startCapture();
  auto b = source_.lease(windows({2, 3}), b_);
  b->startCapture();
  a.reset();
  expectShown({2, 3});
  device_.screen.last().sendAt(1);
  EXPECT_EQ(b_->frames, 1);
  b.reset();
  EXPECT_EQ(device_.screen.mode, DisplayCloneMode::Off);
}

TEST_F(ScreenSourceTest, CaptureBeginsWithItsOwnWindowsWhateverWasShownSince) {
  auto a = source_.lease(windows({1}), a_);
  auto& ofA = device_.screen.last();
  auto b = source_.lease(windows({2}), b_);
  a->startCapture();
  expectShown({1});
  b->startCapture();
  expectShown({2});
  b.reset();
  EXPECT_EQ(device_.screen.mode, DisplayCloneMode::Off);
  EXPECT_TRUE(ofA.running);

  auto c = source_.lease(windows({3}), b_);
  source_.lease(windows({4}), b_).reset();
  EXPECT_EQ(device_.screen.mode, DisplayCloneMode::Off);
  c->startCapture();
  expectShown({3});
}

TEST_F(ScreenSourceTest, ControllerIsTakenAgainForTheSameSizeAndRate) {
  auto a = source_.lease(windows({1}), a_);
  auto* const first = &device_.screen.last();
  auto b = source_.lease(windows({2}), b_);
  EXPECT_NE(&device_.screen.last(), first) << "in use";
  b.reset();
  a.reset();
  EXPECT_EQ(device_.screen.controllers, std::vector{first}) << "one is kept";

  a = source_.lease(windows({1}), b_);
  EXPECT_EQ(device_.screen.livingAtCreation.size(), 2u);
  a->startCapture();
  first->sendAt(1);
  EXPECT_EQ(b_->frames, 1);
  EXPECT_EQ(a_->frames, 0);
  a.reset();
  auto request = windows({1});
  request.frameRate = 30;
  a = source_.lease(request, a_);
  ASSERT_EQ(device_.screen.controllers.size(), 1u);
  EXPECT_EQ(device_.screen.last().interval, platform::MediaTime::make(1, 30));
  EXPECT_EQ(device_.screen.livingAtCreation.back(), 0u) << "the former's memory goes first";
  a.reset();
  request.size.width = 640;
  a = source_.lease(request, a_);
  EXPECT_EQ(device_.screen.last().size, (platform::Size{640, 720}));
}

/// A recording whose callback is waited for may begin another one's capture meanwhile.
TEST_F(ScreenSourceTest, EndHoldsNoLockWhileItWaitsForTheCapture) {
  auto a = source_.lease(windows({1}), a_);
  auto& ofA = device_.screen.last();
  auto b = source_.lease(windows({2}), b_);
  bool met = false;
  ofA.atStop = [&] {
    b->startCapture();
    met = true;
  };
  a.reset();
  EXPECT_TRUE(met);
  expectShown({2});
}

}  // namespace
}  // namespace qv
