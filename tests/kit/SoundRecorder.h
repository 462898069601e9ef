#pragma once

#include <condition_variable>
#include <functional>
#include <mutex>
#include <span>
#include <vector>

#include "platform/AppAudioTap.h"
#include "platform/DeviceCapture.h"

namespace qv::kit {

inline constexpr size_t kSoundRate = 44100;

/// The amplitude of one frequency in samples at kSoundRate.
double amplitudeOf(double frequency, std::span<const int16_t> samples);

/// Captured mono sound, in order, that a test waits for.
///
/// Threading: thread-safe.
class SoundRecorder {
 public:
  void add(uint64_t hostTime, const uint8_t* bigEndian, size_t frames);
  /// Waits until a tone of `frequency` makes up a block of 100 ms that was captured from now on.
  bool waitForTone(double frequency);
  /// Waits for `frames` more and returns them.
  std::vector<int16_t> next(size_t frames);
  /// The host time of the first sample of more than a tenth of the players' amplitude; 0 without.
  uint64_t firstSound();
  /// The host times at which what was captured so far begins and ends; 0 before.
  uint64_t begin();
  uint64_t end();
  /// The samples from a host time on, or all where it began later.
  std::vector<int16_t> from(uint64_t hostTime);
  [[nodiscard]] bool isContinuous();
  /// How many times something came.
  size_t parts();
  bool waitForParts(size_t count);

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  std::vector<int16_t> samples_;
  std::vector<std::pair<size_t, uint64_t>> starts_;  // index and host time of each part
};

/// A tap with buffers, that records and gives them back. Not running at first.
///
/// Threading: one thread; `onBuffer` is called on the tap's.
class TestTap {
 public:
  TestTap(platform::AppAudioTapService& service, pid_t process);
  platform::AppAudioTapQueue& queue() { return *queue_; }

  std::function<void()> onBuffer;  ///< set while it is stopped
  SoundRecorder sound;

 private:
  std::unique_ptr<platform::AppAudioTapQueue> queue_;  // last: its end stops the callbacks
};

/// A capture session with the microphone, that records. Not running at first.
///
/// Threading: one thread; `onSample` is called on `queue`.
class TestMicrophone final : platform::CaptureOutputDelegate {
 public:
  explicit TestMicrophone(platform::DeviceCaptureService& service);
  ~TestMicrophone() override;
  /// Returns when what was captured is recorded.
  void stop();

  std::function<void()> onSample;  ///< set while it is stopped
  SoundRecorder sound;
  platform::SerialQueue queue{"microphone"};
  const std::shared_ptr<platform::DeviceCaptureSession> session;
  const std::shared_ptr<platform::CaptureDeviceInput> input;
  const std::shared_ptr<platform::AudioDataOutput> output;

 private:
  void captureOutputDidOutputSampleBuffer(const platform::CaptureOutput& from,
                                          const platform::SampleBufferRef& sample) override;
};

}  // namespace qv::kit
