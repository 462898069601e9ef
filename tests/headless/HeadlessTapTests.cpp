#include <gtest/gtest.h>

#include <condition_variable>
#include <cstring>
#include <mutex>
#include <thread>

#include "platform/headless/HeadlessPlatform.h"
#include "platform/headless/TestSignal.h"
#include "platform/threads/Clock.h"

namespace qv::platform {
namespace {

constexpr PCMFormat kFormat{};

int16_t bigEndianSample(const uint8_t* bytes) { return static_cast<int16_t>(bytes[0] << 8 | bytes[1]); }

/// A tap queue with buffers, and what it handed over.
class HeadlessTapTest : public testing::Test {
 protected:
  struct HandOver {
    uint64_t hostTime;
    double sampleTime;
    std::vector<uint8_t> bytes;
  };

  void makeQueue(const PCMFormat& format = kFormat) {
    ASSERT_EQ(0, platform_.appAudioTap().createInputQueue(
                     format.description(),
                     [this](QueueBuffer* buffer, const AudioTimeStamp& start, uint32_t packets) {
                       take(buffer, start, packets);
                     },
                     0x800, queue_));
    ASSERT_EQ(0, queue_->setTappedProcess(1));
  }
  void addBuffers(int count, uint32_t byteSize) {
    for (int i = 0; i < count; ++i) {
      QueueBuffer* buffer = nullptr;
      ASSERT_EQ(0, queue_->allocateBuffer(byteSize, buffer));
      ASSERT_EQ(0, queue_->enqueueBuffer(buffer));
    }
  }
  void take(QueueBuffer* buffer, const AudioTimeStamp& start, uint32_t packets) {
    EXPECT_EQ(packets * kFormat.bytesPerFrame(), buffer->byteSize);
    std::unique_lock lock(mutex_);
    taken_.push_back({start.hostTime, start.sampleTime, {buffer->data, buffer->data + buffer->byteSize}});
    lock.unlock();
    if (onBuffer) onBuffer();
    if (handsBack) {
      EXPECT_EQ(0, queue_->enqueueBuffer(buffer));
    }
    changed_.notify_all();
  }
  std::vector<HandOver> waitForBuffers(size_t count) {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [&] { return taken_.size() >= count; });
    return taken_;
  }
  size_t count() {
    std::lock_guard lock(mutex_);
    return taken_.size();
  }

  HeadlessPlatform platform_{{}};
  std::mutex mutex_;
  std::condition_variable changed_;
  std::vector<HandOver> taken_;
  std::atomic<bool> handsBack = true;
  std::function<void()> onBuffer;
  std::unique_ptr<AppAudioTapQueue> queue_;  // last: its end stops the callbacks
};

TEST_F(HeadlessTapTest, BeepsWithTheSecondOnTheHostClock) {
  makeQueue();
  addBuffers(10, 57344);
  const auto begin = static_cast<uint64_t>(systemClock().hostTime().value);
  ASSERT_EQ(0, queue_->start());
  const auto buffers = waitForBuffers(50);
  ASSERT_EQ(0, queue_->stop());
  EXPECT_GE(buffers[0].hostTime, begin);
  double next = 0;
  size_t loud = 0;
  for (const auto& buffer : buffers) {
    EXPECT_EQ(buffer.sampleTime, next) << "no gap while buffers come back";
    const size_t frames = buffer.bytes.size() / 2;
    next += static_cast<double>(frames);
    EXPECT_NEAR(static_cast<double>(buffer.hostTime - buffers[0].hostTime), buffer.sampleTime / 44100 * 1e9, 2);
    for (size_t i = 0; i < frames; ++i) {
      const uint64_t time = buffer.hostTime + i * 1'000'000'000 / 44100;
      const int16_t sample = bigEndianSample(buffer.bytes.data() + 2 * i);
      ASSERT_NEAR(sample, testsignal::beepSample(time, 1000), 1) << "a time rounded twice is a nanosecond off";
      loud += std::abs(sample) > 8000;
    }
  }
  EXPECT_GT(loud, 1000u);
}

TEST_F(HeadlessTapTest, HandsOverEarlyOnlyWhileMostBuffersAreBack) {
  makeQueue();
  addBuffers(8, 4096 * 2);
  handsBack = false;
  ASSERT_EQ(0, queue_->start());
  const auto buffers = waitForBuffers(8);
  for (size_t i = 0; i < 8; ++i) {
    const size_t frames = buffers[i].bytes.size() / 2;
    if (i < 3) {  // 8, 7 and 6 stand in the queue
      EXPECT_GE(frames, 1024u);
      EXPECT_LT(frames, 1024u + 441u);
    } else {
      EXPECT_EQ(frames, 4096u);
    }
    if (i > 0) {
      EXPECT_EQ(buffers[i].sampleTime,
                buffers[i - 1].sampleTime + static_cast<double>(buffers[i - 1].bytes.size() / 2));
    }
  }
}

TEST_F(HeadlessTapTest, DropsWhatFindsNoBufferAndKeepsTime) {
  makeQueue();
  QueueBuffer* buffer = nullptr;
  ASSERT_EQ(0, queue_->allocateBuffer(882, buffer));  // 10 ms
  ASSERT_EQ(0, queue_->enqueueBuffer(buffer));
  EXPECT_NE(0, queue_->enqueueBuffer(buffer)) << "twice";
  handsBack = false;
  ASSERT_EQ(0, queue_->start());
  waitForBuffers(1);
  const MediaTime returned = systemClock().hostTime();
  ASSERT_EQ(0, queue_->enqueueBuffer(buffer));
  const auto buffers = waitForBuffers(2);
  // What was due before the buffer came back is gone; up to one tick may have been due still.
  EXPECT_GE(buffers[1].hostTime + 10'000'000, static_cast<uint64_t>(returned.value));
  EXPECT_NEAR(static_cast<double>(buffers[1].hostTime - buffers[0].hostTime),
              (buffers[1].sampleTime - buffers[0].sampleTime) / 44100 * 1e9, 2);
}

TEST_F(HeadlessTapTest, AStopHandsOverAllUpToTheCall) {
  makeQueue();
  addBuffers(10, 57344);
  ASSERT_EQ(0, queue_->start());
  waitForBuffers(1);
  const auto before = systemClock().hostTime().value;
  ASSERT_EQ(0, queue_->stop());
  const auto after = systemClock().hostTime().value;
  const auto& last = taken_.back();
  const auto end =
      static_cast<int64_t>(last.hostTime) + static_cast<int64_t>(last.bytes.size() / 2) * 1'000'000'000 / 44100;
  EXPECT_GE(end, before - 50'000) << "but for a frame";
  EXPECT_LE(end, after);
}

TEST_F(HeadlessTapTest, ReportsRunningOnceForEachChange) {
  makeQueue();
  addBuffers(10, 57344);
  std::atomic<int> changes = 0;
  std::atomic<bool> sameThread = true;
  const auto self = std::this_thread::get_id();
  queue_->addIsRunningListener([&] {
    ++changes;
    if (std::this_thread::get_id() == self) sameThread = false;
  });
  ASSERT_EQ(0, queue_->start());
  waitForBuffers(1);
  EXPECT_EQ(changes, 1);
  ASSERT_EQ(0, queue_->stop());
  EXPECT_EQ(changes, 2);
  EXPECT_TRUE(sameThread) << "on the queue's own thread";
  ASSERT_EQ(0, queue_->start());
  waitForBuffers(count() + 1);
  EXPECT_EQ(changes, 3);
  ASSERT_EQ(0, queue_->removeIsRunningListener());
  ASSERT_EQ(0, queue_->dispose());
  EXPECT_EQ(changes, 3);
  EXPECT_NE(0, queue_->start());
}

TEST_F(HeadlessTapTest, StopWaitsForACallbackOrComesFromOne) {
  makeQueue();
  addBuffers(10, 57344);
  std::atomic<bool> inside = false;
  onBuffer = [&] {
    inside = true;
    for (int i = 0; i < 1000; ++i) std::this_thread::yield();
    inside = false;
  };
  for (int round = 0; round < 5; ++round) {
    ASSERT_EQ(0, queue_->start());
    waitForBuffers(count() + 1);
    ASSERT_EQ(0, queue_->stop());
    ASSERT_FALSE(inside);
  }
  onBuffer = [&] { EXPECT_EQ(0, queue_->stop()); };
  const size_t before = count();
  ASSERT_EQ(0, queue_->start());
  waitForBuffers(before + 1);
  ASSERT_EQ(0, queue_->dispose());
  EXPECT_EQ(count(), before + 1) << "none came after the stop";
}

TEST_F(HeadlessTapTest, RefusesWhatItCannotDo) {
  std::unique_ptr<AppAudioTapQueue> queue;
  auto& service = platform_.appAudioTap();
  const auto ignore = [](QueueBuffer*, const AudioTimeStamp&, uint32_t) {};
  auto format = kFormat.description();
  format.sampleRate = 96000;
  EXPECT_NE(0, service.createInputQueue(format, ignore, 0, queue));
  format = kFormat.description();
  format.formatFlags |= kAudioFormatFlagIsFloat;
  EXPECT_NE(0, service.createInputQueue(format, ignore, 0, queue));
  EXPECT_FALSE(queue);
  format = PCMFormat{48000, 2, false}.description();
  ASSERT_EQ(0, service.createInputQueue(format, ignore, 0, queue));
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

}  // namespace
}  // namespace qv::platform
