#include "capture/MicrophoneLease.h"

#include <cmath>

#include "tests/capture/CaptureTest.h"

namespace qv {
namespace {

using platform::MediaTime;

using MicrophoneLeaseTest = CaptureTest;

TEST_F(MicrophoneLeaseTest, StartsOnceAndIsDetachedAtItsEnd) {
  startMicrophone(a_);
  a_.session->setRunning(true);
  EXPECT_EQ(a_.microphoneStarts, 1);
  EXPECT_TRUE(a_.session->usesApplicationAudioSession);
  EXPECT_FALSE(a_.session->configuresAutomatically);
  EXPECT_EQ(a_.session->inputs, 1);
  speak(a_, kSecond, 441);
  EXPECT_EQ(a_.microphone.size(), 1u);
  a_.microphoneLease.reset();
  EXPECT_EQ(a_.session->inputs + a_.session->outputs, 0);
  EXPECT_FALSE(a_.session->running);
  EXPECT_EQ(a_.session->stops, 1);
  EXPECT_EQ(a_.microphoneStarts, 1);
  EXPECT_EQ(device_.deviceCapture.categoryOptions, 5u);
}

TEST_F(MicrophoneLeaseTest, EndOfOneThatBeginsLateTellsNoStartAndLeavesItOff) {
  device_.deviceCapture.startsLate = true;
  startMicrophone(a_);
  // The start was under way on the audio dispatch queue.
  a_.session->atStop = [&] {
    manager_.audioDispatchQueue().async([session = a_.session.get()] { session->running = true; });
    a_.session->atStop = nullptr;
  };
  a_.microphoneLease.reset();
  EXPECT_FALSE(a_.session->running);
  EXPECT_EQ(a_.microphoneStarts, 0);
}

TEST_F(MicrophoneLeaseTest, EndedBeforeItsTurnOpensNothing) {
  (void)manager_.startMicrophoneCaptureWithOutput([](const auto&) {}, [&] { ++a_.microphoneStarts; });
  device_.run();
  EXPECT_EQ(device_.deviceCapture.session, nullptr);
  EXPECT_EQ(a_.microphoneStarts, 0);
}

TEST_F(MicrophoneLeaseTest, InterruptionLeavesOneFillerForThePositiveGapInEachLease) {
  startMicrophone(a_);
  startMicrophone(b_);
  speak(a_, 10 * kSecond, 44100);
  speak(b_, 10 * kSecond, 44100);
  device_.deviceCapture.interruption(1);
  device_.clock.advanceSeconds(2.5);
  for (Recording* recording : {&a_, &b_}) {
    speak(*recording, 20 * kSecond, 441);
    speak(*recording, 21 * kSecond, 441);
    ASSERT_EQ(recording->microphone.size(), 4u);
    EXPECT_EQ(recording->microphone[1]->numSamples(), 66150);
    EXPECT_EQ(recording->microphone[1]->presentationTime(), MediaTime::make(11, 1));
    EXPECT_EQ(recording->microphone[1]->data()->bytes()[0], 0);
  }
  const auto speakAfter = [&](double seconds) {
    device_.clock.advanceSeconds(seconds);
    speak(a_, 22 * kSecond, 44100);
    return a_.microphone.size();
  };
  device_.deviceCapture.interruption(0);
  EXPECT_EQ(speakAfter(3), 5u) << "the end of an interruption";
  device_.deviceCapture.interruption(1);
  EXPECT_EQ(speakAfter(0.5), 6u) << "what was heard before lasts still";
  device_.deviceCapture.interruption(1);
  EXPECT_EQ(speakAfter(1), 7u) << "it has just ended";
  EXPECT_EQ(speakAfter(9), 8u) << "no interruption";
  b_.microphoneLease.reset();
  startMicrophone(b_);
  device_.deviceCapture.interruption(1);
  device_.clock.advanceSeconds(3);
  speak(b_, 30 * kSecond, 441);
  EXPECT_EQ(b_.microphone.size(), 5u) << "nothing was heard before";
  // A jump of the wall clock is no gap worth gigabytes.
  device_.deviceCapture.interruption(1);
  device_.clock.advanceSeconds(1e7);
  speak(a_, 22 * kSecond, 441);
  EXPECT_EQ(a_.microphone[8], nullptr);
}

TEST_F(MicrophoneLeaseTest, SilenceHasTheLengthOfItsGapAndALimit) {
  const MediaTime time = MediaTime::make(7, 1);
  EXPECT_EQ(manager_.createEmptyAudioSampleBuffer(time, 0)->numSamples(), 0);
  EXPECT_EQ(manager_.createEmptyAudioSampleBuffer(time, 600)->duration(), MediaTime::make(600, 1));
  for (const double gap : {-0.001, 600.001, std::nan("")}) {
    EXPECT_EQ(manager_.createEmptyAudioSampleBuffer(time, gap), nullptr) << gap;
  }
}

/// Two routes, of which the second takes the first one's place.
TEST_F(MicrophoneLeaseTest, CameraRouteGoesToItsHandlerWhileItIsTheCurrentOne) {
  struct Route final : platform::VideoDataOutput {
    void setSampleDelegate(platform::CaptureOutputDelegate* to, platform::SerialQueue*) override {
      delegate = to;
      ++changes;
    }
    platform::CaptureOutputDelegate* delegate = nullptr;
    int changes = 0;
  };
  const auto first = std::make_shared<Route>(), second = std::make_shared<Route>();
  int pictures = 0;
  {
    QVCaptureManager manager(device_.platform);
    manager.setCameraOutputHandler([&](const auto&) { ++pictures; });
    EXPECT_FALSE(manager.hasVideoCaptureDevice());
    for (const auto& route : {first, first, second}) manager.setCaptureSessionVideoDataOutput(route);
    EXPECT_TRUE(manager.hasVideoCaptureDevice());
    EXPECT_EQ(first->delegate, nullptr);
    EXPECT_EQ(first->changes, 3) << "kept, it is not let go of in between";
    second->delegate->captureOutputDidOutputSampleBuffer(*second, nullptr);
    second->delegate->captureOutputDidOutputSampleBuffer(*first, nullptr);
    EXPECT_EQ(pictures, 1);
  }
  EXPECT_EQ(second->delegate, nullptr);
  EXPECT_FALSE(device_.deviceCapture.interruption) << "nobody is left to be told";
}

}  // namespace
}  // namespace qv
