#include <set>
#include <vector>

#include "platform/x11/X11Platform.h"
#include "tests/kit/FrameRecorder.h"
#include "tests/kit/XServer.h"

namespace qv::platform {
namespace {

using kit::colorIn;
using kit::XServer;

constexpr uint32_t kRed = 0xFF0000, kGreen = 0x00FF00, kBlue = 0x0000FF, kWhite = 0xFFFFFF, kBlack = 0;

/// Scaling may lose the lowest bits of a plain colour.
bool isNear(uint32_t a, uint32_t b) {
  for (const int shift : {0, 8, 16})
    if (std::abs(static_cast<int>((a >> shift) & 0xFF) - static_cast<int>((b >> shift) & 0xFF)) > 3) return false;
  return true;
}

class CaptureTest : public kit::XServerTest {
 protected:
  void SetUp() override {
    XServerTest::SetUp();
    if (IsSkipped()) return;
    app_ = std::make_unique<kit::XClient>(display());
    platform_ = std::move(X11Platform::connect(display(), {}).value());
  }
  void start(Size size, DisplayCloneMode mode, std::set<uint32_t> windows = {}) {
    auto& service = platform_->screenCapture();
    service.displayClone().setMirroringMode(mode);
    service.displayClone().setCloneContexts(std::move(windows));
    controller_ = service.createController(size, MediaTime::make(1, 60));
    controller_->setDelegate(recorder_);
    controller_->startCapture();
  }
  void clone(Size size, std::set<uint32_t> windows) { start(size, DisplayCloneMode::CloneContexts, windows); }
  /// Waits for a picture with this colour at a pixel.
  bool waitForColor(uint32_t color, size_t x, size_t y) {
    const bool isFound =
        recorder_->waitForPicture([&](const PixelBuffer& image) { return isNear(colorIn(image, x, y), color); });
    EXPECT_TRUE(isFound) << std::hex << "at last the colour was " << colorAt(x, y);
    return isFound;
  }
  uint32_t colorAt(size_t x, size_t y) { return colorIn(*recorder_->last()->image(), x, y); }

  std::unique_ptr<kit::XClient> app_;
  std::unique_ptr<X11Platform> platform_;
  std::shared_ptr<kit::FrameRecorder> recorder_ = std::make_shared<kit::FrameRecorder>();
  std::unique_ptr<ScreenCaptureController> controller_;
};

TEST_F(CaptureTest, ShowsACoveredWindowAsItIs) {
  const auto window = app_->show({.x = 50, .y = 40, .width = 100, .height = 80, .color = kRed, .border = 3});
  const auto child = app_->show({.x = 10, .y = 10, .width = 20, .height = 20, .color = kBlue, .parent = window});
  clone({100, 80}, {window});
  ASSERT_TRUE(waitForColor(kRed, 0, 0));
  app_->show({.width = 640, .height = 480, .color = kWhite});
  app_->fillRect(window, kGreen, 50, 40, 50, 40);  // it repaints while it is covered
  ASSERT_TRUE(waitForColor(kGreen, 99, 79));
  EXPECT_EQ(colorAt(49, 39), kRed);
  EXPECT_EQ(colorAt(15, 15), kBlue);
  app_->fill(child, kWhite);
  EXPECT_TRUE(waitForColor(kWhite, 15, 15)) << "a change within a child window";
  EXPECT_EQ(recorder_->last()->image()->width(), 100u);
  EXPECT_EQ(recorder_->last()->image()->height(), 80u);
  EXPECT_FALSE(recorder_->last()->duration().isValid());
}

TEST_F(CaptureTest, ComposesWindowsInTheirStackingOrder) {
  const auto lower = app_->show({.x = 100, .y = 100, .width = 100, .height = 100, .color = kRed});
  const auto upper = app_->show({.x = 150, .y = 150, .width = 100, .height = 100, .color = kGreen});
  clone({150, 150}, {upper, lower});
  ASSERT_TRUE(waitForColor(kGreen, 75, 75));
  EXPECT_EQ(colorAt(10, 10), kRed);
  EXPECT_EQ(colorAt(140, 140), kGreen);
  EXPECT_EQ(colorAt(140, 10), kBlack) << "no window is there";
  app_->raise(lower);
  ASSERT_TRUE(waitForColor(kRed, 75, 75));
  app_->move(upper, 200, 100);  // side by side now: 200 x 100, fitted into 150 x 150
  ASSERT_TRUE(waitForColor(kBlack, 75, 20));
  EXPECT_PRED2(isNear, colorAt(10, 75), kRed);
  EXPECT_PRED2(isNear, colorAt(140, 75), kGreen);
  EXPECT_EQ(colorAt(75, 130), kBlack);
}

TEST_F(CaptureTest, BlendsWindowsWithAlpha) {
  const auto lower = app_->show({.width = 100, .height = 100, .color = kRed});
  const auto upper = app_->show({.width = 50, .height = 100, .color = 0x80000080, .hasAlpha = true});
  clone({100, 100}, {lower, upper});
  ASSERT_TRUE(waitForColor(kRed, 75, 50));
  const uint32_t mixed = colorAt(25, 50);
  EXPECT_NEAR((mixed >> 16) & 0xFF, 0x7F, 3);
  EXPECT_NEAR(mixed & 0xFF, 0x80, 3);
}

TEST_F(CaptureTest, FollowsSizeMappingAndEndOfAWindow) {
  const auto window = app_->show({.width = 100, .height = 100, .color = kRed});
  clone({100, 100}, {window, 0xdeadbeef});  // there is no such window
  ASSERT_TRUE(waitForColor(kRed, 50, 5));
  app_->resize(window, 100, 50);
  app_->fill(window, kGreen);
  ASSERT_TRUE(waitForColor(kGreen, 50, 50));
  EXPECT_EQ(colorAt(50, 20), kBlack);
  EXPECT_EQ(colorAt(50, 30), kGreen);
  EXPECT_EQ(colorAt(50, 80), kBlack);
  app_->resize(window, 400, 400);
  app_->fill(window, kBlue);
  ASSERT_TRUE(waitForColor(kBlue, 99, 99));
  app_->unmap(window);
  ASSERT_TRUE(waitForColor(kBlack, 50, 50));
  app_->map(window);
  ASSERT_TRUE(waitForColor(kRed, 50, 50)) << "its background";
  app_->destroy(window);
  ASSERT_TRUE(waitForColor(kBlack, 50, 50));
  EXPECT_TRUE(recorder_->waitForMoreFrames(2)) << "a black picture still has a time";
  EXPECT_EQ(recorder_->failures(), 0);
}

TEST_F(CaptureTest, MirrorsTheWholeScreenFitted) {
  const auto window = app_->show({.width = 320, .height = 480, .color = kRed});
  app_->show({.x = 320, .width = 320, .height = 480, .color = kGreen});
  start({480, 640}, DisplayCloneMode::MirrorScreen);  // 640 x 480 becomes 480 x 360
  ASSERT_TRUE(waitForColor(kRed, 10, 320));
  EXPECT_PRED2(isNear, colorAt(470, 320), kGreen);
  EXPECT_EQ(colorAt(10, 130), kBlack);
  EXPECT_EQ(colorAt(10, 510), kBlack);
  app_->fill(window, kBlue);
  EXPECT_TRUE(waitForColor(kBlue, 10, 320));
}

TEST_F(CaptureTest, RepeatsAStillPictureWithoutTakingItAgain) {
  const auto window = app_->show({.color = kRed});
  clone({100, 80}, {window});
  ASSERT_TRUE(waitForColor(kRed, 5, 5));
  ASSERT_TRUE(recorder_->waitForMoreFrames(2));
  const auto first = recorder_->last();
  ASSERT_TRUE(recorder_->waitForMoreFrames());
  const auto second = recorder_->last();
  EXPECT_EQ(first->image()->sharedFrame(), second->image()->sharedFrame());
  EXPECT_GT((second->presentationTime() - first->presentationTime()).seconds(), 0.3);
}

TEST_F(CaptureTest, DrawsThePointerOverItsWindowOnly) {
  if (!kit::isInstalled("xdotool")) GTEST_SKIP() << "xdotool is not installed";
  const auto movePointer = [&](const std::string& x, const std::string& y) {
    ASSERT_EQ(kit::Process("xdotool", {"mousemove", x, y}, {"DISPLAY=" + display()}).wait(), 0);
  };
  movePointer("600", "400");
  const auto window = app_->show({.x = 100, .y = 100, .width = 100, .height = 80, .color = kRed});
  app_->setCursor(window, 10, kWhite);
  clone({100, 80}, {window});
  ASSERT_TRUE(waitForColor(kRed, 45, 45));
  movePointer("140", "140");
  ASSERT_TRUE(waitForColor(kWhite, 45, 45));
  EXPECT_EQ(colorAt(55, 45), kRed);
  app_->setCursor(window, 10, kBlue);
  ASSERT_TRUE(waitForColor(kBlue, 45, 45)) << "a new image of a resting pointer";
  movePointer("600", "400");
  ASSERT_TRUE(waitForColor(kRed, 45, 45));
}

TEST_F(CaptureTest, SkipsPicturesWhileAllFramesAreHeld) {
  const auto window = app_->show({.color = kRed});
  std::vector<SampleBufferRef> held;
  std::set<const SharedFrame*> frames;
  clone({100, 80}, {window});
  for (uint32_t i = 0; i < 20; ++i) {
    app_->fill(window, 0x010101 * i);
    ASSERT_TRUE(recorder_->waitForMoreFrames());
    held.push_back(recorder_->last());
    frames.insert(held.back()->image()->sharedFrame().get());
  }
  EXPECT_LE(frames.size(), 14u);
  held.clear();
  app_->fill(window, kGreen);
  EXPECT_TRUE(waitForColor(kGreen, 5, 5));
}

TEST_F(CaptureTest, TellsOnceOfTheServersEnd) {
  XServer mortal;
  auto platform = X11Platform::connect(mortal.display(), {});
  ASSERT_TRUE(platform);
  auto& service = platform.value()->screenCapture();
  service.displayClone().setMirroringMode(DisplayCloneMode::MirrorScreen);
  auto controller = service.createController({320, 240}, MediaTime::make(1, 60));
  controller->setDelegate(recorder_);
  controller->startCapture();
  ASSERT_TRUE(recorder_->waitForFrames(1));
  mortal.kill();
  ASSERT_TRUE(recorder_->waitForReset());
  controller->stopCapture();
  EXPECT_EQ(recorder_->resets(), 1);
  controller->startCapture();
  EXPECT_TRUE(recorder_->waitForReset(2)) << "a start without a server";
  controller->stopCapture();
  EXPECT_EQ(recorder_->resets(), 2);
  EXPECT_EQ(recorder_->failures(), 0);
}

}  // namespace
}  // namespace qv::platform
