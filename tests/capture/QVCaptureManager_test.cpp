#include "capture/QVCaptureManager.h"

#include "tests/fakes/FakeDevice.h"

namespace qv {
namespace {

using platform::MediaTime;
using platform::SampleBufferRef;

constexpr int64_t kSecond = 1'000'000'000;

class CaptureManagerTest : public testing::Test {
 protected:
  ~CaptureManagerTest() override {
    manager_.stopAllCapture();
    device_.run();
  }
  QVCaptureManager::OutputHandler collect(std::vector<SampleBufferRef>& samples) {
    return [&samples](const SampleBufferRef& sample) { samples.push_back(sample); };
  }
  void startTap(std::function<void()> didStart = nullptr) {
    manager_.startAppAudioCaptureForProcessID(42, collect(appAudio_), std::move(didStart));
    device_.run();
  }
  void fill(uint32_t frames, uint64_t hostTime, uint32_t packets) {
    ASSERT_TRUE(device_.tap.fill(frames, hostTime, packets));
    device_.run();
  }
  SampleBufferRef microphoneSample(int64_t nanoseconds, int64_t frames) {
    return platform::SampleBuffer::makeAudio(
        std::make_shared<platform::DataBlock>(std::vector<uint8_t>(static_cast<size_t>(frames) * 2, 1)),
        manager_.createAudioFormatDescription(), frames, MediaTime::make(nanoseconds, platform::kHostTimescale));
  }

  fakes::FakeDevice device_;
  QVCaptureManager manager_{device_.platform};
  std::vector<SampleBufferRef> appAudio_;
  std::vector<SampleBufferRef> microphone_;
};

TEST_F(CaptureManagerTest, TapDeliversStampedAudioAndRecyclesItsBuffers) {
  bool started = false;
  startTap([&] { started = true; });
  EXPECT_TRUE(started);
  EXPECT_EQ(device_.tap.tap->process, 42);
  EXPECT_EQ(device_.tap.tap->capacities, std::vector<uint32_t>(10, 57344));

  manager_.setCaptureStartTime(MediaTime::make(1, platform::kHostTimescale));
  fill(28672, 5 * kSecond, 28672);
  ASSERT_EQ(appAudio_.size(), 1u);
  EXPECT_EQ(appAudio_[0]->presentationTime(), MediaTime::make(5, 1));
  EXPECT_EQ(appAudio_[0]->numSamples(), 28672);
  EXPECT_EQ(appAudio_[0]->data()->bytes()[57343], 7);
  EXPECT_EQ(device_.tap.tap->enqueued.size(), 10u);

  manager_.stopAppAudioCapture();
  EXPECT_TRUE(device_.tap.tap->disposed);
  EXPECT_EQ(device_.tap.tap->freed, 10);
  manager_.stopAppAudioCapture();
}

TEST_F(CaptureManagerTest, AudioBeforeTheFirstFrameIsDroppedAndItsBuffersAreNotHandedBack) {
  startTap();
  fill(100, kSecond, 100);
  EXPECT_TRUE(appAudio_.empty());
  EXPECT_EQ(device_.tap.tap->enqueued.size(), 9u);
}

TEST_F(CaptureManagerTest, BufferOfAStoppedTapIsIgnored) {
  startTap();
  manager_.setCaptureStartTime(MediaTime::make(1, 1));
  const auto old = device_.tap.tap;
  ASSERT_TRUE(fakes::FakeAppAudioTap::fill(*old, 10, kSecond, 10));
  manager_.stopAppAudioCapture();
  device_.run();
  // The fill came before the stop, so it was delivered; one that comes after it is not.
  const size_t before = appAudio_.size();
  startTap();
  old->callback(device_.tap.tap->enqueued.front(), {}, 10);
  device_.run();
  EXPECT_EQ(appAudio_.size(), before);
}

TEST_F(CaptureManagerTest, AStopDeliversWhatTheTapAndTheMicrophoneHandOverAtIt) {
  bool started = false;
  startTap([&] { started = true; });
  manager_.startMicrophoneCaptureWithOutput(collect(microphone_), nullptr);
  device_.run();
  started = false;
  manager_.setCaptureStartTime(MediaTime::make(1, 1));
  const auto state = device_.tap.tap;
  state->atStop = [&] {
    ASSERT_TRUE(device_.tap.fill(300, 3 * kSecond, 300));
    // A tap also tells that it runs no more.
    if (state->listener) state->listener();
  };
  device_.deviceCapture.session->atStop = [&] { device_.deviceCapture.send(microphoneSample(3 * kSecond, 441)); };
  manager_.stopAllCapture();
  ASSERT_EQ(appAudio_.size(), 1u);
  EXPECT_EQ(appAudio_[0]->numSamples(), 300);
  EXPECT_EQ(microphone_.size(), 1u);
  EXPECT_TRUE(state->disposed);
  EXPECT_FALSE(started) << "it has not started again";
}

TEST_F(CaptureManagerTest, ResumeFillsTheGapOnce) {
  startTap();
  manager_.setCaptureStartTime(MediaTime::make(1, 1));
  fill(22050, kSecond, 22050);  // plays for half a second
  manager_.stopAppAudioCapture();
  device_.clock.advanceSeconds(2.5);
  manager_.resumeAppAudioCaptureForProcessID(43, collect(appAudio_));
  device_.run();
  fill(100, 9 * kSecond, 100);
  fill(100, 10 * kSecond, 100);
  ASSERT_EQ(appAudio_.size(), 4u);
  EXPECT_EQ(appAudio_[1]->numSamples(), 88200);
  EXPECT_EQ(appAudio_[1]->data()->size(), 176400u);
  EXPECT_EQ(appAudio_[1]->presentationTime(), MediaTime::zero());
  EXPECT_EQ(appAudio_[1]->duration(), MediaTime::make(2, 1));
}

TEST_F(CaptureManagerTest, AQueueWithoutPacketSizeAsksForTheLargestPacket) {
  device_.tap.packetSize = 1;
  auto format = manager_.audioBasicDescription();
  format.bytesPerPacket = 0;
  device_.tap.reportedFormat = format;
  startTap();
  EXPECT_EQ(device_.tap.tap->capacities.front(), 44100u);
}

TEST_F(CaptureManagerTest, RefusedTapIsLoggedAndForgotten) {
  device_.tap.failures = {{"setTappedProcess", -50}, {"stop", -66}};
  startTap();
  EXPECT_TRUE(device_.log.contains("QVRecordingManager: startAudioCapture error: -50"));
  manager_.stopAppAudioCapture();
  EXPECT_TRUE(device_.log.contains("QVRecordingManager:stopAudioCapture:error: -66"));
  EXPECT_FALSE(device_.tap.tap->disposed);
  startTap();
  EXPECT_EQ(device_.tap.taps.size(), 2u);
}

TEST_F(CaptureManagerTest, MicrophoneStartsOnceAndIsDetached) {
  int started = 0;
  manager_.startMicrophoneCaptureWithOutput(collect(microphone_), [&] { ++started; });
  manager_.startMicrophoneCaptureWithOutput(nullptr, [&] { started += 100; });
  device_.run();
  EXPECT_EQ(started, 1);
  EXPECT_TRUE(manager_.isRecordingMicrophone());
  EXPECT_EQ(device_.deviceCapture.session->inputs, 1);
  device_.deviceCapture.send(microphoneSample(kSecond, 441));
  device_.run();
  EXPECT_EQ(microphone_.size(), 1u);
  manager_.stopAllCapture();
  EXPECT_EQ(device_.deviceCapture.session->outputs, 0);
  EXPECT_FALSE(device_.deviceCapture.session->running);
  EXPECT_EQ(device_.deviceCapture.categoryOptions, 5u);
}

TEST_F(CaptureManagerTest, InterruptedMicrophoneGetsOneFillerForThePositiveGap) {
  manager_.startMicrophoneCaptureWithOutput(collect(microphone_), nullptr);
  device_.run();
  device_.deviceCapture.send(microphoneSample(10 * kSecond, 44100));
  device_.run();
  device_.deviceCapture.interruption(1);
  device_.clock.advanceSeconds(2.5);
  device_.deviceCapture.send(microphoneSample(20 * kSecond, 441));
  device_.deviceCapture.send(microphoneSample(21 * kSecond, 441));
  device_.run();
  ASSERT_EQ(microphone_.size(), 4u);
  EXPECT_EQ(microphone_[1]->numSamples(), 66150);
  EXPECT_EQ(microphone_[1]->presentationTime(), MediaTime::make(11, 1));
  EXPECT_EQ(microphone_[1]->data()->bytes()[0], 0);

  // A jump of the wall clock is no gap worth gigabytes.
  device_.deviceCapture.interruption(1);
  device_.clock.advanceSeconds(1e7);
  device_.deviceCapture.send(microphoneSample(22 * kSecond, 441));
  device_.run();
  EXPECT_EQ(microphone_[4], nullptr);
}

}  // namespace
}  // namespace qv
