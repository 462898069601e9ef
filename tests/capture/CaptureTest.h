#pragma once

#include <memory>
#include <vector>

#include "capture/QVCaptureManager.h"
#include "tests/fakes/FakeDevice.h"

namespace qv {

inline constexpr int64_t kSecond = 1'000'000'000;

/// One recording's leases, what they brought, and the devices below them.
struct Recording {
  std::vector<platform::SampleBufferRef> appAudio, microphone;
  int tapStarts = 0, microphoneStarts = 0;
  std::shared_ptr<fakes::FakeAppAudioTap::State> tap;
  std::shared_ptr<fakes::FakeDeviceCapture::Session> session;
  std::shared_ptr<fakes::FakeDeviceCapture::Output> output;
  std::unique_ptr<AppAudioLease> appAudioLease;
  std::unique_ptr<MicrophoneLease> microphoneLease;
};

class CaptureTest : public testing::Test {
 protected:
  void startTap(Recording& recording, int32_t process = 42) {
    recording.appAudioLease = manager_.leaseAppAudio([&](const auto& sample) { recording.appAudio.push_back(sample); });
    recording.appAudioLease->startAppAudioCaptureForProcessID(process, [&] { ++recording.tapStarts; });
    device_.run();
    recording.tap = device_.tap.tap;
  }
  void startMicrophone(Recording& recording) {
    recording.microphoneLease = manager_.startMicrophoneCaptureWithOutput(
        [&](const auto& sample) { recording.microphone.push_back(sample); }, [&] { ++recording.microphoneStarts; });
    device_.run();
    recording.session = device_.deviceCapture.session;
    recording.output = device_.deviceCapture.output;
  }
  void start(Recording& recording) {
    startTap(recording);
    startMicrophone(recording);
    recording.appAudioLease->setCaptureStartTime(platform::MediaTime::make(1, 1));
  }
  /// As a recording does it: the sources stop at the same time.
  static void end(Recording& recording) {
    recording.appAudioLease->beginStoppingAppAudioCapture();
    recording.microphoneLease.reset();
    recording.appAudioLease.reset();
  }
  void play(Recording& recording, uint32_t frames, int64_t hostTime) {
    ASSERT_TRUE(fakes::FakeAppAudioTap::fill(*recording.tap, frames, hostTime));
    device_.run();
  }
  void queueSpeech(Recording& recording, int64_t nanoseconds, int64_t frames) {
    auto sample = platform::SampleBuffer::makeAudio(
        std::make_shared<platform::DataBlock>(std::vector<uint8_t>(static_cast<size_t>(frames) * 2, 1)),
        manager_.createAudioFormatDescription(), frames,
        platform::MediaTime::make(nanoseconds, platform::kHostTimescale));
    recording.output->queue->async(
        [output = recording.output, sample] { output->delegate->captureOutputDidOutputSampleBuffer(*output, sample); });
  }
  void speak(Recording& recording, int64_t nanoseconds, int64_t frames) {
    queueSpeech(recording, nanoseconds, frames);
    device_.run();
  }

  fakes::FakeDevice device_;
  QVCaptureManager manager_{device_.platform};
  Recording a_, b_;
};

}  // namespace qv
