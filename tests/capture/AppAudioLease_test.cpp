#include "capture/AppAudioLease.h"

#include "tests/capture/CaptureTest.h"

namespace qv {
namespace {

using fakes::FakeAppAudioTap;
using platform::MediaTime;

using AppAudioLeaseTest = CaptureTest;

TEST_F(AppAudioLeaseTest, TapDeliversStampedAudioAndRecyclesItsBuffers) {
  startTap(a_);
  EXPECT_EQ(a_.tapStarts, 1);
  EXPECT_EQ(a_.tap->process, 42);
  EXPECT_EQ(a_.tap->capacities, std::vector<uint32_t>(10, 57344));

  a_.appAudioLease->setCaptureStartTime(MediaTime::make(1, platform::kHostTimescale));
  play(a_, 28672, 5 * kSecond);
  ASSERT_EQ(a_.appAudio.size(), 1u);
  EXPECT_EQ(a_.appAudio[0]->presentationTime(), MediaTime::make(5, 1));
  EXPECT_EQ(a_.appAudio[0]->numSamples(), 28672);
  EXPECT_EQ(a_.appAudio[0]->data()->bytes()[57343], 7);
  EXPECT_EQ(a_.tap->enqueued.size(), 10u);

  a_.appAudioLease->stopAppAudioCapture();
  EXPECT_TRUE(a_.tap->disposed);
  EXPECT_EQ(a_.tap->freed, 10);
  a_.appAudioLease->stopAppAudioCapture();
}

TEST_F(AppAudioLeaseTest, BuffersHoldASecondOfWhatTheTapReportsUpToTheirMaximum) {
  using Description = platform::AudioStreamDescription;
  const Description asked = manager_.audioBasicDescription();
  EXPECT_EQ(asked, (Description{44100, platform::kAudioFormatLinearPCM, 2 | 4 | 8, 2, 1, 2, 1, 16, 0}));
  const auto capacityOf = [&](double rate, uint32_t bytesPerPacket) {
    device_.tap.reported = asked;
    device_.tap.reported->sampleRate = rate;
    device_.tap.reported->bytesPerPacket = bytesPerPacket;
    startTap(a_);
    return a_.tap->capacities.at(0);
  };
  EXPECT_EQ(capacityOf(8000, 2), 16000u);
  EXPECT_EQ(capacityOf(8000, 1), 8000u);
  EXPECT_EQ(capacityOf(8000, 0), 24000u) << "the greatest packet";
  EXPECT_EQ(capacityOf(48000, 2), 57344u);
}

TEST_F(AppAudioLeaseTest, TapRunsOnTheBuffersThatItGot) {
  device_.tap.mostBuffers = 2;
  device_.tap.failures = {{"freeBuffer", -4}};
  start(a_);
  play(a_, 100, kSecond);
  EXPECT_EQ(a_.appAudio.size(), 1u);
  EXPECT_EQ(a_.tap->enqueued.size(), 2u);
  a_.appAudioLease.reset();
  EXPECT_EQ(a_.tap->freed, 2);
  EXPECT_TRUE(a_.tap->disposed);
}

TEST_F(AppAudioLeaseTest, WhatOneRecordingEndsIsNoOthers) {
  for (const bool olderEnds : {true, false}) {
    start(a_);
    start(b_);
    Recording& ending = olderEnds ? a_ : b_;
    Recording& staying = olderEnds ? b_ : a_;
    ending.tap->atStop = [&] {
      ASSERT_TRUE(FakeAppAudioTap::fill(*ending.tap, 300, 3 * kSecond));
      // A tap also tells that it runs no more.
      if (ending.tap->listener) ending.tap->listener();
    };
    ending.appAudioLease->startAppAudioCaptureForProcessID(43, nullptr);
    device_.run();
    EXPECT_TRUE(ending.tap->disposed) << "replaced within its lease";
    EXPECT_EQ(ending.appAudio.size(), 1u) << "what it had to hand over";
    EXPECT_EQ(ending.tapStarts, 1) << "it has not started again";
    const auto replacement = device_.tap.tap;
    end(ending);
    EXPECT_TRUE(replacement->disposed);
    EXPECT_FALSE(ending.session->running);

    EXPECT_FALSE(staying.tap->disposed);
    EXPECT_TRUE(staying.session->running);
    play(staying, 100, 5 * kSecond);
    speak(staying, 5 * kSecond, 100);
    EXPECT_EQ(staying.appAudio.size(), 1u);
    EXPECT_EQ(staying.microphone.size(), 1u);
    EXPECT_EQ(ending.appAudio.size() + ending.microphone.size(), 1u);
    end(staying);
    EXPECT_TRUE(staying.tap->disposed);
    a_ = {};
    b_ = {};
  }
}

TEST_F(AppAudioLeaseTest, BufferOfAStoppedTapIsIgnoredWhateverRunsSince) {
  start(a_);
  const auto old = a_.tap;
  a_.appAudioLease->stopAppAudioCapture();
  a_.appAudioLease->resumeAppAudioCaptureForProcessID(43, nullptr);
  startTap(b_);
  b_.appAudioLease->setCaptureStartTime(MediaTime::make(1, 1));
  old->callback(b_.tap->enqueued.front(), {}, 10);
  device_.run();
  EXPECT_TRUE(a_.appAudio.empty());
  EXPECT_TRUE(b_.appAudio.empty());
}

TEST_F(AppAudioLeaseTest, ProcessReplacedBeforeTheFirstTapRanStartsOnce) {
  a_.appAudioLease = manager_.leaseAppAudio([](const auto&) {});
  a_.appAudioLease->startAppAudioCaptureForProcessID(42, [&] { a_.tapStarts += 100; });
  a_.appAudioLease->resumeAppAudioCaptureForProcessID(43, [&] { ++a_.tapStarts; });
  device_.run();
  EXPECT_EQ(a_.tapStarts, 1);
  EXPECT_EQ(device_.tap.tap->process, 43);
  EXPECT_TRUE(device_.tap.taps.front()->disposed);
}

TEST_F(AppAudioLeaseTest, ResumeFillsTheGapOnceAndInItsOwnLeaseOnly) {
  start(a_);
  play(a_, 22050, kSecond);  // plays for half a second
  a_.appAudioLease->stopAppAudioCapture();
  device_.clock.advanceSeconds(2.5);
  a_.appAudioLease->resumeAppAudioCaptureForProcessID(43, nullptr);
  device_.run();
  a_.tap = device_.tap.tap;
  start(b_);
  play(b_, 100, 9 * kSecond);
  EXPECT_EQ(b_.appAudio.size(), 1u);
  play(a_, 100, 9 * kSecond);
  play(a_, 100, 10 * kSecond);
  ASSERT_EQ(a_.appAudio.size(), 4u);
  EXPECT_EQ(a_.appAudio[1]->numSamples(), 88200);
  EXPECT_EQ(a_.appAudio[1]->data()->size(), 176400u);
  EXPECT_EQ(a_.appAudio[1]->presentationTime(), MediaTime::zero());
  EXPECT_EQ(a_.appAudio[1]->duration(), MediaTime::make(2, 1));
}

TEST_F(AppAudioLeaseTest, ResumeFillsNoGapWhereThereIsNone) {
  start(a_);
  const auto resumeAndPlay = [&] {
    a_.appAudioLease->resumeAppAudioCaptureForProcessID(43, nullptr);
    device_.run();
    a_.tap = device_.tap.tap;
    play(a_, 22050, kSecond);
  };
  resumeAndPlay();
  EXPECT_EQ(a_.appAudio.size(), 1u) << "nothing was heard before";
  device_.clock.advanceSeconds(0.25);
  resumeAndPlay();
  EXPECT_EQ(a_.appAudio.size(), 2u) << "the former is heard still";
  device_.clock.advanceSeconds(0.5);
  resumeAndPlay();
  EXPECT_EQ(a_.appAudio.size(), 3u) << "the former has just ended";
  device_.clock.advanceSeconds(9);
  a_.appAudioLease->startAppAudioCaptureForProcessID(44, nullptr);
  device_.run();
  a_.tap = device_.tap.tap;
  play(a_, 100, kSecond);
  EXPECT_EQ(a_.appAudio.size(), 4u) << "a start is no resume";
}

TEST_F(AppAudioLeaseTest, WhatAnUnstoppableTapStillBringsIsIgnored) {
  device_.tap.failures = {{"setTappedProcess", -50}, {"stop", -66}};
  start(a_);
  a_.tap->atStop = [&] { ASSERT_TRUE(FakeAppAudioTap::fill(*a_.tap, 300, 3 * kSecond)); };
  a_.appAudioLease->stopAppAudioCapture();
  EXPECT_TRUE(a_.appAudio.empty());
  EXPECT_EQ(a_.tap->freed, 0) << "the queue may still use its buffers";
}

TEST_F(AppAudioLeaseTest, SoundThatCannotBeHadIsToldLikeAStart) {
  device_.tap.startsLate = true;
  startTap(a_);
  EXPECT_EQ(a_.tapStarts, 0);
  a_.tap->listener();
  device_.run();
  EXPECT_EQ(a_.tapStarts, 1);

  device_.tap.failures = {{"start", -5}};
  a_.tapStarts = 0;
  startTap(a_);
  EXPECT_EQ(a_.tapStarts, 1);

  device_.tap.failures = {{"create", -3}};
  startTap(b_);
  EXPECT_EQ(b_.tapStarts, 1);
  b_.appAudioLease.reset();
}

}  // namespace
}  // namespace qv
