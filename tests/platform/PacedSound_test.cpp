#include <gtest/gtest.h>

#include <algorithm>
#include <mutex>

#include "platform/sound/PacedDeviceCapture.h"
#include "platform/sound/PacedTapQueue.h"
#include "tests/kit/FakePacedClock.h"
#include "tests/kit/SoundRecorder.h"

namespace qv::platform {
namespace {

using namespace std::chrono_literals;

constexpr uint32_t kRate = 44100;
constexpr auto kTick = 10ms;
constexpr size_t kFramesOfTick = kRate / 100;

/// A sound whose samples count.
class CountingSource final : public PCMSource {
 public:
  explicit CountingSource(std::chrono::nanoseconds latency, std::vector<uint64_t>* awaited)
      : latency_(latency), awaited_(awaited) {}
  std::chrono::nanoseconds latency() const override { return latency_; }
  void awaitSound(uint64_t hostTime) override { awaited_->push_back(hostTime); }
  void render(uint64_t, std::span<int16_t> samples) override {
    for (int16_t& sample : samples) sample = next_++;
  }

 private:
  const std::chrono::nanoseconds latency_;
  std::vector<uint64_t>* const awaited_;
  int16_t next_ = 0;
};

/// Tap queues and a microphone on the time of the test.
class PacedSoundTest : public testing::Test {
 protected:
  struct HandOver {
    QueueBuffer* buffer;
    uint64_t hostTime;
    double sampleTime;
    size_t frames;
  };

  std::unique_ptr<PCMSource> open() { return std::make_unique<CountingSource>(latency_, &awaited_); }
  void makeQueue(int buffers, uint32_t frames) {
    ASSERT_EQ(0, taps_.createInputQueue(
                     PCMFormat{}.description(),
                     [this](QueueBuffer* buffer, const AudioTimeStamp& start, uint32_t packets) {
                       EXPECT_EQ(packets * 2, buffer->byteSize);
                       taken_.push_back({buffer, start.hostTime, start.sampleTime, packets});
                       if (givesBack_) queue_->enqueueBuffer(buffer);
                     },
                     0x800, queue_));
    ASSERT_EQ(0, queue_->setTappedProcess(1));
    for (int i = 0; i < buffers; ++i) {
      QueueBuffer* buffer = nullptr;
      ASSERT_EQ(0, queue_->allocateBuffer(frames * 2, buffer));
      ASSERT_EQ(0, queue_->enqueueBuffer(buffer));
    }
  }
  size_t framesTaken() const {
    size_t frames = 0;
    for (const HandOver& taken : taken_) frames += taken.frames;
    return frames;
  }

  kit::FakePacedClock clock_;
  std::chrono::nanoseconds latency_{0};
  std::vector<uint64_t> awaited_;
  PacedTapService taps_{[this](pid_t, const PCMFormat&) { return open(); }, clock_};
  PacedDeviceCapture devices_{{[] { return true; }, [this](const PCMFormat&) { return open(); }}, clock_};
  std::vector<HandOver> taken_;  // the queue's thread writes while the test moves the clock
  bool givesBack_ = true;
  std::unique_ptr<AppAudioTapQueue> queue_;  // last: its end stops the callbacks
};

TEST_F(PacedSoundTest, HandsOverEarlyOnlyWhileMostBuffersAreBack) {
  makeQueue(8, 4096);
  givesBack_ = false;
  ASSERT_EQ(0, queue_->start());
  clock_.advance(kTick, 60);
  ASSERT_EQ(taken_.size(), 8u);
  double next = 0;
  for (size_t i = 0; i < taken_.size(); ++i) {
    EXPECT_EQ(taken_[i].frames, i < 3 ? 3 * kFramesOfTick : 4096u) << "8, 7 and 6 stood in the queue";
    EXPECT_EQ(taken_[i].sampleTime, next);
    next += static_cast<double>(taken_[i].frames);
  }
}

TEST_F(PacedSoundTest, DropsWhatFindsNoBufferAndKeepsTime) {
  makeQueue(1, kFramesOfTick);
  givesBack_ = false;
  ASSERT_EQ(0, queue_->start());
  const uint64_t begin = clock_.hostTime();
  clock_.advance(kTick, 5);
  ASSERT_EQ(taken_.size(), 1u);
  ASSERT_EQ(0, queue_->enqueueBuffer(taken_[0].buffer));
  EXPECT_NE(0, queue_->enqueueBuffer(taken_[0].buffer)) << "twice";
  clock_.advance(kTick, 2);
  ASSERT_EQ(taken_.size(), 2u);
  EXPECT_EQ(taken_[0].hostTime, begin);
  EXPECT_EQ(taken_[1].hostTime, begin + 50'000'000);
  EXPECT_EQ(taken_[1].sampleTime, 5 * kFramesOfTick);
}

TEST_F(PacedSoundTest, AStopDoesNotSitOutTheLatencyAndHandsOverTheRest) {
  latency_ = 120ms;
  makeQueue(10, 20'000);
  ASSERT_EQ(0, queue_->start());
  const uint64_t begin = clock_.hostTime();
  clock_.advance(kTick, 12);
  EXPECT_TRUE(taken_.empty());
  clock_.advance(kTick, 3);
  EXPECT_EQ(framesTaken(), 3 * kFramesOfTick);
  clock_.pass(5ms);
  ASSERT_EQ(0, queue_->stop());
  EXPECT_EQ(framesTaken(), kRate * 155 / 1000);
  EXPECT_EQ(awaited_, std::vector<uint64_t>{begin + 155'000'000});
  ASSERT_EQ(0, queue_->start());
  clock_.settle();
  ASSERT_EQ(0, queue_->dispose()) << "wants no rest";
  EXPECT_EQ(awaited_.size(), 1u);
}

TEST_F(PacedSoundTest, MakesUpForAHoldUpOfASecondAndForNoLongerOne) {
  makeQueue(10, 20'000);
  ASSERT_EQ(0, queue_->start());
  clock_.advance(900ms);
  clock_.advance(5s);
  ASSERT_EQ(0, queue_->stop());
  EXPECT_EQ(framesTaken(), 100 * kFramesOfTick) << "the last 100 ms of the second one";
  EXPECT_EQ(taken_.back().sampleTime + static_cast<double>(taken_.back().frames), 590 * kFramesOfTick);
}

TEST_F(PacedSoundTest, RefusesWhatItCannotDo) {
  std::unique_ptr<AppAudioTapQueue> queue;
  const auto ignore = [](QueueBuffer*, const AudioTimeStamp&, uint32_t) {};
  auto format = PCMFormat{}.description();
  format.sampleRate = 96000;
  EXPECT_NE(0, taps_.createInputQueue(format, ignore, 0, queue));
  format = PCMFormat{}.description();
  format.formatFlags |= kAudioFormatFlagIsFloat;
  EXPECT_NE(0, taps_.createInputQueue(format, ignore, 0, queue));
  EXPECT_FALSE(queue);
  format = PCMFormat{48000, 2, false}.description();
  ASSERT_EQ(0, taps_.createInputQueue(format, ignore, 0, queue));
  AudioStreamDescription described;
  EXPECT_EQ(0, queue->streamDescription(described));
  EXPECT_EQ(described, format);
  EXPECT_NE(0, queue->start()) << "no process";
  EXPECT_NE(0, queue->setTappedProcess(0));
  QueueBuffer* buffer = nullptr;
  EXPECT_NE(0, queue->allocateBuffer(0, buffer));
  QueueBuffer foreign;
  EXPECT_NE(0, queue->enqueueBuffer(&foreign));
  EXPECT_NE(0, queue->freeBuffer(&foreign));
}

TEST_F(PacedSoundTest, TheMicrophoneSendsWholeSamplesAndTheRestAtAStop) {
  kit::TestMicrophone microphone(devices_);
  microphone.session->startRunning();
  clock_.advance(kTick, 10);
  microphone.stop();
  EXPECT_EQ(microphone.sound.parts(), 5u) << "of 1024 frames each, but for the last";
  const auto samples = microphone.sound.from(0);
  ASSERT_EQ(samples.size(), 10 * kFramesOfTick);
  for (size_t i = 0; i < samples.size(); ++i) ASSERT_EQ(samples[i], static_cast<int16_t>(i));
  EXPECT_TRUE(microphone.sound.isContinuous());
}

TEST_F(PacedSoundTest, InterruptionsReachTheObserver) {
  std::vector<uint32_t> seen;
  devices_.audioSession().setInterruptionObserver([&](uint32_t type) { seen.push_back(type); });
  devices_.postInterruption(AudioSessionInterruption::Began);
  devices_.postInterruption(AudioSessionInterruption::Ended);
  EXPECT_EQ(seen, (std::vector<uint32_t>{1, 0}));
}

}  // namespace
}  // namespace qv::platform
