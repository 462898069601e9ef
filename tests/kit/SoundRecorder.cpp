#include "tests/kit/SoundRecorder.h"

#include <cmath>
#include <cstdlib>
#include <numbers>

#include "platform/sound/PCMSource.h"
#include "tests/kit/Events.h"

namespace qv::kit {

using namespace platform;

double amplitudeOf(double frequency, std::span<const int16_t> samples) {
  const double coefficient = 2 * std::cos(2 * std::numbers::pi * frequency / kSoundRate);
  double s1 = 0, s2 = 0;
  for (const int16_t sample : samples) {
    const double s0 = sample + coefficient * s1 - s2;
    s2 = s1;
    s1 = s0;
  }
  return 2 * std::sqrt(s1 * s1 + s2 * s2 - coefficient * s1 * s2) / static_cast<double>(samples.size());
}

void SoundRecorder::add(uint64_t hostTime, const uint8_t* bigEndian, size_t frames) {
  std::lock_guard lock(mutex_);
  starts_.emplace_back(samples_.size(), hostTime);
  for (size_t i = 0; i < frames; ++i) {
    samples_.push_back(static_cast<int16_t>(bigEndian[2 * i] << 8 | bigEndian[2 * i + 1]));
  }
  changed_.notify_all();
}

bool SoundRecorder::waitForTone(double frequency) {
  std::unique_lock lock(mutex_);
  size_t begin = samples_.size();
  return changed_.wait_for(lock, kNever, [&] {
    for (; begin + kSoundRate / 10 <= samples_.size(); begin += kSoundRate / 10) {
      if (amplitudeOf(frequency, {samples_.data() + begin, kSoundRate / 10}) > 7000) return true;
    }
    return false;
  });
}

std::vector<int16_t> SoundRecorder::next(size_t frames) {
  std::unique_lock lock(mutex_);
  const size_t begin = samples_.size();
  if (!changed_.wait_for(lock, kNever, [&] { return samples_.size() >= begin + frames; })) return {};
  return {samples_.begin() + static_cast<ptrdiff_t>(begin), samples_.begin() + static_cast<ptrdiff_t>(begin + frames)};
}

uint64_t SoundRecorder::firstSound() {
  std::lock_guard lock(mutex_);
  for (size_t part = 0; part < starts_.size(); ++part) {
    const size_t end = part + 1 < starts_.size() ? starts_[part + 1].first : samples_.size();
    for (size_t i = starts_[part].first; i < end; ++i) {
      if (std::abs(samples_[i]) > 800)
        return starts_[part].second + (i - starts_[part].first) * 1'000'000'000 / kSoundRate;
    }
  }
  return 0;
}

uint64_t SoundRecorder::begin() {
  std::lock_guard lock(mutex_);
  return starts_.empty() ? 0 : starts_.front().second;
}

size_t SoundRecorder::parts() {
  std::lock_guard lock(mutex_);
  return starts_.size();
}

bool SoundRecorder::waitForParts(size_t count) {
  std::unique_lock lock(mutex_);
  return changed_.wait_for(lock, kNever, [&] { return starts_.size() >= count; });
}

uint64_t SoundRecorder::end() {
  std::lock_guard lock(mutex_);
  if (starts_.empty()) return 0;
  const auto& [index, hostTime] = starts_.back();
  return hostTime + (samples_.size() - index) * 1'000'000'000 / kSoundRate;
}

std::vector<int16_t> SoundRecorder::from(uint64_t hostTime) {
  const uint64_t last = end();
  std::lock_guard lock(mutex_);
  const size_t wanted = hostTime < last ? (last - hostTime) * kSoundRate / 1'000'000'000 : 0;
  return {samples_.end() - static_cast<ptrdiff_t>(std::min(wanted, samples_.size())), samples_.end()};
}

bool SoundRecorder::isContinuous() {
  std::lock_guard lock(mutex_);
  for (const auto& [index, hostTime] : starts_) {
    const double expected = static_cast<double>(index) / kSoundRate * 1e9;
    if (std::abs(static_cast<double>(hostTime - starts_[0].second) - expected) > 2) return false;
  }
  return true;
}

TestTap::TestTap(AppAudioTapService& service, pid_t process) {
  const auto callback = [this](QueueBuffer* buffer, const AudioTimeStamp& start, uint32_t packets) {
    sound.add(start.hostTime, buffer->data, packets);
    if (onBuffer) onBuffer();
    EXPECT_EQ(0, queue_->enqueueBuffer(buffer));
  };
  EXPECT_EQ(0, service.createInputQueue(PCMFormat{}.description(), callback, 0x800, queue_));
  EXPECT_EQ(0, queue_->setTappedProcess(process));
  for (int i = 0; i < 10; ++i) {
    QueueBuffer* buffer = nullptr;
    EXPECT_EQ(0, queue_->allocateBuffer(57344, buffer));
    EXPECT_EQ(0, queue_->enqueueBuffer(buffer));
  }
}

TestMicrophone::TestMicrophone(DeviceCaptureService& service)
    : session(service.createSession()),
      input(service.createDefaultAudioInput()),
      output(service.createAudioDataOutput()) {
  output->setSampleDelegate(this, &queue);
  if (session->canAddInput(input)) session->addInput(input);
  session->addOutput(output);
}

TestMicrophone::~TestMicrophone() { session->removeOutput(output); }

void TestMicrophone::stop() {
  session->stopRunning();
  queue.sync([] {});
}

void TestMicrophone::captureOutputDidOutputSampleBuffer(const CaptureOutput& from, const SampleBufferRef& sample) {
  EXPECT_EQ(&from, output.get());
  EXPECT_TRUE(queue.isOnQueue());
  sound.add(static_cast<uint64_t>(sample->presentationTime().value), sample->data()->bytes().data(),
            static_cast<size_t>(sample->numSamples()));
  if (onSample) onSample();
}

}  // namespace qv::kit
