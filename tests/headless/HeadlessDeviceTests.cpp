#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>

#include "platform/headless/HeadlessPlatform.h"
#include "platform/headless/TestSignal.h"
#include "tests/kit/Events.h"
#include "tests/kit/FakePacedClock.h"
#include "tests/kit/FrameRecorder.h"

namespace qv::platform {
namespace {

using namespace std::chrono_literals;

/// A device on the time of the test.
class HeadlessDeviceTest : public testing::Test {
 protected:
  std::unique_ptr<ScreenCaptureController> mirror(MediaTime interval) {
    platform_.screenCapture().displayClone().setMirroringMode(DisplayCloneMode::MirrorScreen);
    auto controller = platform_.screenCapture().createController({320, 180}, interval);
    controller->setDelegate(recorder_);
    return controller;
  }
  static testsignal::Picture pictureOf(const SampleBufferRef& sample) {
    const auto& frame = *sample->image()->sharedFrame();
    return {frame.bytes(), frame.layout().width, frame.layout().height, frame.layout().stride};
  }
  kit::FakePacedClock clock_;
  HeadlessPlatform platform_{{.clock = &clock_}};
  std::shared_ptr<kit::FrameRecorder> recorder_ = std::make_shared<kit::FrameRecorder>();
};

TEST_F(HeadlessDeviceTest, FramesAreNumberedOnTheGridAndFlashWithTheSecond) {
  const auto controller = mirror(MediaTime::make(1, 60));
  clock_.pass(5ms);
  uint32_t number = 0;
  for (const int start : {1, 2}) {
    controller->startCapture();
    clock_.settle();
    EXPECT_EQ(testsignal::decodeFrameNumber(pictureOf(recorder_->last())), number++) << "start " << start;
    EXPECT_EQ(static_cast<uint64_t>(recorder_->last()->presentationTime().value), clock_.hostTime());
    for (int frame = 0; frame < 70; ++frame) {
      while (recorder_->frames() == static_cast<int>(number)) clock_.advance(1ms);
      const auto time = static_cast<uint64_t>(recorder_->last()->presentationTime().value);
      ASSERT_EQ(testsignal::decodeFrameNumber(pictureOf(recorder_->last())), number++);
      ASSERT_EQ(testsignal::decodeFlash(pictureOf(recorder_->last())), testsignal::isFlashTime(time));
      ASSERT_LT(time * 60 % 1'000'000'000, 60u) << "on a multiple of 1/60 s";
    }
    controller->stopCapture();
  }
}

TEST_F(HeadlessDeviceTest, SkipsTicksWhileAllFramesAreHeld) {
  std::vector<SampleBufferRef> held;
  const auto controller = mirror(MediaTime::make(1, 100));
  controller->startCapture();
  for (int tick = 0; tick < 20; ++tick) {
    clock_.advance(10ms);
    held.push_back(recorder_->last());
  }
  const int delivered = recorder_->frames();
  EXPECT_LE(delivered, 14);
  held.clear();
  clock_.advance(10ms, 3);
  EXPECT_EQ(recorder_->frames(), delivered + 3);
  EXPECT_EQ(testsignal::decodeFrameNumber(pictureOf(recorder_->last())), static_cast<uint32_t>(delivered) + 2)
      << "only delivered frames count";
}

TEST(HeadlessAlerts, AnswerAsTheEnvironmentSays) {
  HeadlessPlatform platform({});
  const auto answerOf = [&](const UserAlertRequest& request) {
    kit::Events<UserAlertAnswer> answers;
    const auto alert = platform.userAlerts().present(request, [&](UserAlertAnswer answer) { answers.add(answer); });
    return answers.next();
  };
  const UserAlertRequest twoButtons{"Title", "Text", "Record", "", "Refuse", ""};
  const UserAlertRequest threeButtons{"Title", "Text", "Refuse", "With microphone", "Screen only", ""};
  const struct {
    const char* value;
    UserAlertAnswer two, three;
  } cases[] = {{"accept", UserAlertAnswer::Default, UserAlertAnswer::Alternate},
               {"decline", UserAlertAnswer::Other, UserAlertAnswer::Default},
               {"alternate", UserAlertAnswer::Cancelled, UserAlertAnswer::Alternate},
               {"other", UserAlertAnswer::Other, UserAlertAnswer::Other},
               {"yes please", UserAlertAnswer::Cancelled, UserAlertAnswer::Cancelled}};
  for (const auto& test : cases) {
    ::setenv("QUORVEL_HEADLESS_ALERT", test.value, 1);
    EXPECT_EQ(answerOf(twoButtons), test.two) << test.value;
    EXPECT_EQ(answerOf(threeButtons), test.three) << test.value;
  }
  ::unsetenv("QUORVEL_HEADLESS_ALERT");
  EXPECT_EQ(answerOf(twoButtons), UserAlertAnswer::Cancelled) << "nobody is there to consent";
}

TEST(HeadlessDevice, MayHaveNoMicrophoneAndNobodyInFront) {
  HeadlessPlatform platform({.hasMicrophone = false});
  EXPECT_FALSE(platform.deviceCapture().createDefaultAudioInput());
  EXPECT_FALSE(platform.applications().frontmostApplication());
}

TEST(HeadlessRenderServer, AContextBelongsToTheProcessOfItsNumber) {
  HeadlessPlatform platform({});
  EXPECT_EQ(platform.renderServer().ownerOfContext(static_cast<uint32_t>(::getpid())), ::getpid());
  for (const uint32_t nobodys : {0u, 0x7FFFFFFFu, 0xFFFFFFFFu})
    EXPECT_FALSE(platform.renderServer().ownerOfContext(nobodys)) << nobodys;
}

}  // namespace
}  // namespace qv::platform
