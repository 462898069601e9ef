#include <algorithm>

#include "platform/x11/X11Platform.h"
#include "tests/kit/Events.h"
#include "tests/kit/FrameRecorder.h"
#include "tests/kit/XServer.h"

namespace qv::platform {
namespace {

constexpr uint32_t kWindowGreen = 0x00FF00, kWindowBlue = 0x0000FF, kWindowRed = 0xFF0000;

constexpr size_t kStrip = 40;  // rows at the top in which the indicator stands; the pointer lies below

/// Strokes as thin as these are grey at their edges.
constexpr uint32_t kText = 0x808080;

/// Pixels of a colour; of `kText` those that are as bright at least.
struct Found {
  size_t count = 0, left = SIZE_MAX, top = SIZE_MAX, right = 0;
};
Found find(const PixelBuffer& image, uint32_t color) {
  Found found;
  for (size_t y = 0; y < kStrip; ++y)
    for (size_t x = 0; x < image.width(); ++x) {
      const uint32_t here = kit::colorIn(image, x, y);
      if (color == kText ? (here & kText) != kText : here != color) continue;
      found = {found.count + 1, std::min(found.left, x), std::min(found.top, y), std::max(found.right, x)};
    }
  return found;
}

/// Threading: thread-safe.
struct PressRecorder final : StatusBarOverrideCoordinatorDelegate {
  void statusBarOverrideWasPressed() override { presses.add(true); }
  kit::Events<bool> presses;
};

class IndicatorTest : public kit::XServerTest {
 protected:
  void open(const std::string& display) {
    app_ = std::make_unique<kit::XClient>(display);
    platform_ = std::move(X11Platform::connect(display, {.moduleDirectory = QV_INDICATOR_MODULE}).value());
    screen_ = capture(DisplayCloneMode::MirrorScreen, {}, seen_);
  }
  std::unique_ptr<ScreenCaptureController> capture(DisplayCloneMode mode, std::set<uint32_t> windows,
                                                   const std::shared_ptr<kit::FrameRecorder>& recorder) {
    auto& service = platform_->screenCapture();
    service.displayClone().setMirroringMode(mode);
    service.displayClone().setCloneContexts(std::move(windows));
    auto controller = service.createController({kit::XServer::kWidth, kit::XServer::kHeight}, MediaTime::make(1, 60));
    controller->setDelegate(recorder);
    controller->startCapture();
    return controller;
  }
  /// Whether the screen comes to show the indicator's sign in its upper right corner, over this colour.
  bool isSeenOver(uint32_t color) {
    return seen_->waitForPicture([&](const PixelBuffer& image) {
      const Found sign = find(image, kWindowRed);
      return kit::colorIn(image, 100, 400) == color && sign.count > 40 && sign.left > image.width() / 2;
    });
  }

  const StatusBarOverride shown_{"Recording", "0:05", false};
  std::unique_ptr<kit::XClient> app_;
  std::unique_ptr<X11Platform> platform_;
  const std::shared_ptr<kit::FrameRecorder> seen_ = std::make_shared<kit::FrameRecorder>();
  std::unique_ptr<ScreenCaptureController> screen_;
};

TEST_F(IndicatorTest, CoversWhateverIsShownButNotAnApplicationsPictureAndIsPressed) {
  open(display());
  const auto game = app_->show({.width = kit::XServer::kWidth, .height = kit::XServer::kHeight, .color = kWindowGreen});
  const auto user = std::make_shared<PressRecorder>();
  auto bar = platform_->statusBar().acquire(shown_, user);
  ASSERT_TRUE(isSeenOver(kWindowGreen));
  const Found dot = find(*seen_->last()->image(), kWindowRed), text = find(*seen_->last()->image(), kText);
  EXPECT_GT(text.count, 50u);
  EXPECT_GT(text.left, dot.right);
  app_->raise(game);
  app_->fill(game, kWindowBlue);
  EXPECT_TRUE(isSeenOver(kWindowBlue)) << "it is raised again";
  app_->setNoBackground(game);  // the server fills in what is on the screen, when the capture begins
  const auto movie = std::make_shared<kit::FrameRecorder>();
  const auto recording = capture(DisplayCloneMode::CloneContexts, {game}, movie);
  ASSERT_TRUE(movie->waitForFrames(1));
  EXPECT_EQ(find(*movie->last()->image(), kWindowRed).count, 0u);
  app_->fill(game, kWindowGreen);  // what it paints while it is captured
  EXPECT_TRUE(movie->waitForPicture([](const PixelBuffer& image) {
    return find(image, kWindowGreen).count == kit::XServer::kWidth * kStrip;
  })) << "nothing but the window's own pixels";
  bar->update({shown_.text, "0:06", true});
  EXPECT_TRUE(seen_->waitForPicture([&](const PixelBuffer& image) {
    return find(image, kWindowRed).count > dot.count;
  })) << "two bars while it is paused";
  if (kit::isInstalled("xdotool")) {
    const auto x = std::to_string(dot.left + 3), y = std::to_string(dot.top + 3);
    kit::Process click("xdotool", {"mousemove", x, y, "click", "1"}, {"DISPLAY=" + display()});
    EXPECT_EQ(click.wait(), 0);
    EXPECT_TRUE(user->presses.next());
  }
  bar.reset();
  EXPECT_TRUE(seen_->waitForPicture([](const PixelBuffer& image) { return find(image, kWindowRed).count == 0; }));
}

TEST_F(IndicatorTest, CoversManagedWindowsAndLeavesThemTheKeyboard) {
  if (!kit::isInstalled("openbox") || !kit::isInstalled("xdotool")) GTEST_SKIP() << "openbox or xdotool is missing";
  const kit::XServer own;
  const kit::WindowManager manager(own.display());
  open(own.display());  // afterwards: only the platform's threads take turns in connecting
  const auto game = app_->show({.width = kit::XServer::kWidth, .height = kit::XServer::kHeight, .color = kWindowGreen});
  const auto bar = platform_->statusBar().acquire(shown_, {});
  ASSERT_TRUE(isSeenOver(kWindowGreen));
  ASSERT_TRUE(kit::activateWindow(own.display(), game));
  app_->fill(game, kWindowBlue);
  EXPECT_TRUE(isSeenOver(kWindowBlue));
  app_->waitForFocus(game);
}

}  // namespace
}  // namespace qv::platform
