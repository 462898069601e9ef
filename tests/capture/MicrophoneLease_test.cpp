#include "capture/MicrophoneLease.h"

#include "tests/capture/CaptureTest.h"

namespace qv {
namespace {

using platform::MediaTime;

using MicrophoneLeaseTest = CaptureTest;

TEST_F(MicrophoneLeaseTest, StartsOnceAndIsDetachedAtItsEnd) {
  startMicrophone(a_);
  a_.session->setRunning(true);
  EXPECT_EQ(a_.microphoneStarts, 1);
  EXPECT_EQ(a_.session->inputs, 1);
  speak(a_, kSecond, 441);
  EXPECT_EQ(a_.microphone.size(), 1u);
  a_.microphoneLease.reset();
  EXPECT_EQ(a_.session->inputs + a_.session->outputs, 0);
  EXPECT_FALSE(a_.session->running);
  EXPECT_EQ(a_.microphoneStarts, 1);
  EXPECT_EQ(device_.deviceCapture.categoryOptions, 5u);
}

TEST_F(MicrophoneLeaseTest, EndedBeforeItsTurnOpensNothing) {
  (void)manager_.startMicrophoneCaptureWithOutput(nullptr, [&] { ++a_.microphoneStarts; });
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
  // A jump of the wall clock is no gap worth gigabytes.
  b_.microphoneLease.reset();
  device_.deviceCapture.interruption(1);
  device_.clock.advanceSeconds(1e7);
  speak(a_, 22 * kSecond, 441);
  EXPECT_EQ(a_.microphone[4], nullptr);
}

}  // namespace
}  // namespace qv
